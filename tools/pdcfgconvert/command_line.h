// The command line of pdcfgconvert.
#ifndef PDCFGCONVERT_COMMAND_LINE_H
#define PDCFGCONVERT_COMMAND_LINE_H

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "volume_schema.h"

namespace pdcfgconvert {

struct Options {
  bool help = false;              // -h: print the usage text and stop
  std::string volumeName;         // -n
  bool withAuxData = false;       // -A
  std::string sourcePath;         // the .cfg or .cfgx file
  Syntax syntax = Syntax::kText;  // from the source's suffix
};

// Parses the arguments after the program name. Returns nothing with
// `problem` for an unknown option, a missing or repeated value, a missing or
// extra source path, an output format other than "plist", a bad volume name,
// a source whose name ends in neither ".cfg" nor ".cfgx", or -A with a .cfgx
// source.
std::optional<Options> parseCommandLine(const std::vector<std::string_view>& arguments,
                                        std::string* problem);

// Whether `name` can name a volume: 1 to 255 bytes of UTF-8 without "/",
// "." or control characters (a volume name is the part of its file names
// before the first full stop).
bool isVolumeName(std::string_view name);

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_COMMAND_LINE_H
