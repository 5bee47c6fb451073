#include "volumes/volume_names.h"

#include <cstdio>

#include "config/utf8_text.h"

namespace kolt {
namespace {

bool isLineBreak(char32_t c) {
  return c == 0x2028 || c == 0x2029;
}

}  // namespace

bool isUsableVolumeName(std::string_view name) {
  if (name.empty() || name.front() == '.') return false;
  std::size_t pos = 0;
  char32_t c;
  while (pos < name.size()) {
    if (!utf8::next(name, &pos, &c)) return false;
    if (c == U'/' || utf8::isWhitespace(c) || utf8::isControl(c) || isLineBreak(c)) return false;
  }
  return true;
}

std::string printableVolumeName(std::string_view name) {
  std::string out;
  for (unsigned char c : name) {
    if (c < 0x20 || c == 0x7f || c == '\\') {
      char escaped[8];
      std::snprintf(escaped, sizeof escaped, "\\x%02X", c);
      out += escaped;
    } else {
      out += static_cast<char>(c);
    }
  }
  return out;
}

}  // namespace kolt
