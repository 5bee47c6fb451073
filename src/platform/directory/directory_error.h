// The one mapper from LDAP result codes to kolt errors.
#ifndef KOLT_PLATFORM_DIRECTORY_DIRECTORY_ERROR_H
#define KOLT_PLATFORM_DIRECTORY_DIRECTORY_ERROR_H

#include <optional>
#include <string_view>

#include "kolt/error.h"

namespace kolt {

// An error of kDirectoryErrorDomain: code = the LDAP result code (negative
// for libldap's client codes), description = libldap's text for the code,
// followed by ": " and `diagnostic` when there is one (the server's
// diagnostic message or our own detail). Never pass a password here.
Error directoryError(int resultCode, std::string_view diagnostic = {});

// Stores `e` in the slot (when given) and returns the failed result of an
// operation that answers nothing / false.
inline std::nullopt_t failWithNothing(ErrorSlot* slot, Error e) {
  setError(slot, std::move(e));
  return std::nullopt;
}
inline bool failWithFalse(ErrorSlot* slot, Error e) {
  setError(slot, std::move(e));
  return false;
}

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_DIRECTORY_ERROR_H
