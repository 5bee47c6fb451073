// Volume configuration files and the single-value files (".auth_secret",
// "fsports", "uuid") of "/Library/Preferences/Vorn/".
#ifndef KOLT_VOLUME_FILES_H
#define KOLT_VOLUME_FILES_H

#include <optional>
#include <string>

#include "kolt/export.h"

namespace kolt {

// The whole content of "/Library/Preferences/Vorn/<name>" as UTF-8 text,
// unchanged (a final line end stays). Nothing when there is no such file, it
// cannot be read, or it is not valid UTF-8.
KOLT_EXPORT std::optional<std::string> read_vorn_cfg_file(const std::string& name);

}  // namespace kolt

#endif  // KOLT_VOLUME_FILES_H
