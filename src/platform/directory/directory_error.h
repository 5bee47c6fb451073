// The one mapper from LDAP result codes to kolt errors.
#ifndef KOLT_PLATFORM_DIRECTORY_DIRECTORY_ERROR_H
#define KOLT_PLATFORM_DIRECTORY_DIRECTORY_ERROR_H

#include <string_view>

#include "kolt/error.h"

namespace kolt {

// An error of kDirectoryErrorDomain: code = the LDAP result code (negative
// for libldap's client codes), description = libldap's text for the code,
// followed by ": " and `diagnostic` when there is one (the server's
// diagnostic message or our own detail). Never pass a password here.
Error directoryError(int resultCode, std::string_view diagnostic = {});

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_DIRECTORY_ERROR_H
