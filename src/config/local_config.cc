// The local configuration document and the host identity.
#include "kolt/local_config.h"

#include "config/uuid_text.h"

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
  // A document that carries the shared secret is readable by its owner only.
  const mode_t mode = document.find("sharedSecret") != nullptr ? 0600 : 0644;
  // The atomic writer syncs the file and its directory: the new document is
  // durable once this returns true.
  return writeFileAtomically(currentEnv(), kConfigPlistPath, *xml, mode) == 0;
}

bool configPlistIsController(const Value& document) {
  const std::string* role = document.findString("role");
  return role != nullptr && *role == "CONTROLLER";
}

bool configPlistIsMaster(const Value&) {
  return false;
}

bool configPlistIsZombie(const Value& document) {
  const Value* needsActivation = document.find("needsActivation");
  if (needsActivation != nullptr && needsActivation->truthValue()) return true;
  const std::string* primaryZombie = document.findString("primaryZombie");
  if (primaryZombie == nullptr) return false;
  return ::strcasecmp(primaryZombie->c_str(), getOurUUID().c_str()) == 0;
}

namespace {

void fillInOurUUIDFor(Env& env) {
  // Threads racing here ask the platform once; the others wait for the fill.
  std::call_once(env.hostUUIDOnce(), [&env] {
    // A platform that cannot tell gives the zero UUID, never stale or
    // uninitialised bytes.
    std::array<std::uint8_t, 16> bytes{};
    const int rc = env.hardwareUUID(&bytes);
    if (rc != 0) {
      bytes.fill(0);
      log("fillInOurUUID returned error %d", rc);
    }
    env.hostUUIDCache() = formatUUID(bytes);
  });
}

}  // namespace

void fillInOurUUID() {
  fillInOurUUIDFor(currentEnv());
}

const std::string& getOurUUID() {
  // One Env for the fill and the answer, even if the current Env changes.
  Env& env = currentEnv();
  fillInOurUUIDFor(env);
  return env.hostUUIDCache();
}

}  // namespace kolt
