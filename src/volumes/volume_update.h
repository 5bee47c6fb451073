// The volume update: brings this machine's ".cfgp" files and fsmlist in line
// with the "volumes" dictionary of a Vorn configuration, and starts the
// volumes that were not hosted here before.
#ifndef KOLT_VOLUMES_VOLUME_UPDATE_H
#define KOLT_VOLUMES_VOLUME_UPDATE_H

#include "kolt/plist.h"

namespace kolt {

// The administration tool, in the tools' directory (kToolDirectory).
inline constexpr const char* kQmadminName = "qmadmin";

// For every volume (name to {"config", "mtime", "controllers"}) of `volumes`:
// - hosted here (its "controllers" holds getOurUUID()) with a date "mtime":
//   gets an fsmlist line; its "<name>.cfgp" is written from "config" (XML,
//   atomically) and given the whole second of "mtime", unless the file
//   already carries that second. Without "mtime" it is logged ("LDAP config
//   for volume '%@' lacks mtime. Ignoring") and skipped;
// - not hosted: its ".cfgp" is removed;
// - not in the fsmlist read before the call: started with
//   "qmadmin -e 'start <name>'" (not waited for).
// ".cfgp" files of no volume are removed; fsmlist is rewritten, or removed
// when nothing is hosted. Names that cannot be file names (see
// isUsableVolumeName) are logged and skipped, touching nothing. Only ".cfgp"
// files and fsmlist are ever written or removed. Failures are logged or
// ignored, never returned.
void updateFromVolumeConfig(const Value& volumes);

}  // namespace kolt

#endif  // KOLT_VOLUMES_VOLUME_UPDATE_H
