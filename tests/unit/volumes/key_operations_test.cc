// The key operations over dictionaries and the single-value files.
#include "volumes/key_operations.h"

#include <gtest/gtest.h>

#include "fixtures/fault_env.h"
#include "fixtures/sandbox.h"
#include "kolt/volume_files.h"
#include "unit/volumes/volume_test_envs.h"

namespace kolt {
namespace {

using testing::CreationModeEnv;
using testing::FaultEnv;
using testing::FaultOp;
using testing::Sandbox;

constexpr const char* kSecretPath = "/Library/Preferences/Vorn/.auth_secret";

TEST(ReadVornCfgFile, ReturnsTheTextUnchanged) {
  Sandbox sandbox;
  sandbox.writeFile("/Library/Preferences/Vorn/fsports", "port 1\n");
  EXPECT_EQ(read_vorn_cfg_file("fsports"), "port 1\n");
  EXPECT_EQ(read_vorn_cfg_file("missing"), std::nullopt);
  sandbox.writeFile("/Library/Preferences/Vorn/binary", "\xFF\xFE");
  EXPECT_EQ(read_vorn_cfg_file("binary"), std::nullopt);
}

TEST(CopyValue, MarksOnlyRealChanges) {
  Dictionary source;
  source.set("same", "x");
  source.set("differs", "new");
  source.set("added", Value::integer(1));
  Dictionary destination;
  destination.set("same", "x");
  destination.set("differs", "old");
  destination.set("removed", "gone");

  std::uint8_t changed = 0x20;  // other bits stay
  copyValue(&destination, source, "same", &changed);
  copyValue(&destination, source, "neither", &changed);
  EXPECT_EQ(changed, 0x20);
  EXPECT_FALSE(destination.contains("neither"));

  copyValue(&destination, source, "differs", &changed);
  EXPECT_EQ(changed, 0x21);
  EXPECT_EQ(*destination.find("differs"), Value("new"));
  changed = 0;
  copyValue(&destination, source, "added", &changed);
  EXPECT_EQ(changed, kKeyChanged);
  changed = 0;
  copyValue(&destination, source, "removed", &changed);
  EXPECT_EQ(changed, kKeyChanged);
  EXPECT_FALSE(destination.contains("removed"));
}

TEST(UpdateFromFile, FollowsTheFile) {
  Sandbox sandbox;
  Dictionary globals;
  std::uint8_t changed = 0;
  update_from_file(&globals, "fsports", "fsports", &changed);  // neither file nor key
  EXPECT_EQ(changed, 0);
  EXPECT_FALSE(globals.contains("fsports"));

  sandbox.writeFile("/Library/Preferences/Vorn/fsports", "ports\n");
  update_from_file(&globals, "fsports", "fsports", &changed);
  EXPECT_EQ(changed, kKeyChanged);
  EXPECT_EQ(*globals.find("fsports"), Value("ports\n"));

  changed = 0;
  update_from_file(&globals, "fsports", "fsports", &changed);  // equal
  EXPECT_EQ(changed, 0);

  sandbox.removeFile("/Library/Preferences/Vorn/fsports");  // the file disappeared
  update_from_file(&globals, "fsports", "fsports", &changed);
  EXPECT_EQ(changed, kKeyChanged);
  EXPECT_FALSE(globals.contains("fsports"));
}

TEST(UpdateFromConfig, WritesRemovesAndLeavesEqualFilesAlone) {
  Sandbox sandbox;
  Dictionary globals;
  globals.set("fsports", "ports\n");
  update_from_config(globals, "fsports", "fsports", 0644);
  EXPECT_EQ(sandbox.readFile("/Library/Preferences/Vorn/fsports"), "ports\n");
  EXPECT_EQ(sandbox.fileMode("/Library/Preferences/Vorn/fsports"), 0644u);

  // Equal text: not rewritten (its date stays).
  sandbox.setModificationTime("/Library/Preferences/Vorn/fsports", 1000);
  update_from_config(globals, "fsports", "fsports", 0644);
  EXPECT_EQ(sandbox.modificationTime("/Library/Preferences/Vorn/fsports"), 1000);

  // A value that is not text leaves the file alone.
  globals.set("fsports", Value::integer(3));
  update_from_config(globals, "fsports", "fsports", 0644);
  EXPECT_EQ(sandbox.readFile("/Library/Preferences/Vorn/fsports"), "ports\n");

  globals.erase("fsports");
  update_from_config(globals, "fsports", "fsports", 0644);
  EXPECT_FALSE(sandbox.exists("/Library/Preferences/Vorn/fsports"));
  update_from_config(globals, "fsports", "fsports", 0644);  // nothing to remove
  EXPECT_EQ(sandbox.listNames("/Library/Preferences/Vorn"), std::vector<std::string>{});
}

TEST(UpdateFromConfig, TheSecretIsNeverReadableByOthers) {
  Sandbox sandbox;
  CreationModeEnv env(&sandbox.env());
  ScopedEnv scoped(&env);
  Dictionary globals;
  globals.set("sharedSecret", "first secret");
  update_from_config(globals, ".auth_secret", "sharedSecret", 0600);
  globals.set("sharedSecret", "second secret");
  update_from_config(globals, ".auth_secret", "sharedSecret", 0600);

  EXPECT_EQ(sandbox.readFile(kSecretPath), "second secret");
  EXPECT_EQ(sandbox.fileMode(kSecretPath), 0600u);
  // Every file that ever held it had mode 0600 before its first byte.
  ASSERT_EQ(env.modesAtCreation.size(), 2u);
  for (const auto& [path, mode] : env.modesAtCreation) {
    EXPECT_EQ(path.rfind(kSecretPath, 0), 0u) << path;
    EXPECT_EQ(mode, 0600u) << path;
  }
  EXPECT_TRUE(env.permissionChanges.empty());
}

TEST(UpdateFromConfig, NarrowsAnEqualSecretFileThatOthersCanRead) {
  Sandbox sandbox;
  sandbox.writeFile(kSecretPath, "the secret", 0644);
  Dictionary globals;
  globals.set("sharedSecret", "the secret");
  update_from_config(globals, ".auth_secret", "sharedSecret", 0600);
  EXPECT_EQ(sandbox.fileMode(kSecretPath), 0600u);
  EXPECT_EQ(sandbox.readFile(kSecretPath), "the secret");
}

TEST(UpdateFromConfig, AFailedWriteKeepsTheOldFileWhole) {
  Sandbox sandbox;
  sandbox.writeFile(kSecretPath, "old secret", 0600);
  FaultEnv faults(&sandbox.env());
  ScopedEnv scoped(&faults);
  for (FaultOp op : {FaultOp::kCreate, FaultOp::kAppend, FaultOp::kFileSync, FaultOp::kRename}) {
    faults.failNth(op, 1, EIO);
    Dictionary globals;
    globals.set("sharedSecret", "new secret");
    update_from_config(globals, ".auth_secret", "sharedSecret", 0600);
    EXPECT_EQ(sandbox.readFile(kSecretPath), "old secret") << faultOpName(op);
    EXPECT_EQ(sandbox.listNames("/Library/Preferences/Vorn"),
              std::vector<std::string>{".auth_secret"})
        << faultOpName(op);
    faults.clearFaults();
  }
}

}  // namespace
}  // namespace kolt
