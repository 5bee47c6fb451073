// Volume names come from the published configuration and become file names
// ("<name>.cfgp", "/var/run/vorn_qmadmin_<name>.log"), fsmlist lines and a
// command argument. Only names that are safe in all of those are used.
#ifndef KOLT_VOLUMES_VOLUME_NAMES_H
#define KOLT_VOLUMES_VOLUME_NAMES_H

#include <string>
#include <string_view>

namespace kolt {

// False for a name that is empty, is not valid UTF-8, starts with ".", or
// holds "/", a white-space, line-break or control character.
bool isUsableVolumeName(std::string_view name);

// The name with control characters escaped, for a log line about it.
std::string printableVolumeName(std::string_view name);

}  // namespace kolt

#endif  // KOLT_VOLUMES_VOLUME_NAMES_H
