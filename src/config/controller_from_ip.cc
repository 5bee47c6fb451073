// vorn_controller_from_ip: a controller's host name from its address, for
// callers in C.
#include <cerrno>
#include <cstring>
#include <string>

#include "kolt/controller_helpers.h"
#include "kolt/local_config.h"
#include "kolt/log.h"

namespace {

// The dotted form of an IPv4-mapped IPv6 address; any other text unchanged.
std::string lookupKey(const char* numericAddress) {
  constexpr std::string_view kMappedPrefix = "::ffff:";
  std::string text(numericAddress);
  if (text.compare(0, kMappedPrefix.size(), kMappedPrefix) == 0 &&
      text.find(':', kMappedPrefix.size()) == std::string::npos) {
    return text.substr(kMappedPrefix.size());
  }
  return text;
}

}  // namespace

extern "C" int vorn_controller_from_ip(const char* numericAddress, char* hostNameBuffer,
                                       uint32_t hostNameSize) {
  using namespace kolt;
  if (numericAddress == nullptr || (hostNameBuffer == nullptr && hostNameSize != 0)) {
    errno = EINVAL;
    return 1;
  }
  const std::optional<Value> document = loadConfigPlist();
  // The document may hold the shared secret; it never reaches a log line.
  const std::optional<Value> printable =
      document ? std::optional<Value>(redactVornSecrets(*document)) : std::nullopt;
  log("vorn_controller_from_ip: got numeric %s and config %@", numericAddress, printable);
  if (!document) {
    errno = kPosixENOENT;
    return 1;
  }
  const Value* map = document->find("controllerIPMap");
  const std::string* hostName = map ? map->findString(lookupKey(numericAddress)) : nullptr;
  if (hostName != nullptr && hostNameSize != 0) {
    const std::size_t length = std::min<std::size_t>(hostName->size(), hostNameSize - 1);
    std::memcpy(hostNameBuffer, hostName->data(), length);
    hostNameBuffer[length] = '\0';
  }
  errno = 0;
  return 0;
}
