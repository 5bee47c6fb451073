// Strict lexical readers for configuration values.
#include "value_text.h"

#include <cstdio>
#include <limits>
#include <utility>

namespace pdcfgconvert {
namespace {

bool isDigit(char c) {
  return c >= '0' && c <= '9';
}
bool isLetter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

}  // namespace

std::optional<bool> parseBooleanText(std::string_view text) {
  if (text == "yes" || text == "true") return true;
  if (text == "no" || text == "false") return false;
  return std::nullopt;
}

std::optional<std::int64_t> parseIntegerText(std::string_view text) {
  if (text.empty()) return std::nullopt;
  constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
  std::int64_t value = 0;
  for (char c : text) {
    if (!isDigit(c)) return std::nullopt;
    const int digit = c - '0';
    if (value > (kMax - digit) / 10) return std::nullopt;
    value = value * 10 + digit;
  }
  return value;
}

std::optional<std::int64_t> parseSizeText(std::string_view text) {
  int shift = 0;
  if (!text.empty()) {
    switch (text.back()) {
      case 'K':
        shift = 10;
        break;
      case 'M':
        shift = 20;
        break;
      case 'G':
        shift = 30;
        break;
      case 'T':
        shift = 40;
        break;
      default:
        break;
    }
  }
  if (shift != 0) text.remove_suffix(1);
  const std::optional<std::int64_t> count = parseIntegerText(text);
  if (!count) return std::nullopt;
  if (*count > (std::numeric_limits<std::int64_t>::max() >> shift)) return std::nullopt;
  return *count << shift;
}

std::string formatSizeText(std::int64_t bytes) {
  static constexpr std::pair<int, char> kUnits[] = {{40, 'T'}, {30, 'G'}, {20, 'M'}, {10, 'K'}};
  for (const auto& [shift, unit] : kUnits) {
    const std::int64_t scale = std::int64_t{1} << shift;
    if (bytes != 0 && bytes % scale == 0) return std::to_string(bytes / scale) + unit;
  }
  return std::to_string(bytes);
}

bool isNameText(std::string_view text) {
  if (text.empty() || text.size() > 64) return false;
  if (!isLetter(text[0]) && !isDigit(text[0]) && text[0] != '_') return false;
  for (char c : text) {
    if (!isLetter(c) && !isDigit(c) && c != '_' && c != '-' && c != '.') return false;
  }
  return true;
}

bool isValidUtf8(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size()) {
    const auto byte = static_cast<unsigned char>(text[i]);
    if (byte < 0x80) {
      ++i;
      continue;
    }
    std::size_t length = 0;
    std::uint32_t code = 0;
    if (byte >= 0xC2 && byte <= 0xDF) {
      length = 2;
      code = byte & 0x1F;
    } else if (byte >= 0xE0 && byte <= 0xEF) {
      length = 3;
      code = byte & 0x0F;
    } else if (byte >= 0xF0 && byte <= 0xF4) {
      length = 4;
      code = byte & 0x07;
    } else {
      return false;
    }
    if (text.size() - i < length) return false;
    for (std::size_t k = 1; k < length; ++k) {
      const auto next = static_cast<unsigned char>(text[i + k]);
      if ((next & 0xC0) != 0x80) return false;
      code = (code << 6) | (next & 0x3F);
    }
    if ((length == 3 && code < 0x800) || (length == 4 && code < 0x10000) || code > 0x10FFFF ||
        (code >= 0xD800 && code <= 0xDFFF)) {
      return false;
    }
    i += length;
  }
  return true;
}

std::string quoteForMessage(std::string_view text) {
  constexpr std::size_t kShown = 40;
  std::string quoted = "\"";
  for (std::size_t i = 0; i < text.size() && i < kShown; ++i) {
    const auto c = static_cast<unsigned char>(text[i]);
    if (c == '"' || c == '\\') {
      quoted += '\\';
      quoted += static_cast<char>(c);
    } else if (c < 0x20 || c > 0x7E) {
      char escaped[8];
      std::snprintf(escaped, sizeof escaped, "\\x%02X", c);
      quoted += escaped;
    } else {
      quoted += static_cast<char>(c);
    }
  }
  quoted += '"';
  if (text.size() > kShown) quoted += "...";
  return quoted;
}

}  // namespace pdcfgconvert
