// Opening LDAP directory nodes ("/LDAPv3/<url or host>") for the PosixEnv.
// The mapping of records to entries is in docs/directory.md.
#ifndef KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H
#define KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H

#include <memory>
#include <string>

#include "kolt/directory.h"
#include "kolt/env.h"

namespace kolt {

// A node over LDAP (libldap). Opening connects to the server and reads its
// root DSE for the search base, unless `env`'s search-base cache knows the
// server (on ldapi it also binds as the local superuser); the connection is
// kept for the node's operations. A cached base that an operation finds
// wrong is read anew once (docs/directory.md). Fails with -9 when the name is no node
// name (or its ldapi socket path is too long), with the client's code when
// the server cannot be reached (-1 "Can't contact LDAP server") or fails
// the TLS handshake. An ldaps:// server whose certificate is not trusted yet
// opens (so that the custom call can trust it) but fails every other
// operation with the TLS error until it is trusted. ldapi socket paths and
// kolt's trust store are mapped below `env`'s root; `env` must outlive the
// node.
std::unique_ptr<DirectoryNode> openLdapNode(Env& env, const std::string& nodeName,
                                            ErrorSlot* error);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H
