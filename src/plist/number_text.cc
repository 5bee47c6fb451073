#include "plist/number_text.h"

#include <charconv>
#include <cmath>
#include <cstdint>
#include <limits>

namespace kolt::number_text {

void appendInteger(std::string& out, const Integer& i) {
  char buf[32];
  std::to_chars_result r =
      i.isUnsigned ? std::to_chars(buf, buf + sizeof buf, static_cast<std::uint64_t>(i.bits))
                   : std::to_chars(buf, buf + sizeof buf, i.bits);
  out.append(buf, r.ptr);
}

void appendReal(std::string& out, double d) {
  if (std::isnan(d)) {
    out += "nan";
  } else if (std::isinf(d)) {
    out += d > 0 ? "+infinity" : "-infinity";
  } else {
    char buf[64];
    std::to_chars_result r = std::to_chars(buf, buf + sizeof buf, d);
    out.append(buf, r.ptr);
  }
}

std::string formatInteger(const Integer& i) {
  std::string out;
  appendInteger(out, i);
  return out;
}

std::string formatReal(double d) {
  std::string out;
  appendReal(out, d);
  return out;
}

std::optional<Integer> parseInteger(std::string_view s) {
  bool negative = false;
  if (!s.empty() && (s[0] == '+' || s[0] == '-')) {
    negative = s[0] == '-';
    s.remove_prefix(1);
  }
  int base = 10;
  if (s.size() > 2 && s[0] == '0' && (s[1] == 'x' || s[1] == 'X')) {
    base = 16;
    s.remove_prefix(2);
  }
  // from_chars takes no sign here (it was consumed above), so "--1" and
  // "0x-1" fail as they should.
  if (s.empty() || s[0] == '+' || s[0] == '-') return std::nullopt;
  std::uint64_t magnitude = 0;
  const auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), magnitude, base);
  if (ec != std::errc() || end != s.data() + s.size()) return std::nullopt;
  constexpr std::uint64_t kMinMagnitude = std::uint64_t{1} << 63;  // |INT64_MIN|
  if (negative) {
    if (magnitude > kMinMagnitude) return std::nullopt;
    return Integer{static_cast<std::int64_t>(0 - magnitude), false};
  }
  const bool above =
      magnitude > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
  return Integer{static_cast<std::int64_t>(magnitude), above};
}

namespace {

// The decimal exponent of the first significant digit of a number that
// from_chars found out of range: positive means overflow, otherwise
// underflow.
bool overflows(std::string_view s) {
  std::int64_t position = 0;  // exponent contributed by the digits
  bool seenDigit = false;
  bool afterPoint = false;
  std::size_t i = 0;
  for (; i < s.size(); ++i) {
    const char c = s[i];
    if (c == '.') {
      afterPoint = true;
    } else if (c >= '0' && c <= '9') {
      if (c != '0' && !seenDigit) seenDigit = true;
      if (!afterPoint && seenDigit) ++position;
      if (afterPoint && !seenDigit) --position;
    } else {
      break;
    }
  }
  std::int64_t exponent = 0;
  if (i < s.size() && (s[i] == 'e' || s[i] == 'E')) {
    ++i;
    bool negative = false;
    if (i < s.size() && (s[i] == '+' || s[i] == '-')) negative = s[i++] == '-';
    for (; i < s.size(); ++i) {
      if (exponent < 100000000) exponent = exponent * 10 + (s[i] - '0');
    }
    if (negative) exponent = -exponent;
  }
  return position + exponent > 0;
}

}  // namespace

std::optional<double> parseReal(std::string_view s) {
  bool negative = false;
  if (!s.empty() && (s[0] == '+' || s[0] == '-')) {
    negative = s[0] == '-';
    s.remove_prefix(1);
  }
  if (s.empty() || s[0] == '+' || s[0] == '-') return std::nullopt;
  double d = 0;
  const auto [end, ec] =
      std::from_chars(s.data(), s.data() + s.size(), d, std::chars_format::general);
  if (end != s.data() + s.size()) return std::nullopt;
  if (ec == std::errc::result_out_of_range) {
    d = overflows(s) ? std::numeric_limits<double>::infinity() : 0.0;
  } else if (ec != std::errc()) {
    return std::nullopt;
  }
  return negative ? -d : d;
}

}  // namespace kolt::number_text
