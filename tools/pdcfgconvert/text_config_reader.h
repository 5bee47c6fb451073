// The text form of a volume configuration (<volume>.cfg). The usage text
// documents its grammar.
#ifndef PDCFGCONVERT_TEXT_CONFIG_READER_H
#define PDCFGCONVERT_TEXT_CONFIG_READER_H

#include <cstddef>
#include <string_view>

#include "conversion_error.h"
#include "volume_builder.h"

namespace pdcfgconvert {

// Longest line accepted, without its line end.
inline constexpr std::size_t kMaxTextLineBytes = 4096;

// Feeds the sections and keys of `text` to `builder` (made for Syntax::kText).
// Returns false with `error` (and its line) at the first problem: a line that
// is too long, not UTF-8 or holds control characters, a malformed header, an
// unknown section or key, a setting outside a section, or what the builder
// rejects.
bool readTextConfig(std::string_view text, VolumeBuilder& builder, ConversionError* error);

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_TEXT_CONFIG_READER_H
