/* The controller-side build: brings the SAN configuration published in the
 * directory into line with what this controller knows locally, and publishes
 * it with a fresh revision when anything changed.
 *
 * The C part of this header is valid C99. */
#ifndef KOLT_BUILD_H
#define KOLT_BUILD_H

#include "kolt/export.h"

KOLT_C_BEGIN

/* buildSanConfig with NUL-terminated UTF-8 strings (each may be NULL for
 * absent). Returns 0 or the error's code. When `message` is not NULL it
 * receives NULL on success, or on failure a copy of the error's description
 * allocated with strdup, which the caller frees with free(). */
KOLT_EXPORT int buildSanConfigC(const char* nodeName, const char* userName, const char* password,
                                char** message);

KOLT_C_END

#ifdef __cplusplus

#include <string>

#include "kolt/error.h"
#include "kolt/plist.h"

namespace kolt {

// Runs the build on this controller. `nodeName` names the directory node
// below "/LDAPv3/" (an "ldapi:" URL for the local server, or a server's name
// or URL); `userName` and `password` (null: absent) authenticate to it, except
// on an "ldapi:" node. Returns 0, or the code of the error stored in `error`:
// the errno of an unreadable config.plist ("Unable to open config.plist"),
// 22 "System is not a controller", 500 "San has been deleted", 22 "Unable to
// determine Vorn IP address", 502 "San name mismatch", 503 "San UUID
// mismatch", or the directory's error. On failure neither the record nor the
// local document is written (records created or removed on the way stay so),
// and the "uuid" file (an earlier UUID of this controller) stays for the next
// build. The record is published only when something changed; every
// successful build stores its revision as the local "sanRevision".
KOLT_EXPORT int buildSanConfig(const std::string* nodeName, const std::string* userName,
                               const std::string* password, ErrorSlot* error);

// The same call; `error` receives the very error object of buildSanConfig.
KOLT_EXPORT int buildSanConfigCF(const std::string* nodeName, const std::string* userName,
                                 const std::string* password, ErrorSlot* error);

// Removes the controller `uuid` from globals "controllers" and every
// occurrence of it from each volume entry's "controllers".
KOLT_EXPORT void deleteControllerByUUID(Value& globals, Value& volumes, const std::string& uuid);

}  // namespace kolt

#endif /* __cplusplus */

#endif /* KOLT_BUILD_H */
