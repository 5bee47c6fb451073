#include "platform/directory/directory_error.h"

#include <ldap.h>

#include <string>

namespace kolt {

Error directoryError(int resultCode, std::string_view diagnostic) {
  std::string text = ldap_err2string(resultCode);
  if (!diagnostic.empty()) {
    text += ": ";
    text += diagnostic;
  }
  return Error(std::string(kDirectoryErrorDomain), resultCode, std::move(text));
}

}  // namespace kolt
