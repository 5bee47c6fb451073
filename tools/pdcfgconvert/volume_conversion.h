// One conversion: read the source (and with -A its companion file) through an
// Env, build the volume's property list and write it as XML.
#ifndef PDCFGCONVERT_VOLUME_CONVERSION_H
#define PDCFGCONVERT_VOLUME_CONVERSION_H

#include <cstddef>
#include <optional>
#include <string>

#include "command_line.h"
#include "kolt/env.h"

namespace pdcfgconvert {

// Largest source or companion file read.
inline constexpr std::size_t kMaxInputBytes = 4 << 20;

// Converts `options.sourcePath` (a system path of `env`). Returns the XML
// property list, or nothing with `message` (a finished line without the
// program's name, such as "/p/v.cfg:12: unknown key ...") when a file cannot
// be read, the source or the companion file is not valid, or the output
// cannot be written.
std::optional<std::string> convertVolume(const Options& options, kolt::Env& env,
                                         std::string* message);

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_VOLUME_CONVERSION_H
