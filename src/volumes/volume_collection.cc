#include "volumes/volume_collection.h"

#include <cmath>
#include <map>
#include <set>

#include "config/tool_paths.h"
#include "config/utf8_text.h"
#include "config/uuid_text.h"
#include "kolt/constants.h"
#include "kolt/controller_helpers.h"
#include "kolt/env.h"
#include "kolt/error.h"
#include "kolt/local_config.h"
#include "kolt/log.h"
#include "volumes/volume_update.h"

namespace kolt {
namespace {

// What the scan found of one hosted volume.
struct FoundVolume {
  std::optional<double> cfg, cfgx, cfgp;  // modification dates of the files found
  std::optional<Value> volData;           // the parsed configuration
};

using FoundTable = std::map<std::string, FoundVolume>;

std::string volumePath(const std::string& volume, const char* suffix) {
  // The double slash is the system's own path format for these files.
  return std::string(kVornDirectory) + "/" + volume + "." + suffix;
}

bool endsWith(const std::string& s, std::string_view suffix) {
  return s.size() >= suffix.size() &&
         s.compare(s.size() - suffix.size(), suffix.size(), suffix) == 0;
}

// Step 1: the volume files of hosted volumes, with their dates. Nothing when
// the directory cannot be listed whole.
std::optional<FoundTable> scanVolumeFiles(Env& env) {
  FoundTable table;
  std::set<std::string> hosted;
  for (const Value& name : getHostedVolumeList()) {
    if (const std::string* s = name.asString()) hosted.insert(*s);
  }
  std::string directory;
  int rc = env.resolvePath(kVornDirectory, &directory);
  std::vector<DirectoryEntry> entries;
  if (rc == 0) rc = env.listDirectory(directory, &entries);
  for (const DirectoryEntry& entry : entries) {
    const char* kind = endsWith(entry.name, ".cfg")    ? cfgSuffix
                       : endsWith(entry.name, ".cfgx") ? cfgxSuffix
                       : endsWith(entry.name, ".cfgp") ? cfgpSuffix
                                                       : nullptr;
    if (kind == nullptr) continue;
    const std::string volume = entry.name.substr(0, entry.name.find('.'));
    if (hosted.count(volume) == 0) {
      log("Ignoring extraneous volume config %@.%@", volume, kind);
      continue;
    }
    FoundVolume& found = table[volume];
    if (kind == cfgSuffix) {
      found.cfg = entry.modificationTime;
    } else if (kind == cfgxSuffix) {
      found.cfgx = entry.modificationTime;
    } else {
      found.cfgp = entry.modificationTime;
    }
  }
  if (rc != 0) {
    log("Error got error '%@' for url '%@'", Error::fromErrno(rc),
        "file://" + std::string(kVornDirectory));
    return std::nullopt;
  }
  return table;
}

// Replaces `path` with `contents` dated `date`, in one step: the new file is
// written and dated under a temporary name (which the scan passes over), then
// renamed over `path`. On failure `path` is left as it was.
std::optional<Error> replaceDated(Env& env, const std::string& path, const std::string& contents,
                                  double date) {
  const std::string temporary = path + ".kolt-new-" + newUUIDString(env);
  int rc = writeFileAtomically(env, temporary, contents, 0644);
  std::string failed = "Unable to write " + path;
  if (rc == 0) {
    rc = env.setModificationTime(temporary, date);
    if (rc != 0) failed = "Unable to date " + path;
  }
  if (rc == 0) rc = env.renameFile(temporary, path);
  if (rc != 0) {
    env.removeFile(temporary);
    return Error::fromErrno(rc, failed);
  }
  env.syncDirectory(parentDirectory(path));
  return std::nullopt;
}

// Step 2 for one volume: converts its newer source into a ".cfgp". Returns
// the error that ends the conversion pass, if any.
std::optional<Error> convertVolume(Env& env, const std::string& volume, FoundVolume& found) {
  if (!found.cfg && !found.cfgx) return std::nullopt;
  const bool fromCfg = found.cfg && (!found.cfgx || *found.cfg >= *found.cfgx);
  const double sourceDate = fromCfg ? *found.cfg : *found.cfgx;
  // A ".cfgp" made from this source carries the source's very date. The
  // comparison is exact: an edit made within the same second as the last
  // conversion is still converted.
  if (found.cfgp && *found.cfgp >= sourceDate) return std::nullopt;

  ProcessSpec spec;
  spec.executable = std::string(kToolDirectory) + "pdcfgconvert";
  spec.arguments = {"-n", volume, "-F", "plist"};
  if (fromCfg) spec.arguments.push_back("-A");
  spec.arguments.push_back(volumePath(volume, fromCfg ? cfgSuffix : cfgxSuffix));
  spec.standardOutput = StreamSpec::pipe();
  const std::string failure = "Error creating cfgp for volume " + volume;
  ProcessResult result;
  if (const int rc = env.runProcess(spec, /*wait=*/true, &result); rc != 0) {
    return Error::fromErrno(rc, failure);
  }
  if (result.exitStatus != 0) return Error::posix(result.exitStatus, failure);
  if (!utf8::isValid(result.output)) return std::nullopt;  // passed over silently

  // Parse before writing, so that unreadable output never replaces a good
  // ".cfgp".
  ErrorSlot parseError;
  std::optional<Value> parsed = parsePropertyList(result.output, &parseError);
  if (!parsed) {
    return Error::vorn(kVornVolumeConfigUnreadable, parseError && parseError->description()
                                                        ? *parseError->description()
                                                        : "unreadable converter output");
  }
  if (std::optional<Error> error =
          replaceDated(env, volumePath(volume, cfgpSuffix), result.output, sourceDate)) {
    return error;
  }
  found.volData = std::move(parsed);
  found.cfgp = sourceDate;
  if (fromCfg) {
    env.removeFile(volumePath(volume, cfgSuffix));
    env.removeFile(std::string(kVornDirectory) + "/" + volume + "-auxdata.plist");
  } else {
    env.removeFile(volumePath(volume, cfgxSuffix));
  }
  return std::nullopt;
}

// Step 3, done in the merge for the volumes whose entry needs it: the
// ".cfgp" content of a volume that was not converted.
void loadVolume(Env& env, const std::string& volume, FoundVolume& found) {
  if (found.volData) return;
  std::string bytes;
  if (env.readFile(volumePath(volume, cfgpSuffix), &bytes) != 0) return;
  // An unreadable ".cfgp" leaves the volume without data; the merge passes
  // it over.
  found.volData = parsePropertyList(bytes);
}

bool containsString(const Array& a, const std::string& s) {
  for (const Value& v : a) {
    if (const std::string* t = v.asString(); t && *t == s) return true;
  }
  return false;
}

Array& controllersOf(Value& entry) {
  Value* list = entry.find(controllersKey);
  if (list == nullptr || !list->isArray()) list = &entry.set(controllersKey, Value::array());
  return *list->asArray();
}

Value newVolumeEntry(const FoundVolume& found, const std::string& ourUUID) {
  Value entry = Value::dictionary();
  entry.set(configKey, *found.volData);
  entry.set(mtimeKey, Value::date(*found.cfgp));
  entry.set(controllersKey, Array{Value(ourUUID)});
  return entry;
}

}  // namespace

bool sameWholeSecond(double a, double b) {
  return std::floor(a) == std::floor(b);
}

void buildVolumeConfig(Value& volumes, int* changeFlags) {
  Env& env = currentEnv();
  if (!volumes.isDictionary()) volumes = Value::dictionary();
  // A listing cut short would make every volume it missed look released by
  // this controller; the record keeps its volumes instead.
  std::optional<FoundTable> scanned = scanVolumeFiles(env);
  if (!scanned) return;
  FoundTable& table = *scanned;

  for (auto& [volume, found] : table) {
    if (std::optional<Error> error = convertVolume(env, volume, found)) {
      // The record keeps its volumes as they were; the line tells the
      // administrator why an edit was not published.
      log("buildVolumeConfig: %@", *error);
      return;
    }
  }
  std::set<std::string> unseen;
  for (const auto& [name, entry] : *volumes.asDictionary()) unseen.insert(name);
  const std::string& ourUUID = getOurUUID();
  bool changed = false;

  for (auto& [volume, found] : table) {
    const bool wasListed = unseen.erase(volume) > 0;
    Value* entry = wasListed ? volumes.find(volume) : nullptr;
    if (entry != nullptr && !entry->isDictionary()) entry = nullptr;
    bool current = false, hosted = false;
    if (entry != nullptr && found.cfgp) {
      const Value* mtime = entry->find(mtimeKey);
      current = mtime && mtime->asDate() && sameWholeSecond(mtime->asDate()->seconds, *found.cfgp);
      const Array* controllers = entry->findArray(controllersKey);
      hosted = controllers && containsString(*controllers, ourUUID);
      // A current entry that names this controller needs nothing from the
      // file, which is then not even read: the common case of a build.
      if (current && hosted) continue;
    }
    loadVolume(env, volume, found);
    if (!found.volData || !found.cfgp) continue;  // nothing readable: the entry stays as it was
    changed = true;
    if (entry == nullptr) {
      volumes.set(volume, newVolumeEntry(found, ourUUID));
      continue;
    }
    if (!hosted) controllersOf(*entry).push_back(Value(ourUUID));
    if (!current) {
      entry->set(configKey, std::move(*found.volData));
      entry->set(mtimeKey, Value::date(*found.cfgp));
    }
  }

  for (const std::string& volume : unseen) {
    Value* entry = volumes.find(volume);
    if (entry == nullptr || !entry->isDictionary()) continue;
    Array& controllers = controllersOf(*entry);
    if (*changeFlags & kBuildNewController) {
      controllers.push_back(Value(ourUUID));
    } else if (containsString(controllers, ourUUID)) {
      std::erase_if(controllers, [&](const Value& v) {
        const std::string* s = v.asString();
        return s && *s == ourUUID;
      });
      changed = true;
    }
  }

  if (changed) *changeFlags |= kBuildPublish;
  if (*changeFlags & kBuildNewController) updateFromVolumeConfig(volumes);
}

}  // namespace kolt
