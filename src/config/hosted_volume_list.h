// The list of volumes a machine hosts, "/Library/Preferences/Vorn/fsmlist":
// one line per volume, "<name> . 0\n". The volume update writes it; the
// controller helpers read it back.
#ifndef KOLT_CONFIG_HOSTED_VOLUME_LIST_H
#define KOLT_CONFIG_HOSTED_VOLUME_LIST_H

#include <string>
#include <string_view>

#include "kolt/plist.h"

namespace kolt {

inline constexpr const char* kFsmlistPath = "/Library/Preferences/Vorn/fsmlist";

// Parses the text of an fsmlist file: the first white-space-separated field
// of every line (lines end at "\n" only), in order, duplicates kept; lines
// that are empty or begin with white space add nothing. Text that is not
// valid UTF-8 gives an empty array. Pure: touches nothing.
Array parseHostedVolumeList(std::string_view text);

// The fsmlist line of one hosted volume: "<name> . 0\n".
std::string hostedVolumeLine(std::string_view volumeName);

}  // namespace kolt

#endif  // KOLT_CONFIG_HOSTED_VOLUME_LIST_H
