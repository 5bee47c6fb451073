// The per-controller step of updateFromGlobalConfig: the change check builds
// the local document's "controllerIPMap" (address to host name) from the
// published controller table one entry at a time.
#ifndef KOLT_VOLUMES_CONTROLLER_HOST_MAP_H
#define KOLT_VOLUMES_CONTROLLER_HOST_MAP_H

#include "kolt/plist.h"

namespace kolt {

// map[entry's "IPAddress"] = entry's "hostName". A later entry with the same
// address replaces an earlier one; an entry without a string "hostName"
// leaves its address without a mapping; one without a string "IPAddress" is
// passed over.
void addControllerToIPMap(const Value& controllerEntry, Dictionary* map);

}  // namespace kolt

#endif  // KOLT_VOLUMES_CONTROLLER_HOST_MAP_H
