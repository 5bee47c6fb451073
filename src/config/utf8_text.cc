#include "config/utf8_text.h"

#include <cstdint>

namespace kolt::utf8 {

bool next(std::string_view text, std::size_t* pos, char32_t* character) {
  const std::size_t i = *pos;
  if (i >= text.size()) return false;
  const auto byte = [&](std::size_t k) { return static_cast<std::uint8_t>(text[i + k]); };
  const std::uint8_t b0 = byte(0);
  std::size_t length;
  char32_t c;
  char32_t minimum;
  if (b0 < 0x80) {
    *character = b0;
    *pos = i + 1;
    return true;
  } else if ((b0 & 0xE0) == 0xC0) {
    length = 2, c = b0 & 0x1F, minimum = 0x80;
  } else if ((b0 & 0xF0) == 0xE0) {
    length = 3, c = b0 & 0x0F, minimum = 0x800;
  } else if ((b0 & 0xF8) == 0xF0) {
    length = 4, c = b0 & 0x07, minimum = 0x10000;
  } else {
    return false;
  }
  if (text.size() - i < length) return false;
  for (std::size_t k = 1; k < length; ++k) {
    if ((byte(k) & 0xC0) != 0x80) return false;
    c = (c << 6) | (byte(k) & 0x3F);
  }
  if (c < minimum || c > 0x10FFFF || (c >= 0xD800 && c <= 0xDFFF)) return false;
  *character = c;
  *pos = i + length;
  return true;
}

bool isValid(std::string_view text) {
  std::size_t pos = 0;
  char32_t c;
  while (pos < text.size()) {
    if (!next(text, &pos, &c)) return false;
  }
  return true;
}

bool isWhitespace(char32_t c) {
  return c == U'\t' || c == U' ' || c == 0xA0 || c == 0x1680 || (c >= 0x2000 && c <= 0x200A) ||
         c == 0x202F || c == 0x205F || c == 0x3000;
}

bool isControl(char32_t c) {
  return c < 0x20 || (c >= 0x7F && c <= 0x9F);
}

std::size_t utf16Length(std::string_view text) {
  std::size_t units = 0;
  std::size_t pos = 0;
  char32_t c;
  while (pos < text.size()) {
    if (!next(text, &pos, &c)) {
      ++pos;  // not reached for valid text; counts a stray byte as one unit
      ++units;
      continue;
    }
    units += c >= 0x10000 ? 2 : 1;
  }
  return units;
}

}  // namespace kolt::utf8
