// The change check: validate, choose a directory node, fetch, compare the
// revision; the apply step lives in change_apply.cc.
#include "kolt/change_check.h"

#include "config/fetched_configuration.h"
#include "config/tool_paths.h"
#include "kolt/controller_helpers.h"
#include "kolt/directory.h"
#include "kolt/directory_records.h"
#include "kolt/env.h"
#include "kolt/error.h"
#include "kolt/local_config.h"
#include "kolt/log.h"
#include "kolt/volume_files.h"
#include "sync/change_apply.h"
#include "volumes/key_operations.h"

namespace kolt {
namespace {

constexpr const char* kLocalDirectoryURL = "ldapi://%2Fvar%2Frun%2Fldapi";

// "sanConfigURLs" as a list: an array's strings, or one string.
std::vector<std::string> urlList(const Value* urls) {
  std::vector<std::string> out;
  if (urls == nullptr) return out;
  if (const std::string* one = urls->asString()) {
    out.push_back(*one);
  } else if (const Array* many = urls->asArray()) {
    for (const Value& u : *many) {
      if (const std::string* s = u.asString()) out.push_back(*s);
    }
  }
  return out;
}

// The first node that accepts the SAN's user and secret; failing that, the
// last node that opened (unauthenticated). Errors land in `slot`.
struct NodeChoice {
  std::unique_ptr<DirectoryNode> node;
  bool lastOpened = false;
};

NodeChoice chooseNode(const std::vector<std::string>& urls, const std::string& user,
                      const std::string& secret, ErrorSlot* slot) {
  NodeChoice choice;
  for (const std::string& url : urls) {
    std::unique_ptr<DirectoryNode> node = currentEnv().openDirectoryNode("/LDAPv3/" + url, slot);
    if (!node) {
      log("Unable to contact node %@", url);
      choice.node.reset();
      choice.lastOpened = false;
      continue;
    }
    if (node->setCredentials(kRecordTypeUsers, user, secret, slot)) {
      choice.node = std::move(node);
      choice.lastOpened = true;
      return choice;
    }
    log("Set Cred returned %@", *slot);
    choice.node = std::move(node);
    choice.lastOpened = true;
  }
  return choice;
}

int codeOf(const ErrorSlot& slot) {
  return slot ? slot->status() : 0;
}

}  // namespace

int checkSanConfigChange(std::uint32_t* changeMask, Value* newConfig) {
  return checkSanConfigChangeWithServer(nullptr, changeMask, newConfig);
}

int checkSanConfigChangeWithServer(const std::string* server, std::uint32_t* changeMask,
                                   Value* newConfig) {
  if (changeMask == nullptr) return Error::posix(kPosixEFAULT).status();
  *changeMask = 0;

  std::optional<std::string> secret;
  if (newConfig != nullptr) {
    if (newConfig->findString("sanName") == nullptr)
      return Error::vorn(kVornSanNameMissing).status();
    if (!newConfig->find("sanConfigURLs") && !newConfig->find("fsnameservers")) {
      return Error::vorn(kVornSanServerMissing).status();
    }
    newConfig->set("configIsNew", "");
    if (const std::string* s = newConfig->findString("sharedSecret")) secret = *s;
    *changeMask = kChangeNewConfig;
  }

  std::optional<Value> loaded = loadConfigPlist();
  log("checkSanConfigChange passed newConfig %@\nand old config\n%@",
      newConfig ? std::optional<Value>(redactVornSecrets(*newConfig)) : std::nullopt,
      loaded ? std::optional<Value>(redactVornSecrets(*loaded)) : std::nullopt);

  if (!secret) secret = read_vorn_cfg_file(".auth_secret");

  ApplyContext apply;
  apply.newConfig = newConfig;
  apply.loaded = loaded ? &*loaded : nullptr;
  apply.changeMask = changeMask;

  if (newConfig != nullptr && !newConfig->find("sanConfigURLs")) {
    // No directory: the document serves as its own globals.
    apply.working = newConfig;
    apply.globals = newConfig;
    apply.volumes = nullptr;
    apply.usedNode = false;
    return applyConfiguration(apply);
  }

  Value* working = newConfig;
  if (working == nullptr) {
    if (!loaded || !loaded->find("sanConfigURLs")) return 0;
    // The directory user is named after the SAN: without a name there is
    // nobody to log in as, and no directory is contacted.
    if (loaded->findString("sanName") == nullptr) return Error::vorn(kVornSanNameMissing).status();
    working = &*loaded;
  }

  bool actsAsController = loaded && configPlistIsController(*loaded);
  if (newConfig != nullptr) {
    const Dictionary nothing;
    const Dictionary& source = loaded ? *loaded->asDictionary() : nothing;
    std::uint8_t ignored = 0;
    for (const char* key : {"vornAddr", "migratedVersion", "notifications"}) {
      copyValue(newConfig->asDictionary(), source, key, &ignored);
    }
    if (configPlistIsController(*newConfig)) actsAsController = true;
  }

  std::vector<std::string> urls = urlList(working->find("sanConfigURLs"));
  if (actsAsController) urls.insert(urls.begin(), kLocalDirectoryURL);
  if (server != nullptr) urls.insert(urls.begin(), "ldaps://" + *server);

  const std::string user = ldapSanUserNameForName(*working->findString("sanName"));
  ErrorSlot slot;
  NodeChoice choice = chooseNode(urls, user, secret.value_or(std::string()), &slot);
  if (!choice.node) {
    log("NodeChecking hated all of it");
    return codeOf(slot);
  }

  log("About to get new config");
  std::optional<FetchedConfiguration> record =
      FetchedConfiguration::fetch(*choice.node, working->findString("sanName"), &slot);
  if (!record) return codeOf(slot);

  apply.working = working;
  const std::string* applied = working->findString("sanRevision");
  if (applied != nullptr) {
    // Most checks end here: the revision is read from the globals alone,
    // and the volumes, which make nearly all of a large configuration, are
    // neither parsed nor logged.
    if (std::optional<Value> globals = record->peekGlobals()) {
      const std::string* revision = globals->findString("revision");
      if (revision != nullptr && *revision == *applied) {
        Value readPart;
        readPart.set("globals", std::move(*globals));
        log("Got config %@", redactVornSecrets(readPart));
        if (newConfig == nullptr) return 0;
        return saveUnchangedJoin(apply);
      }
    }
  }
  std::optional<Value> fetched = record->parse(&slot);
  if (!fetched) return codeOf(slot);
  log("Got config %@", redactVornSecrets(*fetched));

  const std::optional<std::string> revision = buildRevisionStringFromConfig(*fetched);
  if (applied != nullptr && revision && *applied == *revision) {
    if (newConfig == nullptr) return 0;
    return saveUnchangedJoin(apply);
  }
  if (revision) {
    working->set("sanRevision", *revision);
  } else {
    working->erase("sanRevision");
  }

  Value* globals = fetched->find("globals");
  if (globals == nullptr || !globals->isDictionary())
    globals = &fetched->set("globals", Value::dictionary());
  apply.globals = globals;
  apply.volumes = fetched->find("volumes");
  apply.usedNode = true;
  return applyConfiguration(apply);
}

void startVornctlToUnloadProfile() {
  ProcessSpec spec;
  spec.executable = std::string(kToolDirectory) + "vornctl";
  spec.arguments = {"unloadProfile"};
  ProcessResult result;
  currentEnv().runProcess(spec, /*wait=*/false, &result);
  log("vornctl unloadProfile launched");
}

}  // namespace kolt
