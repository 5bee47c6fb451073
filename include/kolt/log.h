/* Logging: the diagnostic log and the error line of log_message.
 *
 * Every line goes through one process-wide sink. By default the sink is the
 * system log (syslog); an embedding program may install its own handler to
 * route the lines, and tests capture them the same way.
 *
 * The C part of this header is valid C99. */
#ifndef KOLT_LOG_H
#define KOLT_LOG_H

#include "kolt/export.h"

KOLT_C_BEGIN

/* Receives one finished log line (no trailing line feed) and its syslog
 * priority (facility | level). Called on the logging thread; must not call
 * back into kolt's logging. */
typedef void (*kolt_log_handler)(int priority, const char* line, void* context);

/* Installs `handler` as the process-wide log sink; NULL restores syslog.
 * Thread-safe. */
KOLT_EXPORT void kolt_set_log_handler(kolt_log_handler handler, void* context);

/* Writes "vornd: [<pid>] ERROR: <message>" to the log sink at priority 13
 * (user, notice) and then to standard error followed by one line feed.
 * Returns the result of writing that line feed (the character, or EOF). */
KOLT_EXPORT int log_message(int pid, const char* message);

KOLT_C_END

#ifdef __cplusplus

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>

#include "kolt/error.h"
#include "kolt/plist.h"

namespace kolt {

// The syslog priority of diagnostic lines (user facility, notice level).
inline constexpr int kDiagnosticPriority = 13;

// One argument of a printf-style format with "%@". "%@" prints a value's
// description (a string as itself), an error's printed form, or "(null)" for
// an absent value; the printf conversions (%d, %s, %u, %x, ...) take numbers
// and C strings.
class KOLT_EXPORT FormatArg {
 public:
  FormatArg(const Value& v) : kind_(Kind::kValue), value_(&v) {}
  FormatArg(const Value* v) : kind_(Kind::kValue), value_(v) {}
  FormatArg(const std::optional<Value>& v) : kind_(Kind::kValue), value_(v ? &*v : nullptr) {}
  FormatArg(const Error& e) : kind_(Kind::kError), error_(&e) {}
  FormatArg(const Error* e) : kind_(Kind::kError), error_(e) {}
  FormatArg(const std::optional<Error>& e) : kind_(Kind::kError), error_(e ? &*e : nullptr) {}
  FormatArg(const std::string& s) : kind_(Kind::kText), text_(s) {}
  FormatArg(std::string_view s) : kind_(Kind::kText), text_(s) {}
  FormatArg(const char* s) : kind_(s ? Kind::kText : Kind::kNullText), text_(s ? s : "") {}
  FormatArg(int i) : kind_(Kind::kSigned), signed_(i) {}
  FormatArg(long i) : kind_(Kind::kSigned), signed_(i) {}
  FormatArg(long long i) : kind_(Kind::kSigned), signed_(i) {}
  FormatArg(unsigned i) : kind_(Kind::kUnsigned), unsigned_(i) {}
  FormatArg(unsigned long i) : kind_(Kind::kUnsigned), unsigned_(i) {}
  FormatArg(unsigned long long i) : kind_(Kind::kUnsigned), unsigned_(i) {}
  FormatArg(double d) : kind_(Kind::kReal), real_(d) {}

  // Text of this argument for "%@".
  std::string describe() const;

  enum class Kind { kValue, kError, kText, kNullText, kSigned, kUnsigned, kReal };
  Kind kind() const { return kind_; }
  std::string_view text() const { return text_; }
  std::int64_t signedValue() const { return signed_; }
  std::uint64_t unsignedValue() const { return unsigned_; }
  double realValue() const { return real_; }

 private:
  Kind kind_;
  const Value* value_ = nullptr;
  const Error* error_ = nullptr;
  std::string_view text_;
  std::int64_t signed_ = 0;
  std::uint64_t unsigned_ = 0;
  double real_ = 0;
};

// Builds the message for `format`: "%@" and the printf conversions take the
// arguments in order; "%%" is a percent sign. A missing argument prints as
// "(null)"; a conversion that does not fit its argument prints the argument
// as "%@" would.
KOLT_EXPORT std::string formatMessage(std::string_view format,
                                      std::initializer_list<FormatArg> args);

// Sends one finished line to the process-wide sink.
KOLT_EXPORT void emitLogLine(int priority, const std::string& line);

// The diagnostic log: one line built from `format` to the sink at
// kDiagnosticPriority. No prefix or level is added.
template <class... Args>
void log(std::string_view format, const Args&... args) {
  emitLogLine(kDiagnosticPriority, formatMessage(format, {FormatArg(args)...}));
}

// Builds the message and hands it to log_message with this process's id.
// Returns log_message's result. Creates no error object.
KOLT_EXPORT int NErrorMessage(const std::string& message);
template <class... Args>
int NError(std::string_view format, const Args&... args) {
  return NErrorMessage(formatMessage(format, {FormatArg(args)...}));
}

}  // namespace kolt

#endif /* __cplusplus */

#endif /* KOLT_LOG_H */
