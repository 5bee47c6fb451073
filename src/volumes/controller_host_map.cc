#include "volumes/controller_host_map.h"

namespace kolt {

void addControllerToIPMap(const Value& controllerEntry, Dictionary* map) {
  const std::string* address = controllerEntry.findString("IPAddress");
  if (address == nullptr) return;
  const std::string* hostName = controllerEntry.findString("hostName");
  if (hostName == nullptr) {
    map->erase(*address);
    return;
  }
  map->set(*address, *hostName);
}

}  // namespace kolt
