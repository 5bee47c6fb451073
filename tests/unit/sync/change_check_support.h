// Shared by the change-check tests (in-memory directory and slapd): the
// published configuration and local documents they start from, the process
// recorder, and whole-sandbox file snapshots.
#ifndef KOLT_TESTS_UNIT_SYNC_CHANGE_CHECK_SUPPORT_H
#define KOLT_TESTS_UNIT_SYNC_CHANGE_CHECK_SUPPORT_H

#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "fixtures/memory_directory_env.h"
#include "fixtures/sandbox.h"
#include "kolt/directory.h"
#include "kolt/directory_records.h"
#include "kolt/local_config.h"
#include "kolt/plist.h"
#include "platform/env_wrapper.h"

namespace kolt::testing {

inline constexpr const char* kSanName = "Vorn SAN";
// Distinctive, so that a search of logs and files cannot miss it.
inline constexpr const char* kSecret = "Zq7-secret/of+the#SAN";
inline constexpr const char* kMemberUUID = "5A5A5A5A-1111-4222-8333-44444444CAFE";
inline constexpr const char* kControllerUUID = "AAAAAAAA-BBBB-4CCC-8DDD-EEEEEEEEEEEE";
inline constexpr const char* kRevision1 = "0F0F0F0F-0000-4000-8000-000000000001";
inline constexpr const char* kRevision2 = "0F0F0F0F-0000-4000-8000-000000000002";
inline constexpr const char* kCertSet1 = "CE000000-0000-4000-8000-000000000001";
inline constexpr const char* kVornDir = "/Library/Preferences/Vorn/";
inline constexpr double kVolumeMtime = 700000000;  // whole seconds, as dates come through XML

inline std::string vornFile(const std::string& name) {
  return std::string(kVornDir) + name;
}

inline Value stringArray(std::initializer_list<std::string> items) {
  Array array;
  for (const std::string& item : items) array.emplace_back(item);
  return Value(std::move(array));
}

inline Value controllerEntry(const std::string& hostName, const std::string& address) {
  Value entry;
  entry.set("hostName", hostName);
  entry.set("IPAddress", address);
  return entry;
}

inline Value volumeEntry(const std::string& hostUUID, const std::string& marker) {
  Value config;
  config.set("name", marker);
  config.set("stripeBreadth", Value::integer(16));
  Value entry;
  entry.set("config", std::move(config));
  entry.set("mtime", Value::date(kVolumeMtime));
  entry.set("controllers", stringArray({hostUUID}));
  return entry;
}

// A configuration as a controller publishes it: one controller (not this
// member) at 10.0.0.1, every copied key set, and two volumes, of which
// "Scratch" is hosted by the member.
inline Value publishedConfig(const Value& urls, const std::string& revision) {
  Value globals;
  globals.set("revision", revision);
  globals.set("certSetRevision", kZeroUUID);
  globals.set("sanName", kSanName);
  globals.set("sanUUID", "5A4E0000-0000-4000-8000-000000000000");
  globals.set("sanState", "active");
  globals.set("sanConfigURLs", urls);
  globals.set("sanAuthMethod", "auth_secret");
  globals.set("desiredSearchPolicy", Value::integer(2));
  globals.set("notifications", stringArray({"admin@example.test"}));
  globals.set("ownerEmail", "owner@example.test");
  globals.set("ownerName", "Owner");
  globals.set("sharedSecret", kSecret);
  globals.set("fsports", "FsmPortRange 50000-50100\n");
  Value controllers;
  controllers.set(kControllerUUID, controllerEntry("ctl1.example.test", "10.0.0.1"));
  globals.set("controllers", std::move(controllers));
  Value nameserver;
  nameserver.set("addr", "10.0.0.1");
  nameserver.set("uuid", kControllerUUID);
  Array nameservers;
  nameservers.push_back(std::move(nameserver));
  globals.set("fsnameservers", Value(std::move(nameservers)));
  Value volumes;
  volumes.set("Projects", volumeEntry(kControllerUUID, "projects"));
  volumes.set("Scratch", volumeEntry(kMemberUUID, "scratch"));
  Value config;
  config.set("globals", std::move(globals));
  config.set("volumes", std::move(volumes));
  return config;
}

inline Value& globalsOf(Value& config) {
  return *config.find("globals");
}

// A member's local document that names the SAN's directory.
inline Value memberDocument(const Value& urls, const char* role = "CLIENT",
                            const char* sanRevision = nullptr) {
  Value document;
  document.set("sanName", kSanName);
  document.set("sanConfigURLs", urls);
  if (role != nullptr) document.set("role", role);
  if (sanRevision != nullptr) document.set("sanRevision", sanRevision);
  return document;
}

// Creates the SAN's records on an administrator's node when they are
// missing, then stores `config` as it is (its revision included).
inline bool publish(DirectoryNode& adminNode, const Value& config, std::string* why = nullptr) {
  const std::string sanName = kSanName;
  const std::string secret = kSecret;
  ErrorSlot error;
  if (!getVornConfig(adminNode, &sanName, &error) && error && error->code() == 501) {
    error.reset();
    if (createNewVornConfig(adminNode, &sanName, &secret, &error) != 0) {
      if (why != nullptr) *why = error ? error->printed() : "create failed";
      return false;
    }
  }
  Value copy = config;
  if (saveVornConfig(adminNode, copy, &sanName, /*newRevision=*/false, &error) != 0) {
    if (why != nullptr) *why = error ? error->printed() : "save failed";
    return false;
  }
  return true;
}

// Records the processes it is asked to start (without starting them) and the
// directory nodes it opens.
class ProcessRecorder : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  int runProcess(const ProcessSpec& spec, bool wait, ProcessResult* result) override {
    std::string command = spec.executable.substr(spec.executable.rfind('/') + 1);
    for (const std::string& argument : spec.arguments) command += " " + argument;
    commands.push_back(command);
    specs.push_back(spec);
    waited.push_back(wait);
    result->pid = 4242;
    return 0;
  }
  std::unique_ptr<DirectoryNode> openDirectoryNode(const std::string& nodeName,
                                                   ErrorSlot* error) override {
    openedNodes.push_back(nodeName);
    return EnvWrapper::openDirectoryNode(nodeName, error);
  }
  int readFile(const std::string& path, std::string* contents) override {
    ++reads;
    return EnvWrapper::readFile(path, contents);
  }
  std::size_t countOf(const std::string& command) const {
    std::size_t n = 0;
    for (const std::string& c : commands) n += c == command;
    return n;
  }
  std::vector<std::string> commands;  // "<tool name> <arguments...>"
  std::vector<ProcessSpec> specs;
  std::vector<bool> waited;
  std::vector<std::string> openedNodes;
  int reads = 0;
};

// One member machine on the in-memory directory: its own sandbox root (so
// its own Env, host UUID and files), nodes served by the shared directory,
// processes recorded instead of started. Make env() current around calls.
class MemoryMachine {
 public:
  MemoryMachine(std::shared_ptr<MemoryDirectory> directory, const std::string& hostUUID)
      : memoryEnv_(&sandbox_.env(), std::move(directory)), recorder_(&memoryEnv_) {
    sandbox_.setHardwareUUID(hostUUID);
  }
  Sandbox& sandbox() { return sandbox_; }
  ProcessRecorder& processes() { return recorder_; }
  Env& env() { return recorder_; }

 private:
  Sandbox sandbox_;
  MemoryDirectoryEnv memoryEnv_;
  ProcessRecorder recorder_;
};

// A regular file of a sandbox.
struct FileState {
  std::string bytes;
  std::int64_t mtimeNanoseconds = 0;
  mode_t mode = 0;
};
// Regular files below a root, by path relative to it.
using FileSnapshot = std::map<std::string, FileState>;

inline FileSnapshot snapshotFiles(const std::string& root) {
  FileSnapshot snapshot;
  namespace fs = std::filesystem;
  for (const fs::directory_entry& entry : fs::recursive_directory_iterator(root)) {
    if (!entry.is_regular_file() || entry.is_symlink()) continue;
    struct stat st {};
    if (::stat(entry.path().c_str(), &st) != 0) continue;
    std::ifstream in(entry.path(), std::ios::binary);
    std::ostringstream bytes;
    bytes << in.rdbuf();
    snapshot[fs::relative(entry.path(), root).string()] = {
        bytes.str(), std::int64_t(st.st_mtim.tv_sec) * 1000000000 + st.st_mtim.tv_nsec,
        st.st_mode & 07777};
  }
  return snapshot;
}

// Files of the snapshot whose bytes contain `needle`.
inline std::vector<std::string> filesContaining(const FileSnapshot& snapshot,
                                                const std::string& needle) {
  std::vector<std::string> found;
  for (const auto& [path, state] : snapshot) {
    if (state.bytes.find(needle) != std::string::npos) found.push_back(path);
  }
  return found;
}

// Differences between two snapshots (bytes, modification time, mode), one
// line each; empty when equal.
inline std::vector<std::string> differences(const FileSnapshot& before, const FileSnapshot& after) {
  std::vector<std::string> out;
  for (const auto& [path, state] : before) {
    auto it = after.find(path);
    if (it == after.end()) {
      out.push_back("removed " + path);
    } else if (it->second.bytes != state.bytes) {
      out.push_back("rewritten " + path);
    } else if (it->second.mtimeNanoseconds != state.mtimeNanoseconds) {
      out.push_back("touched " + path);
    } else if (it->second.mode != state.mode) {
      out.push_back("mode changed " + path);
    }
  }
  for (const auto& [path, state] : after) {
    if (before.count(path) == 0) out.push_back("created " + path);
  }
  return out;
}

// Files of `now` that are neither as in `before` nor as in `after` (by
// bytes; a file may be absent only where it is absent in one of them).
inline std::vector<std::string> neitherOldNorNew(const FileSnapshot& before,
                                                 const FileSnapshot& after,
                                                 const FileSnapshot& now) {
  std::vector<std::string> out;
  std::set<std::string> paths;
  for (const auto* s : {&before, &after, &now}) {
    for (const auto& entry : *s) paths.insert(entry.first);
  }
  for (const std::string& path : paths) {
    auto state = [&](const FileSnapshot& s) -> std::optional<std::string> {
      auto it = s.find(path);
      if (it == s.end()) return std::nullopt;
      return it->second.bytes;
    };
    const auto current = state(now);
    if (current != state(before) && current != state(after)) out.push_back(path);
  }
  return out;
}

}  // namespace kolt::testing

#endif  // KOLT_TESTS_UNIT_SYNC_CHANGE_CHECK_SUPPORT_H
