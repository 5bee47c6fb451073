// The error object: a domain, a signed code and an optional localized
// description. Operations hand errors out through optional out-parameters of
// type std::optional<Error>* (an "error slot"), written only when given.
#ifndef KOLT_ERROR_H
#define KOLT_ERROR_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "kolt/export.h"
#include "kolt/plist.h"

namespace kolt {

// The POSIX domain. Codes are the platform's error numbers (see PosixCode),
// which differ from Linux's for some values.
inline constexpr std::string_view kPosixErrorDomain = "NSPOSIXErrorDomain";
// The library's own domain; the same text as the exported CFVornErrorDomain.
inline constexpr std::string_view kVornErrorDomain = "com.orvat.vorn.ErrorDomain";
// The directory's domain: codes are LDAP result codes, including the client
// library's negative codes (-1 "Can't contact LDAP server").
inline constexpr std::string_view kDirectoryErrorDomain = "com.orvat.kolt.DirectoryErrorDomain";

// The library's own codes in kVornErrorDomain.
enum VornErrorCode : int {
  kVornSanDeleted = 500,         // "San has been deleted"
  kVornNoConfiguration = 501,    // "No existing configuration"
  kVornSanNameMismatch = 502,    // "San name mismatch"
  kVornSanUuidMismatch = 503,    // "San UUID mismatch"
  kVornSanNameMissing = 504,     // "San name missing"
  kVornSanServerMissing = 505,   // "San server missing"
  kVornVolumeConfigUnreadable = 506,  // the parser's own text
};

// The platform's error numbers that are part of the interface.
enum PosixCode : int {
  kPosixENOENT = 2,
  kPosixEACCES = 13,
  kPosixEFAULT = 14,
  kPosixEINVAL = 22,
  kPosixENOTSUP = 45,
  kPosixEHOSTUNREACH = 65,
  kPosixEAUTH = 80,
};

class KOLT_EXPORT Error {
 public:
  Error(std::string domain, std::int64_t code, std::optional<std::string> description)
      : domain_(std::move(domain)), code_(code), description_(std::move(description)) {}

  // An error of kVornErrorDomain with the code's fixed text (500..505). For
  // 506 pass the parser's message.
  static Error vorn(int code);
  static Error vorn(int code, std::string description);
  // A POSIX-domain error with a platform error number, with or without text.
  static Error posix(int platformCode, std::optional<std::string> description = std::nullopt);
  // A POSIX-domain error from a Linux errno value, mapped to the platform's
  // number (see platformErrno).
  static Error fromErrno(int linuxErrno, std::optional<std::string> description = std::nullopt);

  const std::string& domain() const { return domain_; }
  std::int64_t code() const { return code_; }
  // The localized description, when the error carries one.
  const std::optional<std::string>& description() const { return description_; }
  // The user-information dictionary: empty, or one entry under
  // "NSLocalizedDescription".
  Dictionary userInfo() const;
  // The code as the 32-bit status that code-status operations return.
  int status() const { return static_cast<int>(code_); }

  // Printed form for "%@": Error Domain=<domain> Code=<code> "<description>".
  std::string printed() const;
  // The text a string-form entry point hands out: the description, or a
  // generic sentence naming domain and code when there is none.
  std::string textForCaller() const;

  friend bool operator==(const Error&, const Error&) = default;

 private:
  std::string domain_;
  std::int64_t code_;
  std::optional<std::string> description_;
};

using ErrorSlot = std::optional<Error>;

// Maps a Linux errno value to the platform's error number (identical for
// 1..34; mapped for the others the interface names, such as ENOTSUP).
KOLT_EXPORT int platformErrno(int linuxErrno);

// Stores `error` into `slot` when the caller gave one.
inline void setError(ErrorSlot* slot, Error error) {
  if (slot != nullptr) *slot = std::move(error);
}

}  // namespace kolt

#endif  // KOLT_ERROR_H
