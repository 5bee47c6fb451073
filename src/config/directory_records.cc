// Creating, reading, saving, destroying and removing a SAN's records.
#include "kolt/directory_records.h"

#include "config/fetched_configuration.h"
#include "config/uuid_text.h"
#include "kolt/controller_helpers.h"
#include "kolt/env.h"
#include "kolt/local_config.h"
#include "kolt/log.h"

namespace kolt {
namespace {

constexpr const char* kConfPrefix = "com.orvat.vorn.conf.";
constexpr const char* kAuthPrefix = "com.orvat.vorn.auth.";

struct LookUp {
  bool ok = false;                          // the query itself succeeded
  std::unique_ptr<DirectoryRecord> record;  // null when none was found
};

// Queries for the record named exactly `name`, asking for the configuration
// attribute and at most one result.
LookUp lookUpRecord(DirectoryNode& node, RecordType type, const std::string& name, ErrorSlot* slot) {
  LookUp result;
  auto records = node.queryRecords(type, name, Attribute::kXMLPlist, 1, slot);
  if (!records) return result;
  result.ok = true;
  if (!records->empty()) result.record = std::move(records->front());
  return result;
}

bool hasName(const std::string* sanName) { return sanName != nullptr && !sanName->empty(); }

}  // namespace

Value newVornConfig() {
  Value globals = Value::dictionary();
  globals.set("revision", kZeroUUID);
  globals.set("certSetRevision", kZeroUUID);
  globals.set("controllers", Value::dictionary());
  Value config = Value::dictionary();
  config.set("globals", std::move(globals));
  config.set("volumes", Value::dictionary());
  return config;
}

std::optional<Value> getVornConfig(DirectoryNode& node, const std::string* sanName,
                                   ErrorSlot* error) {
  std::optional<FetchedConfiguration> record = FetchedConfiguration::fetch(node, sanName, error);
  if (!record) return std::nullopt;
  return record->parse(error);
}

std::optional<Value> getVornConfigForConfig(DirectoryNode& node, const Value& document,
                                            ErrorSlot* error) {
  return getVornConfig(node, document.findString("sanName"), error);
}

int createNewVornConfig(DirectoryNode& node, const std::string* sanName,
                        const std::string* sharedSecret, ErrorSlot* error) {
  Value config = newVornConfig();
  if (sharedSecret != nullptr) config.findDictionary("globals")->set("sharedSecret", *sharedSecret);
  return doCreateOrSaveConfig(node, config, sanName, /*create=*/true, error);
}

int createNewVornConfigForConfig(DirectoryNode& node, const Value& document,
                                 const std::string* sharedSecret, ErrorSlot* error) {
  return createNewVornConfig(node, document.findString("sanName"), sharedSecret, error);
}

int saveVornConfig(DirectoryNode& node, Value& configuration, const std::string* sanName,
                   bool newRevision, ErrorSlot* error) {
  if (newRevision) {
    Value* globals = configuration.find("globals");
    if (globals == nullptr || !globals->isDictionary()) {
      globals = &configuration.set("globals", Value::dictionary());
    }
    globals->set("revision", newUUIDString(currentEnv()));
  }
  return doCreateOrSaveConfig(node, configuration, sanName, /*create=*/false, error);
}

int doCreateOrSaveConfig(DirectoryNode& node, const Value& configuration, const std::string* sanName,
                         bool create, ErrorSlot* error) {
  const Dictionary* globals = configuration.findDictionary("globals");
  if (sanName == nullptr && globals != nullptr) {
    const Value* fromGlobals = globals->find("sanName");
    sanName = fromGlobals ? fromGlobals->asString() : nullptr;
  }
  if (!hasName(sanName)) return 1;

  ErrorSlot writeError;
  std::optional<std::string> xml = writeXmlPropertyList(configuration, &writeError);
  if (!xml) {
    if (writeError) setError(error, std::move(*writeError));
    return 1;
  }

  ErrorSlot slot;
  if (!create) {
    LookUp found = lookUpRecord(node, RecordType::kGroups, ldapSanConfNameForName(*sanName), &slot);
    if (!found.ok) {
      if (slot) setError(error, std::move(*slot));
      return 1;
    }
    if (!found.record) {
      setError(error, Error::vorn(kVornNoConfiguration));
      return 1;
    }
    if (found.record->setValues(Attribute::kXMLPlist, {std::move(*xml)}, &slot)) {
      found.record->synchronize(&slot);
    }
    if (error != nullptr) *error = slot;
    return slot ? 1 : 0;
  }

  // Creating: the user first (its password is the shared secret), then the
  // group holding the configuration, then the membership that lets the user
  // read it.
  std::unique_ptr<DirectoryRecord> user = node.createRecord(
      RecordType::kUsers, ldapSanUserNameForName(*sanName),
      {{Attribute::kFullName, {std::string(kAuthPrefix) + *sanName}}}, &slot);
  if (user) {
    user->synchronize(&slot);
  } else if (!slot) {
    slot = Error(std::string(kDirectoryErrorDomain), -1, "The user record was not created");
  }
  std::unique_ptr<DirectoryRecord> group;
  if (!slot) {
    const Value* secretValue = globals ? globals->find("sharedSecret") : nullptr;
    const std::string* secret = secretValue ? secretValue->asString() : nullptr;
    // Without a secret the user keeps no password and cannot authenticate;
    // asking the server to set "no password" could make it invent one.
    if (secret != nullptr && !user->changePassword(std::nullopt, *secret, &slot)) {
      log("ChangePassword failed with error %@", slot);
    }
  }
  if (!slot) {
    group = node.createRecord(RecordType::kGroups, ldapSanConfNameForName(*sanName),
                              {{Attribute::kXMLPlist, {std::move(*xml)}},
                               {Attribute::kFullName, {std::string(kConfPrefix) + *sanName}}},
                              &slot);
  }
  if (!slot) {
    user->synchronize(&slot);
    ErrorSlot groupSync;
    if (group) group->synchronize(&groupSync);
    if (!slot && groupSync) slot = std::move(groupSync);
    if (!slot && group) group->addMemberRecord(*user, &slot);
  }
  if (error != nullptr) *error = slot;
  return group && !slot ? 0 : 1;
}

int destroyVornConfig(DirectoryNode& node, const std::string* sanName, ErrorSlot* error) {
  if (!hasName(sanName)) return 1;
  ErrorSlot slot;
  int status = 1;
  std::optional<Value> config = getVornConfig(node, sanName, &slot);
  if (config && !slot) {
    config->set("volumes", Value::dictionary());
    Value* globals = config->find("globals");
    if (globals == nullptr || !globals->isDictionary()) {
      globals = &config->set("globals", Value::dictionary());
    }
    const Dictionary* controllers = globals->findDictionary("controllers");
    std::optional<std::string> firstController;
    if (controllers != nullptr && !controllers->empty()) firstController = controllers->begin()->first;
    globals->erase("controllers");
    globals->erase("fsnameservers");
    globals->set("sanState", "dead");
    // With no controller listed there is no one to name; an earlier
    // primaryZombie (a second destroy) stays, so that controller still knows.
    if (firstController) globals->set("primaryZombie", *firstController);
    status = saveVornConfig(node, *config, sanName, /*newRevision=*/true, &slot);
    // The configuration holds the shared secret: log only a redacted copy.
    log("destroyVornConfig: built %@ and rv %d", redactVornSecrets(*config), status);
  }
  if (error != nullptr) *error = slot;
  return slot ? 1 : status;
}

int culVornConfig(DirectoryNode& node, const std::string* sanName, ErrorSlot* error) {
  if (!hasName(sanName)) return 1;
  ErrorSlot slot;
  findAndZap(node, ldapSanUserNameForName(*sanName), /*isGroup=*/false, &slot);
  ErrorSlot groupError;
  findAndZap(node, ldapSanConfNameForName(*sanName), /*isGroup=*/true, &groupError);
  if (!slot && groupError) slot = std::move(groupError);
  if (error != nullptr) *error = slot;
  return slot ? 1 : 0;
}

bool findAndZap(DirectoryNode& node, const std::string& recordName, bool isGroup, ErrorSlot* error) {
  LookUp found =
      lookUpRecord(node, isGroup ? RecordType::kGroups : RecordType::kUsers, recordName, error);
  if (!found.ok) return false;
  if (!found.record) {
    setError(error, Error::vorn(kVornNoConfiguration));
    return false;
  }
  return found.record->deleteRecord(error);
}

}  // namespace kolt
