#include "platform/directory/ldap_directory.h"

namespace kolt {

// The LDAP client is not built yet: every node fails to open with the
// client library's "Can't contact LDAP server" code.
std::unique_ptr<DirectoryNode> openLdapNode(Env&, const std::string& nodeName, ErrorSlot* error) {
  setError(error, Error(std::string(kDirectoryErrorDomain), -1,
                        "Can't contact LDAP server (" + nodeName + ")"));
  return nullptr;
}

}  // namespace kolt
