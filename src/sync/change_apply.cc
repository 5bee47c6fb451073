#include "sync/change_apply.h"

#include "kolt/change_check.h"
#include "kolt/controller_helpers.h"
#include "kolt/error.h"
#include "kolt/local_config.h"
#include "kolt/log.h"
#include "volumes/controller_host_map.h"
#include "volumes/key_operations.h"
#include "volumes/nameservers.h"
#include "volumes/querix_flags.h"
#include "volumes/volume_update.h"

namespace kolt {
namespace {

// The keys that members copy from the published globals, in order.
constexpr const char* kCopiedKeys[] = {"sanConfigURLs", "desiredSearchPolicy", "notifications",
                                       "ownerEmail",    "ownerName",           "sanAuthMethod",
                                       "primaryZombie", "sanState"};

// The first entry of "sanConfigURLs" (an array, or one string).
const std::string* firstConfigURL(const Value& globals) {
  const Value* urls = globals.find("sanConfigURLs");
  if (urls == nullptr) return nullptr;
  if (const std::string* one = urls->asString()) return one->empty() ? nullptr : one;
  const Array* many = urls->asArray();
  if (many == nullptr || many->empty()) return nullptr;
  return many->front().asString();
}

void trustControllers(const Value& globals) {
  const std::string* url = firstConfigURL(globals);
  if (url == nullptr) {
    log("No sanConfigURLs in the SAN configuration; no controller certificates loaded");
    return;
  }
  loadControllerCerts(*url);
}

// Writes the handed-in secret to ".auth_secret" (mode 0600 from creation).
// A document without a secret leaves the file alone: the check may just have
// logged in with it, and removing it would lock this machine out.
void storeSecret(const Value& working) {
  if (working.findString("sharedSecret") == nullptr) return;
  update_from_config(*working.asDictionary(), ".auth_secret", "sharedSecret", 0600);
}

}  // namespace

int applyConfiguration(const ApplyContext& c) {
  Value& working = *c.working;
  Value& globals = *c.globals;
  const bool globalsIsWorking = c.globals == c.working;
  std::uint32_t& mask = *c.changeMask;

  if (c.usedNode) {
    const std::string* published = globals.findString("sanName");
    const std::string* ours = working.findString("sanName");
    if (published == nullptr || ours == nullptr || *published != *ours) {
      return Error::vorn(kVornSanNameMismatch).status();
    }
  }

  bool certificatesChanged = false;
  if (!globalsIsWorking) {
    std::uint8_t changed = 0;
    Dictionary* destination = working.asDictionary();
    const Dictionary& source = *globals.asDictionary();
    for (const char* key : kCopiedKeys) copyValue(destination, source, key, &changed);
    changed = 0;
    copyValue(destination, source, "certSetRevision", &changed);
    certificatesChanged = (changed & 1) != 0;
  }

  update_from_config(*globals.asDictionary(), "fsports", "fsports", 0644);

  if (working.find("configIsNew") != nullptr) {
    storeSecret(working);
    globals.erase("sharedSecret");
  } else if (globals.find("sharedSecret") != nullptr) {
    log("auth_secret w/o configIsNew");
  }

  std::uint64_t loadedHash = 0;
  std::uint64_t workingHash = 0;
  const int loadedFlags = querixServerFlagsForConfig(c.loaded, &loadedHash);
  const int workingFlags = querixServerFlagsForConfig(&working, &workingHash);
  if (loadedFlags != workingFlags || loadedHash != workingHash) mask |= kChangeQuerixServer;

  Dictionary ipMap;
  if (const Dictionary* controllers = globals.findDictionary("controllers")) {
    for (const auto& [uuid, entry] : *controllers) addControllerToIPMap(entry, &ipMap);
  }
  working.set("controllerIPMap", std::move(ipMap));

  const Array fileList = read_fsnameservers(nullptr);
  const Value* published = globals.find("fsnameservers");
  const Array publishedList = published && published->asArray() ? *published->asArray() : Array();
  if (fsnameservers_without_uuids(publishedList) != fileList) write_fsnameservers(publishedList);

  const std::string& ourUUID = getOurUUID();
  std::string role = "CLIENT";
  const Dictionary* controllers = globals.findDictionary("controllers");
  const std::string* primaryZombie = globals.findString("primaryZombie");
  if (controllers != nullptr && controllers->contains(ourUUID)) {
    role = "CONTROLLER";
  } else if (primaryZombie != nullptr && *primaryZombie == ourUUID) {
    role = "CONTROLLER";
  } else if (certificatesChanged && (mask & kChangeNewConfig) == 0) {
    trustControllers(globals);
  }

  const std::string* oldRole = c.loaded ? c.loaded->findString("role") : nullptr;
  if (oldRole == nullptr) {
    mask |= kChangeRole;
  } else if (*oldRole != role) {
    if (*oldRole == "CONTROLLER" && role == "CLIENT") {
      startVornctlToUnloadProfile();
      mask |= kChangeControllerToClient;
    } else {
      mask |= kChangeRole;
    }
  }
  working.set("role", role);
  mask |= kChangeApplied;

  if (c.volumes != nullptr) updateFromVolumeConfig(*c.volumes);

  working.erase("configIsNew");
  working.erase("sharedSecret");
  if (!saveConfigPlist(working)) return Error::posix(kPosixEINVAL, "Error saving config.plist").status();

  const std::string* state = working.findString("sanState");
  if (state != nullptr && *state == "dead") {
    if (c.newConfig == nullptr) {
      startVornctlToUnloadProfile();
      return 0;
    }
    return Error::vorn(kVornSanDeleted).status();
  }
  return 0;
}

int saveUnchangedJoin(const ApplyContext& c) {
  Value& working = *c.working;
  if (c.loaded != nullptr) {
    if (const std::string* role = c.loaded->findString("role")) {
      working.set("role", *role);
    } else {
      working.erase("role");
    }
  }
  working.erase("configIsNew");
  // The secret belongs in ".auth_secret", never in config.plist.
  storeSecret(working);
  working.erase("sharedSecret");
  saveConfigPlist(working);
  return 0;
}

}  // namespace kolt
