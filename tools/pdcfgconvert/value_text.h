// Lexical forms of the values in a volume configuration, the same in both
// source forms. Each reader is strict: the whole text must be a value of the
// kind ("12abc" is no integer, "Yes" no boolean).
#ifndef PDCFGCONVERT_VALUE_TEXT_H
#define PDCFGCONVERT_VALUE_TEXT_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace pdcfgconvert {

// "yes" or "true" is true, "no" or "false" is false.
std::optional<bool> parseBooleanText(std::string_view text);
// One or more decimal digits whose value fits a signed 64-bit integer.
std::optional<std::int64_t> parseIntegerText(std::string_view text);
// An integer, optionally followed by K, M, G or T (times 1024, 1024², ...);
// nothing when the product does not fit a signed 64-bit integer.
std::optional<std::int64_t> parseSizeText(std::string_view text);
// `bytes` in the size form: 16384 gives "16K"; a size that is no whole
// multiple of 1024 stays in bytes.
std::string formatSizeText(std::int64_t bytes);
// A name of disks, stripe groups, affinities and volumes: 1 to 64 characters,
// the first a letter, digit or "_", the rest letters, digits, "_", "-" or ".".
bool isNameText(std::string_view text);
// Whether `text` is well-formed UTF-8 (no overlong forms, no surrogates).
bool isValidUtf8(std::string_view text);
// `text` in double quotes for a message: control characters, quotes and
// bytes above 0x7E escaped, and cut after 40 bytes ("...").
std::string quoteForMessage(std::string_view text);

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_VALUE_TEXT_H
