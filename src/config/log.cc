// The process-wide log sink, the "%@" formatter and the error line of
// log_message.
#include "kolt/log.h"

#include <syslog.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>

#include "kolt/env.h"
#include "kolt/error.h"
#include "kolt/plist.h"

namespace kolt {
namespace {

struct Sink {
  std::mutex mutex;
  kolt_log_handler handler = nullptr;
  void* context = nullptr;
};

Sink& sink() {
  static Sink* s = new Sink();  // never destroyed: logging may run during exit
  return *s;
}

bool isFlag(char c) {
  return c == '-' || c == '+' || c == ' ' || c == '#' || c == '0';
}
bool isLengthModifier(char c) {
  return c == 'h' || c == 'l' || c == 'q' || c == 'L' || c == 'j' || c == 'z' || c == 't';
}

// Formats one printf conversion whose flags, width and precision are in
// `spec` (without length modifiers) and whose conversion is `conv`.
std::string convert(const std::string& spec, char conv, const FormatArg& arg) {
  char buf[512];
  using Kind = FormatArg::Kind;
  std::string f = "%" + spec;
  int n = -1;
  switch (conv) {
    case 'd':
    case 'i':
      if (arg.kind() == Kind::kSigned) {
        n = std::snprintf(buf, sizeof buf, (f + "lld").c_str(),
                          static_cast<long long>(arg.signedValue()));
      } else if (arg.kind() == Kind::kUnsigned) {
        n = std::snprintf(buf, sizeof buf, (f + "lld").c_str(),
                          static_cast<long long>(arg.unsignedValue()));
      }
      break;
    case 'u':
    case 'o':
    case 'x':
    case 'X':
      if (arg.kind() == Kind::kSigned || arg.kind() == Kind::kUnsigned) {
        const unsigned long long u = arg.kind() == Kind::kSigned
                                         ? static_cast<unsigned long long>(arg.signedValue())
                                         : static_cast<unsigned long long>(arg.unsignedValue());
        n = std::snprintf(buf, sizeof buf, (f + "ll" + conv).c_str(), u);
      }
      break;
    case 'c':
      if (arg.kind() == Kind::kSigned) {
        n = std::snprintf(buf, sizeof buf, (f + "c").c_str(), static_cast<int>(arg.signedValue()));
      } else if (arg.kind() == Kind::kUnsigned) {
        n = std::snprintf(buf, sizeof buf, (f + "c").c_str(),
                          static_cast<int>(arg.unsignedValue()));
      }
      break;
    case 'f':
    case 'F':
    case 'e':
    case 'E':
    case 'g':
    case 'G':
    case 'a':
    case 'A':
      if (arg.kind() == Kind::kReal) {
        n = std::snprintf(buf, sizeof buf, (f + conv).c_str(), arg.realValue());
      } else if (arg.kind() == Kind::kSigned) {
        n = std::snprintf(buf, sizeof buf, (f + conv).c_str(),
                          static_cast<double>(arg.signedValue()));
      } else if (arg.kind() == Kind::kUnsigned) {
        n = std::snprintf(buf, sizeof buf, (f + conv).c_str(),
                          static_cast<double>(arg.unsignedValue()));
      }
      break;
    case 's':
      if (arg.kind() == Kind::kText || arg.kind() == Kind::kNullText) {
        const std::string text = arg.kind() == Kind::kText ? std::string(arg.text()) : "(null)";
        if (spec.empty()) return text;
        const int len = std::snprintf(nullptr, 0, (f + "s").c_str(), text.c_str());
        if (len < 0) return text;
        std::string out(static_cast<std::size_t>(len) + 1, '\0');
        std::snprintf(out.data(), out.size(), (f + "s").c_str(), text.c_str());
        out.resize(static_cast<std::size_t>(len));
        return out;
      }
      break;
    default:
      break;
  }
  if (n >= 0 && static_cast<std::size_t>(n) < sizeof buf)
    return std::string(buf, static_cast<std::size_t>(n));
  return arg.describe();
}

}  // namespace

std::string FormatArg::describe() const {
  switch (kind_) {
    case Kind::kValue:
      return value_ ? value_->description() : "(null)";
    case Kind::kError:
      return error_ ? error_->printed() : "(null)";
    case Kind::kText:
      return std::string(text_);
    case Kind::kNullText:
      return "(null)";
    case Kind::kSigned:
      return std::to_string(signed_);
    case Kind::kUnsigned:
      return std::to_string(unsigned_);
    case Kind::kReal: {
      // The shortest text that reads back as the same number ("1.5", not
      // "1.500000").
      char buf[40];
      for (int precision = 1; precision <= 17; ++precision) {
        std::snprintf(buf, sizeof buf, "%.*g", precision, real_);
        if (std::strtod(buf, nullptr) == real_) break;
      }
      return buf;
    }
  }
  return "(null)";
}

std::string formatMessage(std::string_view format, std::initializer_list<FormatArg> args) {
  std::string out;
  out.reserve(format.size() + 32);
  auto next = args.begin();
  static const FormatArg kMissing(static_cast<const char*>(nullptr));
  for (std::size_t i = 0; i < format.size(); ++i) {
    const char c = format[i];
    if (c != '%') {
      out += c;
      continue;
    }
    std::size_t j = i + 1;
    if (j < format.size() && format[j] == '%') {
      out += '%';
      i = j;
      continue;
    }
    std::string spec;
    while (j < format.size() && isFlag(format[j])) spec += format[j++];
    while (j < format.size() && format[j] >= '0' && format[j] <= '9') spec += format[j++];
    if (j < format.size() && format[j] == '.') {
      spec += format[j++];
      while (j < format.size() && format[j] >= '0' && format[j] <= '9') spec += format[j++];
    }
    while (j < format.size() && isLengthModifier(format[j])) ++j;
    if (j >= format.size()) {  // a lone "%" at the end prints as it is
      out.append(format.substr(i));
      break;
    }
    const char conv = format[j];
    const FormatArg& arg = next != args.end() ? *next++ : kMissing;
    out += conv == '@' ? arg.describe() : convert(spec, conv, arg);
    i = j;
  }
  return out;
}

void emitLogLine(int priority, const std::string& line) {
  Sink& s = sink();
  std::lock_guard<std::mutex> lock(s.mutex);
  if (s.handler != nullptr) {
    s.handler(priority, line.c_str(), s.context);
  } else {
    syslog(priority, "%s", line.c_str());
  }
}

int NErrorMessage(const std::string& message) {
  return log_message(static_cast<int>(currentEnv().processId()), message.c_str());
}

}  // namespace kolt

KOLT_C_BEGIN

void kolt_set_log_handler(kolt_log_handler handler, void* context) {
  kolt::Sink& s = kolt::sink();
  std::lock_guard<std::mutex> lock(s.mutex);
  s.handler = handler;
  s.context = context;
}

int log_message(int pid, const char* message) {
  char prefix[64];
  std::snprintf(prefix, sizeof prefix, "vornd: [%d] ERROR: ", pid);
  const std::string line = std::string(prefix) + (message ? message : "null");
  kolt::emitLogLine(LOG_USER | LOG_NOTICE, line);
  std::fputs(line.c_str(), stderr);
  return std::fputc('\n', stderr);
}

KOLT_C_END
