// Opening LDAP directory nodes ("/LDAPv3/<url or host>") for the PosixEnv.
// The mapping of records to entries is in docs/directory.md.
#ifndef KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H
#define KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H

#include <memory>
#include <string>

#include "kolt/directory.h"
#include "kolt/env.h"

namespace kolt {

// A node over LDAP (libldap). Opening only checks the name (-9 when it is
// no node name); the first operation connects. ldapi socket paths and kolt's
// trust store are mapped below `env`'s root; `env` must outlive the node.
std::unique_ptr<DirectoryNode> openLdapNode(Env& env, const std::string& nodeName,
                                            ErrorSlot* error);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H
