// The local configuration document and the host identity.
#include "kolt/local_config.h"

#include <strings.h>

#include <cerrno>
#include <cstdio>

#include "kolt/env.h"
#include "kolt/error.h"
#include "kolt/log.h"

namespace kolt {

std::optional<Value> loadConfigPlist() {
  std::string bytes;
  const int rc = currentEnv().readFile(kConfigPlistPath, &bytes);
  if (rc != 0) {
    errno = rc;
    return std::nullopt;
  }
  std::optional<Value> document = parsePropertyList(bytes);
  if (!document || !document->isDictionary()) {
    errno = EINVAL;
    return std::nullopt;
  }
  return document;
}

bool saveConfigPlist(const Value& document) {
  std::optional<std::string> xml = writeXmlPropertyList(document);
  if (!xml) return false;
  return writeFileAtomically(currentEnv(), kConfigPlistPath, *xml, 0644) == 0;
}

bool configPlistIsController(const Value& document) {
  const std::string* role = document.findString("role");
  return role != nullptr && *role == "CONTROLLER";
}

bool configPlistIsMaster(const Value&) { return false; }

bool configPlistIsZombie(const Value& document) {
  const Value* needsActivation = document.find("needsActivation");
  if (needsActivation != nullptr && needsActivation->truthValue()) return true;
  const std::string* primaryZombie = document.findString("primaryZombie");
  if (primaryZombie == nullptr) return false;
  return ::strcasecmp(primaryZombie->c_str(), getOurUUID().c_str()) == 0;
}

void fillInOurUUID() {
  Env& env = currentEnv();
  std::call_once(env.hostUUIDOnce(), [&env] {
    // A platform that cannot tell leaves the bytes cleared: the zero UUID.
    std::array<std::uint8_t, 16> bytes{};
    const int rc = env.hardwareUUID(&bytes);
    if (rc != 0) {
      bytes.fill(0);
      log("fillInOurUUID returned error %d", rc);
    }
    char text[37];
    std::snprintf(text, sizeof text,
                  "%02X%02X%02X%02X-%02X%02X-%02X%02X-%02X%02X-%02X%02X%02X%02X%02X%02X", bytes[0],
                  bytes[1], bytes[2], bytes[3], bytes[4], bytes[5], bytes[6], bytes[7], bytes[8],
                  bytes[9], bytes[10], bytes[11], bytes[12], bytes[13], bytes[14], bytes[15]);
    env.hostUUIDCache() = text;
  });
}

const std::string& getOurUUID() {
  fillInOurUUID();
  return currentEnv().hostUUIDCache();
}

}  // namespace kolt
