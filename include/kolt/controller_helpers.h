/* Controller and address helpers: small operations over the local document
 * and the Vorn configuration that the build, the change check and the
 * lifecycle operations share, and the step that makes this machine trust its
 * controllers' certificates.
 *
 * The C part of this header is valid C99. */
#ifndef KOLT_CONTROLLER_HELPERS_H
#define KOLT_CONTROLLER_HELPERS_H

#include <stdint.h>

#include "kolt/export.h"

KOLT_C_BEGIN

/* Looks up the controller at `numericAddress` (NUL-terminated text of an IP
 * address; an IPv4-mapped IPv6 address "::ffff:a.b.c.d" is looked up as
 * a.b.c.d) in the "controllerIPMap" of the local document, read afresh.
 *
 * When found, copies the host name into `hostNameBuffer` with strlcpy
 * semantics: at most `hostNameSize` - 1 bytes, always NUL-terminated when
 * `hostNameSize` is not 0. When not found the buffer is left as it was.
 *
 * Returns 0 with errno 0 when the local document could be read (found or not);
 * 1 with errno ENOENT (2) when it could not; 1 with errno EINVAL (22) when
 * `numericAddress` is NULL, or `hostNameBuffer` is NULL with a non-zero size.
 * Logs "vorn_controller_from_ip: got numeric %s and config %@" with the
 * document, its shared secret hidden. */
KOLT_EXPORT int vorn_controller_from_ip(const char* numericAddress, char* hostNameBuffer,
                                        uint32_t hostNameSize);

KOLT_C_END

#ifdef __cplusplus

#include <optional>
#include <string>

#include "kolt/plist.h"

namespace kolt {

// Indexes the controllers by address: for every (host UUID, controller entry)
// of `controllers` (the "controllers" dictionary of globals), result[entry's
// "IPAddress"] = host UUID. Later entries (key order) win on a shared address.
// Entries without a string "IPAddress" are passed over. A non-dictionary
// argument gives an empty dictionary.
KOLT_EXPORT Dictionary calculateMachineIPMap(const Value& controllers);

// Turns the member list of older releases into controller entries. For each
// computer dictionary of `computers` (an array, or a dictionary's values) in
// order, unless its "uuid" is in `aliasControllers`: every one of its
// "ipAddresses" that `nameServerAddresses` holds (exact string equality) sets
// result[uuid] = {"IPAddress": address, "hostName": "legacyHostName"}; a later
// match replaces an earlier one. Computers without a string "uuid" or
// "legacyHostName" give no entry (a controller entry always has both).
KOLT_EXPORT Dictionary migrateComputersToControllers(const Value& computers,
                                                     const Array& nameServerAddresses,
                                                     const Array* aliasControllers);

// The volumes this machine hosts: the first whitespace-separated field of
// each line of "/Library/Preferences/Vorn/fsmlist", in file order, duplicates
// kept; lines that are empty or begin with white space add nothing. An
// unreadable file (or one that is not UTF-8) gives an empty array.
KOLT_EXPORT Array getHostedVolumeList();

// configuration["globals"]["revision"], or nothing when that is not a string.
KOLT_EXPORT std::optional<std::string> buildRevisionStringFromConfig(const Value& configuration);

// This machine's host name. Never fails: when the system cannot tell, the
// answer is "localhost".
KOLT_EXPORT std::string getLegacyHostname();

// A copy of a local document or a Vorn configuration in which a top-level
// "sharedSecret" and globals' "sharedSecret" read "********". The argument is
// not changed. Pass every document through it before it is logged.
KOLT_EXPORT Value redactVornSecrets(const Value& document);

// Makes this machine trust the certificate-authority certificates of the
// directory server that `url` names (an "ldap..." URL, whose third
// "/"-separated piece is the host, or a bare host[:port]). Opens the node
// "/LDAPv3/ldap://<host>" through the current Env and makes the custom call
// kCustomCallClientAddCACerts on it, which stores the server's CA
// certificates in the library's trust directory; when that fails for an
// "ldaps://" URL, asks "/LDAPv3/ldaps://<host>" the same. Then asks the service
// registry to send SIGTERM to "com.orvat.opendirectoryd" and waits 3 seconds
// (on the Env's clock) when that worked. Failures appear only as log lines
// ("ClientAddCACerts returned %@", "Unable to kill opendirectoryd. If Vorn
// profile load fails, try again"). An "ldap" URL with fewer than three pieces
// returns at once, without logging.
KOLT_EXPORT void loadControllerCerts(const std::string& url);

}  // namespace kolt

#endif /* __cplusplus */

#endif /* KOLT_CONTROLLER_HELPERS_H */
