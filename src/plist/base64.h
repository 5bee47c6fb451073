// Base64 for <data> elements. Our own because the writer needs the line
// layout and indentation of property lists and the reader must refuse
// garbage (OpenSSL's decoder is lenient about both).
#ifndef KOLT_PLIST_BASE64_H
#define KOLT_PLIST_BASE64_H

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace kolt::base64 {

// Characters per line of <data> content (57 bytes).
inline constexpr std::size_t kLineChars = 76;

// Appends `bytes` in lines of at most kLineChars characters, each line
// preceded by `indent` tabs and followed by "\n". Nothing for no bytes.
void appendLines(std::string& out, std::string_view bytes, std::size_t indent);

// Decodes standard base64. Whitespace (space, tab, CR, LF) may appear
// anywhere; padding may be omitted; anything else (a foreign character,
// "=" inside the text, a dangling sextet) is refused.
std::optional<std::string> decode(std::string_view text);

}  // namespace kolt::base64

#endif  // KOLT_PLIST_BASE64_H
