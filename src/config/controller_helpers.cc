// Controller tables, the revision string, the host name and secret redaction.
#include "kolt/controller_helpers.h"

#include <algorithm>

#include "kolt/env.h"

namespace kolt {
namespace {

constexpr const char* kRedacted = "********";

bool arrayHoldsString(const Array& array, const std::string& text) {
  return std::any_of(array.begin(), array.end(), [&](const Value& v) {
    const std::string* s = v.asString();
    return s != nullptr && *s == text;
  });
}

void migrateComputer(const Value& computer, const Array& nameServerAddresses,
                     const Array* aliasControllers, Dictionary* result) {
  const std::string* uuid = computer.findString("uuid");
  const std::string* hostName = computer.findString("legacyHostName");
  const Array* addresses = computer.findArray("ipAddresses");
  if (uuid == nullptr || hostName == nullptr || addresses == nullptr) return;
  if (aliasControllers != nullptr && arrayHoldsString(*aliasControllers, *uuid)) return;
  for (const Value& address : *addresses) {
    const std::string* text = address.asString();
    if (text == nullptr || !arrayHoldsString(nameServerAddresses, *text)) continue;
    Dictionary entry;
    entry.set("IPAddress", *text);
    entry.set("hostName", *hostName);
    result->set(*uuid, Value(std::move(entry)));
  }
}

}  // namespace

Dictionary calculateMachineIPMap(const Value& controllers) {
  Dictionary map;
  const Dictionary* table = controllers.asDictionary();
  if (table == nullptr) return map;
  for (const auto& [uuid, entry] : *table) {
    const std::string* address = entry.findString("IPAddress");
    if (address != nullptr) map.set(*address, uuid);
  }
  return map;
}

Dictionary migrateComputersToControllers(const Value& computers, const Array& nameServerAddresses,
                                         const Array* aliasControllers) {
  Dictionary result;
  if (const Array* list = computers.asArray()) {
    for (const Value& computer : *list) {
      migrateComputer(computer, nameServerAddresses, aliasControllers, &result);
    }
  } else if (const Dictionary* byKey = computers.asDictionary()) {
    for (const auto& [key, computer] : *byKey) {
      migrateComputer(computer, nameServerAddresses, aliasControllers, &result);
    }
  }
  return result;
}

std::optional<std::string> buildRevisionStringFromConfig(const Value& configuration) {
  const Value* globals = configuration.find("globals");
  const std::string* revision = globals ? globals->findString("revision") : nullptr;
  if (revision == nullptr) return std::nullopt;
  return *revision;
}

std::string getLegacyHostname() {
  std::string name;
  if (currentEnv().hostName(&name) == 0 && !name.empty()) return name;
  return "localhost";
}

Value redactVornSecrets(const Value& document) {
  Value copy = document;
  if (!copy.isDictionary()) return copy;
  if (copy.find("sharedSecret") != nullptr) copy.set("sharedSecret", kRedacted);
  if (Value* globals = copy.find("globals")) {
    if (globals->find("sharedSecret") != nullptr) globals->set("sharedSecret", kRedacted);
  }
  return copy;
}

}  // namespace kolt
