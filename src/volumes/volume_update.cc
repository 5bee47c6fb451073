// updateFromVolumeConfig: the local ".cfgp" files, fsmlist and volume starts
// from a "volumes" dictionary.
#include "volumes/volume_update.h"

#include "config/tool_paths.h"

#include <algorithm>
#include <cmath>
#include <map>
#include <set>

#include "config/hosted_volume_list.h"
#include "config/tool_paths.h"
#include "kolt/constants.h"
#include "kolt/controller_helpers.h"
#include "kolt/env.h"
#include "kolt/local_config.h"
#include "kolt/log.h"
#include "volumes/volume_names.h"

namespace kolt {
namespace {

// Dates further than this from 2001 cannot be a file's date.
constexpr double kLatestUsableDate = 1e12;

struct LocalCfgpFiles {
  std::map<std::string, double> dates;  // volume name to the file's date
  std::set<std::string> stale;          // no keep-or-remove decision yet
};

std::string cfgpPath(const std::string& volume) {
  return std::string(kVornDirectory) + volume + "." + cfgpSuffix;
}

std::string fileURL(const std::string& path) {
  return "file://" + path;
}

bool endsWith(const std::string& text, std::string_view suffix) {
  return text.size() >= suffix.size() &&
         text.compare(text.size() - suffix.size(), suffix.size(), suffix) == 0;
}

// Gathers the ".cfgp" files of the Vorn directory. A failing scan is logged
// and ends early; what it gathered stands.
LocalCfgpFiles scanCfgpFiles(Env& env) {
  LocalCfgpFiles found;
  std::string directory;
  int rc = env.resolvePath(kVornDirectory, &directory);
  if (rc != 0) {
    NError("Error got error '%@' for url '%@'", Error::fromErrno(rc), fileURL(kVornDirectory));
    return found;
  }
  std::vector<DirectoryEntry> entries;
  rc = env.listDirectory(directory, &entries);
  const std::string suffix = std::string(".") + cfgpSuffix;
  for (const DirectoryEntry& entry : entries) {
    if (!endsWith(entry.name, suffix)) continue;
    const std::string volume = entry.name.substr(0, entry.name.find('.'));
    found.dates[volume] = entry.modificationTime;
    found.stale.insert(volume);
  }
  if (rc != 0) {
    NError("Error got error '%@' for url '%@'", Error::fromErrno(rc), fileURL(directory));
  }
  return found;
}

bool isHostedHere(const Value& entry, const std::string& ourUUID) {
  const Array* controllers = entry.findArray(controllersKey);
  if (controllers == nullptr) return false;
  return std::any_of(controllers->begin(), controllers->end(), [&](const Value& v) {
    const std::string* s = v.asString();
    return s != nullptr && *s == ourUUID;
  });
}

// The whole second of the entry's "mtime": dates that went through XML carry
// whole seconds, so files get and are compared at that precision.
std::optional<double> wholeSecondMtime(const Value& entry) {
  const Value* mtime = entry.find(mtimeKey);
  const Date* date = mtime ? mtime->asDate() : nullptr;
  if (date == nullptr || !std::isfinite(date->seconds) ||
      std::fabs(date->seconds) > kLatestUsableDate) {
    return std::nullopt;
  }
  return std::floor(date->seconds);
}

void writeCfgp(Env& env, const std::string& volume, const Value& entry, double mtime) {
  const Value* config = entry.find(configKey);
  if (config == nullptr) return;
  const std::optional<std::string> xml = writeXmlPropertyList(*config);
  if (!xml) return;
  const std::string path = cfgpPath(volume);
  // Date only a file that was written: an old file with a new date would
  // pass for current and never be rewritten.
  if (writeFileAtomically(env, path, *xml, 0644) == 0) env.setModificationTime(path, mtime);
}

Value printableSet(const std::set<std::string>& names) {
  Array array;
  for (const std::string& name : names) array.emplace_back(name);
  return Value(std::move(array));
}

void startVolume(Env& env, const std::string& volume) {
  ProcessSpec spec;
  spec.executable = std::string(kToolDirectory) + kQmadminName;
  spec.arguments = {"-e", "start " + volume};
  spec.standardInput = StreamSpec::null();
  spec.standardOutput = StreamSpec::appendTo("/var/run/vorn_qmadmin_" + volume + ".log");
  spec.standardError = StreamSpec::appendTo("/var/run/vorn_qmadmin_" + volume + ".error");
  ProcessResult result;
  env.runProcess(spec, /*wait=*/false, &result);
}

}  // namespace

void updateFromVolumeConfig(const Value& volumes) {
  Env& env = currentEnv();
  LocalCfgpFiles local = scanCfgpFiles(env);
  const std::string& ourUUID = getOurUUID();
  std::string fsmlistText;
  std::set<std::string> needStart;

  std::set<std::string> hostedBefore;
  for (const Value& name : getHostedVolumeList()) {
    if (const std::string* s = name.asString()) hostedBefore.insert(*s);
  }
  log("Hosted set is %@", printableSet(hostedBefore));

  const Dictionary noVolumes;
  const Dictionary& table = volumes.asDictionary() ? *volumes.asDictionary() : noVolumes;
  for (const auto& [volume, entry] : table) {
    if (!isUsableVolumeName(volume)) {
      NError("Volume name '%@' cannot name a file. Ignoring", printableVolumeName(volume));
      continue;
    }
    const auto localDate = local.dates.find(volume);
    if (isHostedHere(entry, ourUUID)) {
      const std::optional<double> mtime = wholeSecondMtime(entry);
      if (!mtime) {
        NError("LDAP config for volume '%@' lacks mtime. Ignoring", volume);
        continue;
      }
      fsmlistText += hostedVolumeLine(volume);
      local.stale.erase(volume);
      if (localDate == local.dates.end() || std::floor(localDate->second) != *mtime) {
        writeCfgp(env, volume, entry, *mtime);
      }
    } else if (localDate != local.dates.end()) {
      env.removeFile(cfgpPath(volume));
      local.stale.erase(volume);
    }
    if (hostedBefore.count(volume) == 0) needStart.insert(volume);
  }

  for (const std::string& volume : local.stale) {
    // Hidden or oddly named files are no usable volume's configuration, and
    // a skipped volume's file stays.
    if (isUsableVolumeName(volume)) env.removeFile(cfgpPath(volume));
  }

  if (!fsmlistText.empty()) {
    writeFileAtomically(env, kFsmlistPath, fsmlistText, 0644);
  } else {
    env.removeFile(kFsmlistPath);
  }

  log("needStart is %@", printableSet(needStart));
  for (const std::string& volume : needStart) startVolume(env, volume);
}

}  // namespace kolt
