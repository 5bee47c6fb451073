// Directory node names ("/LDAPv3/" + a URL or host) and where they lead.
//
// Pure functions: nothing here touches the network, so the rules (which
// names are nodes, where an ldapi socket lives, when StartTLS is required)
// are testable without a server.
#ifndef KOLT_PLATFORM_DIRECTORY_NODE_ADDRESS_H
#define KOLT_PLATFORM_DIRECTORY_NODE_ADDRESS_H

#include <optional>
#include <string>
#include <string_view>

namespace kolt {

// The prefix of every LDAP node name.
inline constexpr std::string_view kLdapNodePrefix = "/LDAPv3/";

// The ldapi socket used when an ldapi:// URL names none (Debian's default).
inline constexpr std::string_view kDefaultLdapiSocket = "/var/run/slapd/ldapi";

// The longest ldapi socket path the kernel accepts (sun_path less its NUL).
inline constexpr std::size_t kMaxSocketPathLength = 107;

enum class LdapScheme { kLdap, kLdaps, kLdapi };

// Where a node leads.
struct NodeAddress {
  LdapScheme scheme = LdapScheme::kLdap;
  std::string host;        // ldap/ldaps: host name or address, without brackets
  int port = 0;            // ldap/ldaps: the port (389 / 636 when the name gives none)
  std::string socketPath;  // ldapi: the socket's system path (percent-decoded)
  std::string url;         // the URL as given, or "ldap://" + host[:port]
};

// Percent-encodes a socket path for an ldapi:// URL: every byte but ASCII
// letters, digits and - . _ ~ becomes "%XX".
std::string percentEncodePath(std::string_view path);

// Parses a node name. Nothing when it is not "/LDAPv3/" followed by an
// ldap://, ldaps:// or ldapi:// URL (no DN, attributes or extensions) or by
// host[:port].
std::optional<NodeAddress> parseNodeName(std::string_view nodeName);

// The URL that libldap connects to: the address's URL, except that an ldapi
// socket path is replaced by `mappedSocketPath` (percent-encoded).
std::string connectionUrl(const NodeAddress& address, const std::string& mappedSocketPath);

// True when `host` is this machine's loopback: "localhost", 127.0.0.0/8, ::1
// or an IPv4-mapped loopback address. Names are not resolved.
bool isLoopbackHost(std::string_view host);

// The transport rule for simple binds: a password never travels in clear to
// another host. An ldap:// node on a non-loopback host must upgrade with
// StartTLS before a simple bind (and refuse the bind when that fails);
// ldaps:// is encrypted, ldapi:// and loopback hosts never leave the machine.
bool startTlsRequiredBeforeBind(const NodeAddress& address);

// The server's identity as "scheme://host:port" (or "ldapi://<path>"), with
// the host in lower case: the key that fault injection and trust use.
std::string serverKey(const NodeAddress& address);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_NODE_ADDRESS_H
