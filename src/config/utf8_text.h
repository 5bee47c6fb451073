// UTF-8 text helpers for the readers of the small text files (fsmlist,
// fsnameservers, the single-value files), which must treat text the way the
// platform's string type does: as Unicode characters, not bytes.
#ifndef KOLT_CONFIG_UTF8_TEXT_H
#define KOLT_CONFIG_UTF8_TEXT_H

#include <cstddef>
#include <string_view>

namespace kolt::utf8 {

// True when `text` is well-formed UTF-8 (no overlong forms, no surrogates,
// nothing above U+10FFFF).
bool isValid(std::string_view text);

// Decodes the character at `*pos` of valid UTF-8 text and advances `*pos`
// past it. Returns false at the end of the text or on a malformed sequence
// (then `*pos` is not moved).
bool next(std::string_view text, std::size_t* pos, char32_t* character);

// The platform's white-space set: tab and the space separators (U+0020,
// U+00A0, U+1680, U+2000..U+200A, U+202F, U+205F, U+3000). Line breaks are
// not in it.
bool isWhitespace(char32_t c);

// Control characters: C0, DEL and C1.
bool isControl(char32_t c);

// Length in UTF-16 code units, the platform string's length, of valid UTF-8.
std::size_t utf16Length(std::string_view text);

}  // namespace kolt::utf8

#endif  // KOLT_CONFIG_UTF8_TEXT_H
