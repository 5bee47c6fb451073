// The controller-side build.
#include "kolt/build.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "config/uuid_text.h"
#include "kolt/controller_helpers.h"
#include "kolt/directory.h"
#include "kolt/directory_records.h"
#include "kolt/env.h"
#include "kolt/local_config.h"
#include "kolt/log.h"
#include "kolt/volume_files.h"
#include "sync/metadata_address.h"
#include "volumes/key_operations.h"
#include "volumes/nameservers.h"
#include "volumes/volume_collection.h"

namespace kolt {
namespace {

// The settings a controller publishes from its local document, in order.
// What redactVornSecrets shows in place of the shared secret.
constexpr const char* kRedactedSecret = "********";

constexpr const char* kPublishedKeys[] = {"sanConfigURLs", "desiredSearchPolicy", "notifications",
                                          "ownerEmail",    "ownerName",           "sanAuthMethod"};

// An early failure of the build's own: logged with its description first.
Error ownError(Error error) {
  log("buildSanConfig: returnign error code %d dict %@", error.status(), Value(error.userInfo()));
  return error;
}

// A failed step that left no error object still fails the build.
Error orFallback(ErrorSlot slot, const char* what) {
  if (slot) return std::move(*slot);
  return Error::posix(kPosixEINVAL, what);
}

// The record's "globals", made a dictionary when it is not one.
Value& globalsOf(Value& record) {
  Value* globals = record.find("globals");
  if (globals == nullptr || !globals->isDictionary())
    globals = &record.set("globals", Value::dictionary());
  return *globals;
}

Value& volumesOf(Value& record) {
  Value* volumes = record.find("volumes");
  if (volumes == nullptr || !volumes->isDictionary())
    volumes = &record.set("volumes", Value::dictionary());
  return *volumes;
}

bool startsWith(const std::string& s, std::string_view prefix) {
  return s.compare(0, prefix.size(), prefix) == 0;
}

// Logs `format` with the record as redactVornSecrets prints it, without
// copying the record (it holds every volume's configuration): the secret is
// masked in place for the line and put back.
void logRedacted(const char* format, Value& record) {
  std::optional<Value> topSecret, globalSecret;
  Value* globals = record.find("globals");
  if (Value* s = record.find("sharedSecret")) topSecret = std::exchange(*s, Value(kRedactedSecret));
  if (Value* s = globals ? globals->find("sharedSecret") : nullptr) {
    globalSecret = std::exchange(*s, Value(kRedactedSecret));
  }
  log(format, record);
  if (topSecret) *record.find("sharedSecret") = std::move(*topSecret);
  if (globalSecret) *globals->find("sharedSecret") = std::move(*globalSecret);
}

// Creates the SAN's records with the text of ".auth_secret" as the secret.
std::optional<Error> createRecords(DirectoryNode& node, const Value& local) {
  const std::optional<std::string> secret = read_vorn_cfg_file(".auth_secret");
  ErrorSlot slot;
  if (createNewVornConfigForConfig(node, local, secret ? &*secret : nullptr, &slot) != 0) {
    return orFallback(std::move(slot), "Unable to create the SAN configuration");
  }
  return std::nullopt;
}

// The "uuid" file names an earlier UUID of this controller: it becomes an
// alias, and its controller entry and volume listings go. Returns whether the
// file exists. A new alias publishes the record: the file is consumed by
// this build, so an alias left unsaved would be lost.
bool applyAliasFile(Value& record, const std::string& ourUUID, int* flags) {
  const std::optional<std::string> aliasText = read_vorn_cfg_file("uuid");
  if (!aliasText) return false;
  const std::optional<UUIDBytes> alias = parseUUID(*aliasText);
  if (!alias) return true;
  const std::string aliasUUID = formatUUID(*alias);
  if (aliasUUID == ourUUID) return true;
  volumesOf(record);
  Value& globals = globalsOf(record);
  Value& volumes = volumesOf(record);
  Value* aliases = globals.find("aliasControllers");
  if (aliases == nullptr || !aliases->isArray())
    aliases = &globals.set("aliasControllers", Value::array());
  aliases->asArray()->push_back(Value(aliasUUID));
  deleteControllerByUUID(globals, volumes, aliasUUID);
  *flags |= kBuildPublish;
  return true;
}

// The body of the build; returns the error that fails it, if any.
std::optional<Error> build(const std::string* nodeName, const std::string* userName,
                           const std::string* password) {
  Env& env = currentEnv();
  log("buildSanConfig started");
  std::optional<Value> local = loadConfigPlist();
  if (!local) {
    const int e = errno != 0 ? errno : EINVAL;
    return ownError(Error::fromErrno(e, "Unable to open config.plist"));
  }
  if (!configPlistIsController(*local)) {
    return ownError(Error::posix(kPosixEINVAL, "System is not a controller"));
  }
  const std::string* state = local->findString("sanState");
  if (state != nullptr && *state == "dead") return Error::vorn(kVornSanDeleted);
  const bool wasInitializing = state != nullptr && *state == "initializing";
  if (wasInitializing) local->set("sanState", "active");

  log("buildSanConfig about to check LDAP");
  const std::string node = nodeName ? *nodeName : std::string();
  // Every directory step gets an empty slot of its own, so that a step that
  // fails without an error object never reports an earlier step's error.
  ErrorSlot slot;
  std::unique_ptr<DirectoryNode> directory = env.openDirectoryNode("/LDAPv3/" + node, &slot);
  if (!directory) return orFallback(std::move(slot), "Unable to open the directory node");
  if (userName != nullptr && !userName->empty() && !startsWith(node, "ldapi:")) {
    slot.reset();
    if (!directory->setCredentials(kRecordTypeUsers, *userName, password ? *password : "", &slot)) {
      return orFallback(std::move(slot), "Unable to authenticate to the directory");
    }
  }

  slot.reset();
  std::optional<Value> record = getVornConfigForConfig(*directory, *local, &slot);
  if (!record) {
    log("buildSanConfig: getVornConfig said nothing");
    if (!slot || slot->domain() != kVornErrorDomain) {
      return orFallback(std::move(slot), "Unable to read the SAN configuration");
    }
    if (std::optional<Error> error = createRecords(*directory, *local)) return error;
  }
  if (record) {
    logRedacted("buildSanConfig step 4 with %@", *record);
  } else {
    log("buildSanConfig step 4 with %@", std::optional<Value>());
  }

  const std::string* sanNameValue = local->findString("sanName");
  const std::string sanName = sanNameValue ? *sanNameValue : std::string();

  std::optional<std::string> address;
  if (const std::string* vornAddr = local->findString("vornAddr")) {
    address = *vornAddr;
  } else {
    const std::string* network = local->findString("metadataNetwork");
    if (network != nullptr) address = metadataAddressForNetwork(env, *network);
    if (address) {
      local->set("vornAddr", *address);
    } else {
      local->erase("vornAddr");
    }
    local->erase("metadataNetwork");
  }
  if (!address) return ownError(Error::posix(kPosixEINVAL, "Unable to determine Vorn IP address"));

  int flags = 0;
  bool startNew = !record;
  if (record) {
    const Value& fetchedGlobals = globalsOf(*record);
    const std::string* fetchedState = fetchedGlobals.findString("sanState");
    if (wasInitializing && fetchedState != nullptr && *fetchedState == "dead") {
      log("About to cul old SAN config");
      slot.reset();
      if (culVornConfig(*directory, &sanName, &slot) != 0) {
        return orFallback(std::move(slot), "Unable to remove the old SAN configuration");
      }
      if (std::optional<Error> error = createRecords(*directory, *local)) return error;
      startNew = true;
    } else if (fetchedGlobals.find("sanName") == nullptr &&
               fetchedGlobals.find("sanUUID") == nullptr) {
      // Records created by an earlier build that failed before its first
      // save: fill them like new ones instead of refusing them forever.
      startNew = true;
    } else {
      const Value* localName = local->find("sanName");
      const Value* localUUID = local->find("sanUUID");
      const Value* recordName = fetchedGlobals.find("sanName");
      const Value* recordUUID = fetchedGlobals.find("sanUUID");
      if (!recordName || !localName || !(*recordName == *localName)) {
        return Error::vorn(kVornSanNameMismatch);
      }
      if (!recordUUID || !localUUID || !(*recordUUID == *localUUID)) {
        return Error::vorn(kVornSanUuidMismatch);
      }
    }
  }
  if (startNew) {
    record = newVornConfig();
    log("New config time");
    Value& globals = globalsOf(*record);
    if (const Value* v = local->find("sanName")) globals.set("sanName", *v);
    if (const Value* v = local->find("sanUUID")) globals.set("sanUUID", *v);
    globals.set("sanState", "active");
    flags = kBuildPublish;
  }
  // Both made present first: adding one to the record would move the other.
  volumesOf(*record);
  Value& globals = globalsOf(*record);
  Value& volumes = volumesOf(*record);

  std::uint8_t copied = 0;
  for (const char* key : kPublishedKeys)
    copyValue(globals.asDictionary(), *local->asDictionary(), key, &copied);
  update_from_file(globals.asDictionary(), ".auth_secret", "sharedSecret", &copied);
  update_from_file(globals.asDictionary(), "fsports", "fsports", &copied);
  if (copied & 1) flags |= kBuildPublish;

  const Value* previousControllers = globals.find("controllers");
  Value table = previousControllers && previousControllers->isDictionary() ? *previousControllers
                                                                           : Value::dictionary();
  const bool hadControllers = previousControllers != nullptr;
  const Value before = hadControllers ? *previousControllers : Value();
  if (const Value* computers = local->find("computers")) {
    const Dictionary found = migrateComputersToControllers(*computers, read_fsnameservers(nullptr),
                                                           globals.findArray("aliasControllers"));
    log("foundControllers %@", Value(found));
    for (const auto& [uuid, entry] : found) table.set(uuid, entry);
  }

  const std::string& ourUUID = getOurUUID();
  if (!table.find(ourUUID)) {
    flags |= kBuildNewController;
    log("We are a new controller inside of buildGlobalConfig");
    globals.set("certSetRevision", newUUIDString(env));
  }
  Value ourEntry = Value::dictionary();
  ourEntry.set("hostName", getLegacyHostname());
  ourEntry.set("IPAddress", *address);
  table.set(ourUUID, std::move(ourEntry));
  if (!hadControllers || !(table == before)) {
    globals.set("controllers", table);
    flags |= kBuildPublish;
  }

  const Dictionary addressMap = calculateMachineIPMap(table);
  Value nameServers(read_fsnameservers(&addressMap));
  const Value* publishedNameServers = globals.find("fsnameservers");
  if (!publishedNameServers || !(*publishedNameServers == nameServers)) {
    globals.set("fsnameservers", std::move(nameServers));
    flags |= kBuildPublish;
  }

  buildVolumeConfig(volumes, &flags);

  const bool hadAliasFile = applyAliasFile(*record, ourUUID, &flags);

  logRedacted("buildSanConfig saving config %@", *record);
  slot.reset();
  if (flags != 0 && saveVornConfig(*directory, *record, &sanName, true, &slot) != 0) {
    return orFallback(std::move(slot), "Unable to save the SAN configuration");
  }
  // The "uuid" file is consumed only once the record that carries the alias
  // is published; a failed save leaves it for the next build.
  if (hadAliasFile) env.removeFile(std::string(kVornDirectory) + "uuid");
  if (std::optional<std::string> revision = buildRevisionStringFromConfig(*record)) {
    local->set("sanRevision", *revision);
  }
  saveConfigPlist(*local);
  return std::nullopt;
}

}  // namespace

int buildSanConfig(const std::string* nodeName, const std::string* userName,
                   const std::string* password, ErrorSlot* error) {
  std::optional<Error> failure = build(nodeName, userName, password);
  if (!failure) return 0;
  setError(error, *failure);
  log("buildSanConfig returning error %@", *failure);
  const int code = failure->status();
  return code != 0 ? code : 1;
}

int buildSanConfigCF(const std::string* nodeName, const std::string* userName,
                     const std::string* password, ErrorSlot* error) {
  return buildSanConfig(nodeName, userName, password, error);
}

void deleteControllerByUUID(Value& globals, Value& volumes, const std::string& uuid) {
  if (Value* controllers = globals.find("controllers")) controllers->erase(uuid);
  Dictionary* entries = volumes.asDictionary();
  if (entries == nullptr) return;
  for (auto& [name, entry] : *entries) {
    Array* list = entry.findArray("controllers");
    if (list == nullptr) continue;
    std::erase_if(*list, [&](const Value& v) {
      const std::string* s = v.asString();
      return s && *s == uuid;
    });
  }
}

}  // namespace kolt

KOLT_C_BEGIN

int buildSanConfigC(const char* nodeName, const char* userName, const char* password,
                    char** message) {
  std::optional<std::string> node, user, pass;
  if (nodeName) node = nodeName;
  if (userName) user = userName;
  if (password) pass = password;
  kolt::ErrorSlot error;
  const int status = kolt::buildSanConfig(node ? &*node : nullptr, user ? &*user : nullptr,
                                          pass ? &*pass : nullptr, &error);
  if (message != nullptr) {
    *message = status != 0 && error ? ::strdup(error->textForCaller().c_str()) : nullptr;
  }
  return status;
}

KOLT_C_END
