// Our own reader of inet_addr's notation: a pure function over a bounded
// view, so the name-server reader stays free of C-string and errno rules.
#include "volumes/inet_address.h"

#include <array>

namespace kolt {
namespace {

bool isAsciiSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r';
}
bool isDigit(char c) {
  return c >= '0' && c <= '9';
}
int hexDigitValue(char c) {
  if (isDigit(c)) return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

// Reads one number at `*pos` in C notation; fails above 0xffffffff.
std::optional<std::uint64_t> readPart(std::string_view text, std::size_t* pos) {
  std::size_t i = *pos;
  if (i >= text.size() || !isDigit(text[i])) return std::nullopt;
  unsigned base = 10;
  if (text[i] == '0') {
    if (i + 1 < text.size() && (text[i + 1] == 'x' || text[i + 1] == 'X') && i + 2 < text.size() &&
        hexDigitValue(text[i + 2]) >= 0) {
      base = 16;
      i += 2;
    } else {
      base = 8;
    }
  }
  std::uint64_t value = 0;
  for (; i < text.size(); ++i) {
    const int digit = hexDigitValue(text[i]);
    if (digit < 0 || static_cast<unsigned>(digit) >= base) break;
    value = value * base + static_cast<unsigned>(digit);
    if (value > 0xffffffffULL) return std::nullopt;
  }
  *pos = i;
  return value;
}

}  // namespace

std::optional<std::uint32_t> parseInetAddress(std::string_view text) {
  std::array<std::uint64_t, 4> parts{};
  std::size_t count = 0;
  std::size_t pos = 0;
  for (;;) {
    const std::optional<std::uint64_t> part = readPart(text, &pos);
    if (!part) return std::nullopt;
    parts[count++] = *part;
    if (pos < text.size() && text[pos] == '.') {
      if (count == 4 || *part > 0xff) return std::nullopt;
      ++pos;
      continue;
    }
    break;
  }
  if (pos < text.size() && text[pos] != '\0' && !isAsciiSpace(text[pos])) return std::nullopt;
  // The last part fills the bytes that the earlier parts leave.
  const std::uint64_t last = parts[count - 1];
  static constexpr std::uint64_t kLastPartMax[] = {0xffffffffULL, 0xffffffULL, 0xffffULL, 0xffULL};
  if (last > kLastPartMax[count - 1]) return std::nullopt;
  std::uint64_t address = last;
  for (std::size_t k = 0; k + 1 < count; ++k) address |= parts[k] << (24 - 8 * k);
  return static_cast<std::uint32_t>(address);
}

std::string formatInetAddress(std::uint32_t address) {
  std::string text;
  for (int shift = 24; shift >= 0; shift -= 8) {
    text += std::to_string((address >> shift) & 0xff);
    if (shift != 0) text += '.';
  }
  return text;
}

}  // namespace kolt
