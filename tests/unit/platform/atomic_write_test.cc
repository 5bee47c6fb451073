// The one atomic writer under injected failures and power loss, and the
// fault-injecting Env's own model (it must be able to catch a bad writer).
#include <gtest/gtest.h>

#include "fixtures/fault_env.h"
#include "fixtures/sandbox.h"
#include "kolt/env.h"

namespace kolt {
namespace {

using testing::FaultEnv;
using testing::FaultOp;
using testing::Sandbox;

constexpr const char* kDir = "/Library/Preferences/Vorn";
constexpr const char* kTarget = "/Library/Preferences/Vorn/config.plist";
const std::string kOld = "the old document, whole\n";
const std::string kNew = std::string(100000, 'n') + "the new document, whole\n";

// What the directory holds besides the target: temporary files left behind.
std::vector<std::string> leftovers(const Sandbox& box) {
  std::vector<std::string> names = box.listNames(kDir);
  std::erase(names, "config.plist");
  return names;
}

TEST(AtomicWrite, OneWriteIsSixStepsOfWhichEveryKindCounts) {
  Sandbox box;
  FaultEnv env(&box.env());
  ASSERT_EQ(writeFileAtomically(env, kTarget, kNew, 0644), 0);
  EXPECT_EQ(env.steps(), 6);
  for (FaultOp op : {FaultOp::kCreate, FaultOp::kAppend, FaultOp::kFileSync, FaultOp::kClose,
                     FaultOp::kRename, FaultOp::kDirectorySync}) {
    EXPECT_EQ(env.count(op), 1) << testing::faultOpName(op);
  }
  EXPECT_EQ(env.count(FaultOp::kRemove), 0);
  EXPECT_EQ(box.readFile(kTarget), kNew);
  EXPECT_TRUE(leftovers(box).empty());
}

TEST(AtomicWrite, AFailureAtEachKindOfStepLeavesTheOldFileOrTheWholeNewOne) {
  for (FaultOp op : {FaultOp::kCreate, FaultOp::kAppend, FaultOp::kFileSync, FaultOp::kClose,
                     FaultOp::kRename, FaultOp::kDirectorySync}) {
    SCOPED_TRACE(testing::faultOpName(op));
    Sandbox box;
    box.writeFile(kTarget, kOld);
    FaultEnv env(&box.env());
    env.failNth(op, 1, ENOSPC);
    EXPECT_EQ(writeFileAtomically(env, kTarget, kNew, 0644), ENOSPC);
    // Only a failing directory sync comes after the rename.
    EXPECT_EQ(box.readFile(kTarget), op == FaultOp::kDirectorySync ? kNew : kOld);
    EXPECT_TRUE(leftovers(box).empty());
  }
}

TEST(AtomicWrite, AFailureAtEveryStepKeepsAMissingFileMissingOrMakesItWhole) {
  Sandbox probe;
  FaultEnv counter(&probe.env());
  ASSERT_EQ(writeFileAtomically(counter, kTarget, kNew, 0600), 0);
  const int steps = counter.steps();
  for (int k = 1; k <= steps; ++k) {
    SCOPED_TRACE("failing step " + std::to_string(k));
    Sandbox box;
    FaultEnv env(&box.env());
    env.failStep(k, EIO);
    EXPECT_EQ(writeFileAtomically(env, kTarget, kNew, 0600), EIO);
    const auto contents = box.readFile(kTarget);
    if (contents) {
      EXPECT_EQ(*contents, kNew);
      EXPECT_EQ(box.fileMode(kTarget), 0600u);
    }
    EXPECT_TRUE(leftovers(box).empty());
  }
}

TEST(AtomicWrite, PowerLossAtAnyPointLeavesTheOldOrTheNewFileNeverATornOne) {
  Sandbox probe;
  probe.writeFile(kTarget, kOld);
  FaultEnv counter(&probe.env());
  ASSERT_EQ(writeFileAtomically(counter, kTarget, kNew, 0644), 0);
  const int steps = counter.steps();
  int sawOld = 0, sawNew = 0;
  for (int k = 0; k <= steps; ++k) {
    SCOPED_TRACE("power lost after step " + std::to_string(k));
    Sandbox box;
    box.writeFile(kTarget, kOld);
    FaultEnv env(&box.env());
    env.crashAfterSteps(k);
    const int rc = writeFileAtomically(env, kTarget, kNew, 0644);
    EXPECT_EQ(rc == 0, k == steps);
    EXPECT_EQ(env.powerLost(), k < steps);
    ASSERT_EQ(env.crash(), 0);
    const auto contents = box.readFile(kTarget);
    ASSERT_TRUE(contents.has_value());
    EXPECT_TRUE(*contents == kOld || *contents == kNew) << contents->size() << " bytes";
    sawOld += *contents == kOld;
    sawNew += *contents == kNew;
    EXPECT_TRUE(leftovers(box).empty());
  }
  EXPECT_GT(sawOld, 0);
  EXPECT_EQ(sawNew, 1);  // only once the directory sync is done
}

TEST(FaultEnvModel, PowerLossCatchesAnInPlaceWriteAndAnUnsyncedRename) {
  // A writer that overwrites in place without syncing comes back empty.
  {
    Sandbox box;
    box.writeFile(kTarget, kOld);
    FaultEnv env(&box.env());
    std::unique_ptr<WritableFile> file;
    ASSERT_EQ(env.newWritableFile(kTarget, 0644, false, &file), 0);
    ASSERT_EQ(file->append(kNew), 0);
    ASSERT_EQ(file->close(), 0);
    EXPECT_EQ(box.readFile(kTarget), kNew);
    ASSERT_EQ(env.crash(), 0);
    EXPECT_EQ(box.readFile(kTarget), "");
  }
  // A synced file renamed without a directory sync: the rename is undone.
  {
    Sandbox box;
    box.writeFile(kTarget, kOld);
    FaultEnv env(&box.env());
    std::unique_ptr<WritableFile> file;
    const std::string tmp = std::string(kDir) + "/tmp";
    ASSERT_EQ(env.newWritableFile(tmp, 0644, true, &file), 0);
    ASSERT_EQ(file->append(kNew), 0);
    ASSERT_EQ(file->sync(), 0);
    ASSERT_EQ(file->close(), 0);
    ASSERT_EQ(env.renameFile(tmp, kTarget), 0);
    ASSERT_EQ(env.crash(), 0);
    EXPECT_EQ(box.readFile(kTarget), kOld);
    EXPECT_FALSE(box.exists(tmp));
  }
  // A removal becomes durable with the directory sync only.
  {
    Sandbox box;
    box.writeFile(kTarget, kOld, 0600);
    box.writeFile("/etc/other", "other");
    FaultEnv env(&box.env());
    ASSERT_EQ(env.removeFile(kTarget), 0);
    ASSERT_EQ(env.removeFile("/etc/other"), 0);
    ASSERT_EQ(env.syncDirectory("/etc/"), 0);
    ASSERT_EQ(env.crash(), 0);
    EXPECT_EQ(box.readFile(kTarget), kOld);
    EXPECT_EQ(box.fileMode(kTarget), 0600u);
    EXPECT_FALSE(box.exists("/etc/other"));
  }
}

TEST(FaultEnvModel, AfterThePowerGoesNothingMoreReachesTheDisk) {
  Sandbox box;
  FaultEnv env(&box.env());
  env.crashAfterSteps(1);
  std::unique_ptr<WritableFile> file;
  ASSERT_EQ(env.newWritableFile("/etc/a", 0644, false, &file), 0);
  EXPECT_EQ(file->append("data"), EIO);
  EXPECT_EQ(env.renameFile("/etc/a", "/etc/b"), EIO);
  ProcessResult result;
  EXPECT_EQ(env.runProcess(ProcessSpec{}, true, &result), EIO);
  EXPECT_EQ(box.readFile("/etc/a"), "");
  EXPECT_TRUE(env.powerLost());
  ASSERT_EQ(env.crash(), 0);
  EXPECT_FALSE(env.powerLost());
  EXPECT_FALSE(box.exists("/etc/a"));  // its creation was never made durable
  ASSERT_EQ(writeFileAtomically(env, "/etc/c", "after reboot", 0644), 0);
  EXPECT_EQ(box.readFile("/etc/c"), "after reboot");
}

TEST(FaultEnvModel, FaultsHitTheNthCallOnceOrForGood) {
  Sandbox box;
  FaultEnv env(&box.env());
  env.failNth(FaultOp::kRename, 2, EXDEV);
  box.writeFile("/etc/a", "a");
  EXPECT_EQ(env.renameFile("/etc/a", "/etc/b"), 0);
  EXPECT_EQ(env.renameFile("/etc/b", "/etc/c"), EXDEV);
  EXPECT_EQ(env.renameFile("/etc/b", "/etc/c"), 0);
  EXPECT_EQ(env.count(FaultOp::kRename), 3);

  env.failNth(FaultOp::kProcessStart, 1, EAGAIN, /*persistent=*/true);
  ProcessResult result;
  EXPECT_EQ(env.runProcess(ProcessSpec{}, true, &result), EAGAIN);
  EXPECT_EQ(env.runProcess(ProcessSpec{}, true, &result), EAGAIN);
  env.clearFaults();
  EXPECT_EQ(env.runProcess(ProcessSpec{"/no/such/tool", {}, {}, {}, {}, {}}, true, &result),
            ENOENT);
  EXPECT_EQ(env.count(FaultOp::kProcessStart), 3);
  env.resetCounts();
  EXPECT_EQ(env.steps(), 0);
}

TEST(FaultEnvModel, FakesAnswerInsteadOfTheHost) {
  Sandbox box;
  FaultEnv env(&box.env());
  env.fakeHostName("mdc-7");
  env.fakeProcessId(1234);
  env.fakeInterfaceAddresses({{"en0", 2, std::string("\x0a\x00\x00\x07", 4)}});
  env.fakeClock(700000000);
  env.fakeSleeps();
  std::string name;
  ASSERT_EQ(env.hostName(&name), 0);
  EXPECT_EQ(name, "mdc-7");
  EXPECT_EQ(env.processId(), 1234);
  std::vector<InterfaceAddress> addresses;
  ASSERT_EQ(env.interfaceAddresses(&addresses), 0);
  ASSERT_EQ(addresses.size(), 1u);
  EXPECT_EQ(addresses[0].interfaceName, "en0");
  env.sleepSeconds(30);
  env.sleepSeconds(0.5);
  EXPECT_EQ(env.sleeps(), (std::vector<double>{30, 0.5}));
  EXPECT_EQ(env.now(), 700000030.5);
  env.failHardwareUUID(EPERM);
  std::array<std::uint8_t, 16> uuid{};
  EXPECT_EQ(env.hardwareUUID(&uuid), EPERM);
  EXPECT_EQ(env.hardwareUUIDCalls(), 1);
}

}  // namespace
}  // namespace kolt
