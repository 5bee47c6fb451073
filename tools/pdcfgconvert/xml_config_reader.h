// The XML form of a volume configuration (<volume>.cfgx): the same sections
// and keys as the text form, as elements. The usage text documents it.
#ifndef PDCFGCONVERT_XML_CONFIG_READER_H
#define PDCFGCONVERT_XML_CONFIG_READER_H

#include <cstddef>
#include <string_view>

#include "conversion_error.h"
#include "volume_builder.h"

namespace pdcfgconvert {

// Longest text content of one key element.
inline constexpr std::size_t kMaxXmlValueBytes = 4096;

// Feeds the sections and keys of the XML document `text` to `builder` (made
// for Syntax::kXml). Returns false with `error` (and its line) at the first
// problem: malformed XML, a document type declaration (refused, so no entity
// can expand), an unknown or misplaced element or attribute, stray text, or
// what the builder rejects.
bool readXmlConfig(std::string_view text, VolumeBuilder& builder, ConversionError* error);

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_XML_CONFIG_READER_H
