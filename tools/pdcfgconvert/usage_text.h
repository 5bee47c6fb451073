// The text that "pdcfgconvert -h" prints: the command line and both source
// forms, with the key reference built from the schema so that it cannot drift.
#ifndef PDCFGCONVERT_USAGE_TEXT_H
#define PDCFGCONVERT_USAGE_TEXT_H

#include <string>
#include <string_view>

namespace pdcfgconvert {

// One line, printed after a command-line error.
inline constexpr std::string_view kUsageLine =
    "usage: pdcfgconvert -n <volume> [-F plist] [-A] <volume>.cfg|<volume>.cfgx\n"
    "       pdcfgconvert -h\n";

std::string usageText();

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_USAGE_TEXT_H
