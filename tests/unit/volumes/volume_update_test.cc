// The volume update: every keep / remove / rewrite / start decision, hostile
// names, and the files it must never touch.
#include "volumes/volume_update.h"

#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <thread>

#include "config/hosted_volume_list.h"
#include "fixtures/fault_env.h"
#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "kolt/controller_helpers.h"
#include "unit/volumes/volume_test_envs.h"

namespace kolt {
namespace {

using testing::FaultEnv;
using testing::FaultOp;
using testing::LogCapture;
using testing::ProcessRecordingEnv;
using testing::Sandbox;

constexpr const char* kOurUUID = "5A5A5A5A-1111-4222-8333-444444444444";
constexpr const char* kOtherUUID = "0B0B0B0B-1111-4222-8333-444444444444";
constexpr const char* kVorn = "/Library/Preferences/Vorn/";
constexpr double kMtime = 700000000;  // whole seconds, as dates come through XML

std::string vornPath(const std::string& name) {
  return std::string(kVorn) + name;
}

Value volumeConfig(const std::string& marker) {
  Value config;
  config.set("name", marker);
  config.set("stripeBreadth", Value::integer(16));
  return config;
}

// A volume entry; `mtime` NAN leaves "mtime" out.
Value volumeEntry(const char* controller, double mtime, const std::string& marker = "cfg") {
  Value entry;
  entry.set("config", volumeConfig(marker));
  if (!std::isnan(mtime)) entry.set("mtime", Value::date(mtime));
  Array controllers;
  if (controller) controllers.emplace_back(controller);
  entry.set("controllers", Value(std::move(controllers)));
  return entry;
}

class VolumeUpdateTest : public ::testing::Test {
 protected:
  VolumeUpdateTest() : processes_(&sandbox_.env()), scoped_(&processes_) {
    sandbox_.setHardwareUUID(kOurUUID);
  }

  std::string cfgpText(const std::string& marker) {
    return *writeXmlPropertyList(volumeConfig(marker));
  }
  std::optional<std::string> fsmlist() { return sandbox_.readFile(kFsmlistPath); }
  bool logged(const std::string& needle) { return logs_.contains(needle); }

  Sandbox sandbox_;
  ProcessRecordingEnv processes_;
  ScopedEnv scoped_;
  LogCapture logs_;
};

TEST_F(VolumeUpdateTest, EmptyVolumesRemoveEveryCfgpAndFsmlistAndStartNothing) {
  for (const char* name : {"vol1.cfgp", "vol2.cfgp", "vol1.cfg", "vol2.cfgx", "vol1-auxdata.plist",
                           "config.plist", ".hidden.cfgp"}) {
    sandbox_.writeFile(vornPath(name), name);
  }
  sandbox_.writeFile(kFsmlistPath, "vol1 . 0\n");

  updateFromVolumeConfig(Value(Dictionary()));

  EXPECT_EQ(sandbox_.listNames(kVorn),
            (std::vector<std::string>{".hidden.cfgp", "config.plist", "vol1-auxdata.plist",
                                      "vol1.cfg", "vol2.cfgx"}));
  EXPECT_EQ(sandbox_.readFile(vornPath("vol1.cfg")), "vol1.cfg");
  EXPECT_TRUE(processes_.started.empty());
  EXPECT_TRUE(logged("Hosted set is "));
  EXPECT_TRUE(logged("needStart is "));
}

TEST_F(VolumeUpdateTest, HostedVolumesAreWrittenOnlyWhenTheirDateDiffers) {
  // "same": carries the entry's date; "sameSecond": a fraction later in the
  // same second (a date through XML has no fraction); "older": another date;
  // "missing": no file; "fraction": an entry date with a fraction.
  sandbox_.writeFile(vornPath("same.cfgp"), "kept");
  sandbox_.setModificationTime(vornPath("same.cfgp"), kMtime);
  sandbox_.writeFile(vornPath("sameSecond.cfgp"), "kept");
  sandbox_.setModificationTime(vornPath("sameSecond.cfgp"), kMtime + 0.6);
  sandbox_.writeFile(vornPath("older.cfgp"), "stale");
  sandbox_.setModificationTime(vornPath("older.cfgp"), kMtime - 100);
  sandbox_.writeFile(vornPath("older.cfg"), "source");
  sandbox_.writeFile(vornPath("older.cfgx"), "source");
  Dictionary volumes;
  for (const char* name : {"same", "sameSecond", "older", "missing"}) {
    volumes.set(name, volumeEntry(kOurUUID, kMtime, name));
  }
  volumes.set("fraction", volumeEntry(kOurUUID, kMtime + 0.75, "fraction"));

  updateFromVolumeConfig(Value(volumes));

  EXPECT_EQ(sandbox_.readFile(vornPath("same.cfgp")), "kept");
  EXPECT_EQ(sandbox_.readFile(vornPath("sameSecond.cfgp")), "kept");
  for (const char* name : {"older", "missing", "fraction"}) {
    EXPECT_EQ(sandbox_.readFile(vornPath(std::string(name) + ".cfgp")), cfgpText(name)) << name;
    EXPECT_EQ(sandbox_.modificationTime(vornPath(std::string(name) + ".cfgp")), kMtime) << name;
  }
  EXPECT_EQ(sandbox_.readFile(vornPath("older.cfg")), "source");
  EXPECT_EQ(sandbox_.readFile(vornPath("older.cfgx")), "source");
  EXPECT_EQ(fsmlist(), "fraction . 0\nmissing . 0\nolder . 0\nsame . 0\nsameSecond . 0\n");

  // A second run finds every date equal and rewrites nothing.
  for (const char* name : {"older", "missing", "fraction"}) {
    sandbox_.writeFile(vornPath(std::string(name) + ".cfgp"), "kept");
    sandbox_.setModificationTime(vornPath(std::string(name) + ".cfgp"), kMtime);
  }
  updateFromVolumeConfig(Value(volumes));
  for (const char* name : {"older", "missing", "fraction"}) {
    EXPECT_EQ(sandbox_.readFile(vornPath(std::string(name) + ".cfgp")), "kept") << name;
  }
}

TEST_F(VolumeUpdateTest, StartsExactlyTheVolumesMissingFromThePreviousFsmlist) {
  sandbox_.writeFile(kFsmlistPath, "known . 0\nelsewhereKnown . 0\n");
  sandbox_.writeFile(vornPath("elsewhere.cfgp"), "theirs");
  Dictionary volumes;
  volumes.set("known", volumeEntry(kOurUUID, kMtime));
  volumes.set("new", volumeEntry(kOurUUID, kMtime));
  volumes.set("elsewhere", volumeEntry(kOtherUUID, kMtime));       // not hosted, not listed
  volumes.set("elsewhereKnown", volumeEntry(kOtherUUID, kMtime));  // not hosted, listed

  updateFromVolumeConfig(Value(volumes));

  EXPECT_EQ(processes_.startedCommands(),
            (std::vector<std::string>{"start elsewhere", "start new"}));
  EXPECT_FALSE(sandbox_.exists(vornPath("elsewhere.cfgp")));
  EXPECT_EQ(fsmlist(), "known . 0\nnew . 0\n");
  EXPECT_TRUE(logged("Hosted set is "));
}

TEST_F(VolumeUpdateTest, QmadminGetsItsArgumentsAndStreamsAndIsNotWaitedFor) {
  Dictionary volumes;
  volumes.set("vol1", volumeEntry(kOurUUID, kMtime));
  updateFromVolumeConfig(Value(volumes));

  ASSERT_EQ(processes_.started.size(), 1u);
  const testing::StartedProcess& p = processes_.started[0];
  EXPECT_FALSE(p.waited);
  EXPECT_EQ(p.spec.executable, "/System/Library/Filesystems/kolt.fs/Contents/bin/qmadmin");
  EXPECT_EQ(p.spec.arguments, (std::vector<std::string>{"-e", "start vol1"}));
  EXPECT_EQ(p.spec.standardInput.kind, StreamSpec::Kind::kNull);
  EXPECT_EQ(p.spec.standardOutput.kind, StreamSpec::Kind::kAppendToExistingFile);
  EXPECT_EQ(p.spec.standardOutput.path, "/var/run/vorn_qmadmin_vol1.log");
  EXPECT_EQ(p.spec.standardError.kind, StreamSpec::Kind::kAppendToExistingFile);
  EXPECT_EQ(p.spec.standardError.path, "/var/run/vorn_qmadmin_vol1.error");
}

TEST_F(VolumeUpdateTest, AHostedVolumeWithoutMtimeIsSkippedAndLosesItsFile) {
  sandbox_.writeFile(vornPath("nomtime.cfgp"), "old");
  sandbox_.writeFile(vornPath("nomtime.cfg"), "source");
  Dictionary volumes;
  volumes.set("nomtime", volumeEntry(kOurUUID, NAN));
  Value notADate = volumeEntry(kOurUUID, NAN);
  notADate.set("mtime", "2024-01-01");
  volumes.set("textmtime", notADate);

  updateFromVolumeConfig(Value(volumes));

  EXPECT_TRUE(logged("ERROR: LDAP config for volume 'nomtime' lacks mtime. Ignoring"));
  EXPECT_TRUE(logged("ERROR: LDAP config for volume 'textmtime' lacks mtime. Ignoring"));
  EXPECT_FALSE(sandbox_.exists(vornPath("nomtime.cfgp")));
  EXPECT_FALSE(sandbox_.exists(vornPath("textmtime.cfgp")));
  EXPECT_EQ(sandbox_.readFile(vornPath("nomtime.cfg")), "source");
  EXPECT_FALSE(sandbox_.exists(kFsmlistPath));  // nothing hosted
  EXPECT_TRUE(processes_.started.empty());
}

TEST_F(VolumeUpdateTest, NoHostedVolumeRemovesFsmlist) {
  sandbox_.writeFile(kFsmlistPath, "vol1 . 0\n");
  Dictionary volumes;
  volumes.set("vol1", volumeEntry(kOtherUUID, kMtime));
  updateFromVolumeConfig(Value(volumes));
  EXPECT_FALSE(sandbox_.exists(kFsmlistPath));
  EXPECT_TRUE(processes_.started.empty());  // listed before: not started
}

// Every file below the root outside the Vorn directory, with its content.
std::map<std::string, std::string> filesOutsideVorn(const Sandbox& sandbox) {
  namespace fs = std::filesystem;
  std::map<std::string, std::string> files;
  const std::string vornHost = sandbox.hostPath("/Library/Preferences/Vorn");
  for (const auto& e : fs::recursive_directory_iterator(sandbox.root())) {
    const std::string path = e.path().string();
    if (path.rfind(vornHost, 0) == 0 &&
        (path.size() == vornHost.size() || path[vornHost.size()] == '/')) {
      continue;
    }
    files[path] = e.is_regular_file() ? *sandbox.readFile(path.substr(sandbox.root().size())) : "";
  }
  return files;
}

TEST_F(VolumeUpdateTest, HostileVolumeNamesTouchNothing) {
  sandbox_.writeFile("/Library/Preferences/escape.cfgp", "outside");
  sandbox_.writeFile(vornPath("two words.cfgp"), "a file someone made");
  const auto before = filesOutsideVorn(sandbox_);
  Dictionary volumes;
  for (const char* name : {"../escape", "../../../etc/x", "a/b", ".hidden", "..", "two words",
                           "line\nbreak", "tab\tname", "", "nbsp\xC2\xA0name"}) {
    volumes.set(name, volumeEntry(kOurUUID, kMtime));
  }
  Value notHere = volumeEntry(kOtherUUID, kMtime);
  volumes.set("../escape2", notHere);
  volumes.set("good", volumeEntry(kOurUUID, kMtime));

  updateFromVolumeConfig(Value(volumes));

  EXPECT_EQ(filesOutsideVorn(sandbox_), before);
  EXPECT_EQ(sandbox_.listNames(kVorn),
            (std::vector<std::string>{"fsmlist", "good.cfgp", "two words.cfgp"}));
  EXPECT_EQ(fsmlist(), "good . 0\n");
  EXPECT_EQ(parseHostedVolumeList(*fsmlist()), Array{Value("good")});
  EXPECT_EQ(processes_.startedCommands(), std::vector<std::string>{"start good"});
  EXPECT_TRUE(logged("Volume name '../escape' cannot name a file. Ignoring"));
  EXPECT_TRUE(logged("Volume name 'line\\x0Abreak' cannot name a file. Ignoring"));
  for (const std::string& text : logs_.texts()) {
    EXPECT_EQ(text.find("line\nbreak"), std::string::npos) << text;  // no forged log lines
  }
}

TEST_F(VolumeUpdateTest, AnUnreadableDirectoryIsLoggedAndTheUpdateGoesOn) {
  std::filesystem::remove_all(sandbox_.hostPath("/Library/Preferences/Vorn"));
  Dictionary volumes;
  volumes.set("vol1", volumeEntry(kOurUUID, kMtime));
  updateFromVolumeConfig(Value(volumes));
  EXPECT_TRUE(logged("ERROR: Error got error '"));
  EXPECT_TRUE(logged("' for url 'file:///Library/Preferences/Vorn/'"));
  EXPECT_EQ(processes_.startedCommands(), std::vector<std::string>{"start vol1"});
}

TEST_F(VolumeUpdateTest, AFailedWriteLeavesTheOldDateSoTheNextRunRewrites) {
  sandbox_.writeFile(vornPath("vol1.cfgp"), "stale");
  sandbox_.setModificationTime(vornPath("vol1.cfgp"), kMtime - 50);
  sandbox_.writeFile(kFsmlistPath, "vol1 . 0\n");
  Dictionary volumes;
  volumes.set("vol1", volumeEntry(kOurUUID, kMtime, "fresh"));
  volumes.set("vol2", volumeEntry(kOurUUID, kMtime, "second"));
  {
    FaultEnv faults(&processes_);
    ScopedEnv scoped(&faults);
    faults.failNth(FaultOp::kRename, 1, ENOSPC, /*persistent=*/true);
    updateFromVolumeConfig(Value(volumes));
  }
  EXPECT_EQ(sandbox_.readFile(vornPath("vol1.cfgp")), "stale");
  EXPECT_EQ(sandbox_.modificationTime(vornPath("vol1.cfgp")), kMtime - 50);
  EXPECT_EQ(fsmlist(), "vol1 . 0\n");  // the old list stays whole
  EXPECT_EQ(sandbox_.listNames(kVorn), (std::vector<std::string>{"fsmlist", "vol1.cfgp"}));

  updateFromVolumeConfig(Value(volumes));
  EXPECT_EQ(sandbox_.readFile(vornPath("vol1.cfgp")), cfgpText("fresh"));
  EXPECT_EQ(sandbox_.modificationTime(vornPath("vol1.cfgp")), kMtime);
  EXPECT_EQ(fsmlist(), "vol1 . 0\nvol2 . 0\n");
}

// With the real stand-in: the tool runs detached, its output is appended to
// the log files that exist, and nothing creates the ones that do not.
TEST(VolumeUpdateProcess, QmadminRunsAndAppendsToExistingLogs) {
  Sandbox sandbox;
  sandbox.setHardwareUUID(kOurUUID);
  sandbox.installTool("qmadmin");
  sandbox.setToolOutput("qmadmin", "started\n", "warning\n");
  sandbox.writeFile("/var/run/vorn_qmadmin_vol1.log", "earlier\n");
  sandbox.writeFile("/var/run/vorn_qmadmin_vol1.error", "");
  Dictionary volumes;
  volumes.set("vol1", volumeEntry(kOurUUID, kMtime));
  volumes.set("vol2", volumeEntry(kOurUUID, kMtime));

  updateFromVolumeConfig(Value(volumes));

  auto calls = sandbox.waitForToolCalls(2);
  ASSERT_EQ(calls.size(), 2u);
  std::sort(calls.begin(), calls.end(),
            [](const auto& a, const auto& b) { return a.arguments < b.arguments; });
  EXPECT_EQ(calls[0].arguments, (std::vector<std::string>{"-e", "start vol1"}));
  EXPECT_EQ(calls[1].arguments, (std::vector<std::string>{"-e", "start vol2"}));
  EXPECT_EQ(calls[0].input, "");  // the null device
  // The output follows the record; give the detached tool time to finish.
  for (int i = 0; i < 200 && sandbox.readFile("/var/run/vorn_qmadmin_vol1.error") != "warning\n";
       ++i) {
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
  }
  EXPECT_EQ(sandbox.readFile("/var/run/vorn_qmadmin_vol1.log"), "earlier\nstarted\n");
  EXPECT_EQ(sandbox.readFile("/var/run/vorn_qmadmin_vol1.error"), "warning\n");
  EXPECT_FALSE(sandbox.exists("/var/run/vorn_qmadmin_vol2.log"));
}

}  // namespace
}  // namespace kolt
