// Fixed locations of the SAN's external tools.
#ifndef KOLT_CONFIG_TOOL_PATHS_H
#define KOLT_CONFIG_TOOL_PATHS_H

namespace kolt {

// The directory of vornctl, qmadmin and pdcfgconvert.
inline constexpr const char* kToolDirectory = "/System/Library/Filesystems/kolt.fs/Contents/bin/";

}  // namespace kolt

#endif  // KOLT_CONFIG_TOOL_PATHS_H
