// Opening LDAP directory nodes ("/LDAPv3/<url or host>") for the PosixEnv.
#ifndef KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H
#define KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H

#include <memory>
#include <string>

#include "kolt/directory.h"
#include "kolt/env.h"

namespace kolt {

// Opens the node named `nodeName` over LDAP. ldapi socket paths are mapped
// below `env`'s root. Null with `error` (directory domain) on failure.
std::unique_ptr<DirectoryNode> openLdapNode(Env& env, const std::string& nodeName,
                                            ErrorSlot* error);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_LDAP_DIRECTORY_H
