// The change check's apply step on the in-memory directory: copied keys,
// side files, the role and its mask bits, certificates, joins, the dead SAN,
// failures half-way and the shared secret.
#include <gtest/gtest.h>

#include <cerrno>

#include "fixtures/fault_env.h"
#include "fixtures/log_capture.h"
#include "kolt/change_check.h"
#include "kolt/controller_helpers.h"
#include "unit/sync/change_check_support.h"
#include "unit/sync/memory_member_test.h"

namespace kolt::testing {
namespace {

constexpr const char* kCopiedKeys[] = {
    "sanConfigURLs", "desiredSearchPolicy", "notifications", "ownerEmail",     "ownerName",
    "sanAuthMethod", "primaryZombie",       "sanState",      "certSetRevision"};

// Fails the save of config.plist (its final rename).
class FailingSaveEnv : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  int renameFile(const std::string& from, const std::string& to) override {
    if (to == kConfigPlistPath) return EIO;
    return EnvWrapper::renameFile(from, to);
  }
};

// Records the mode each file has when it is created.
class CreationModeEnv : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  int newWritableFile(const std::string& path, mode_t mode, bool exclusive,
                      std::unique_ptr<WritableFile>* file) override {
    const int rc = EnvWrapper::newWritableFile(path, mode, exclusive, file);
    FileInfo info;
    if (rc == 0 && fileInfo(path, &info) == 0) modes[parentDirectory(path)].push_back(info.mode);
    if (path.find(".auth_secret") != std::string::npos) secretModes.push_back(info.mode);
    return rc;
  }
  std::map<std::string, std::vector<mode_t>> modes;
  std::vector<mode_t> secretModes;
};

class ChangeApplyTest : public MemoryMemberTest {
 protected:
  // The published configuration at a new revision, with `change` applied.
  template <class Change>
  void publishChange(Change change) {
    Value config = publishedConfig(stringArray({kUrl1, kUrl2}), nextRevision());
    change(globalsOf(config), *config.find("volumes"));
    publishConfig(config);
  }
  std::string nextRevision() {
    char text[40];
    std::snprintf(text, sizeof text, "0F0F0F0F-0000-4000-8000-%012d", ++revisions_);
    return text;
  }
  void memberWith(const char* role, Value document = Value()) {
    Value base = memberDocument(stringArray({kUrl1, kUrl2}), role, kRevision1);
    for (const auto& [key, value] : *document.asDictionary()) base.set(key, value);
    ASSERT_TRUE(saveConfigPlist(base));
    machine_.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  }
  int check(Value* newConfig = nullptr) {
    mask_ = 0xFFFFFFFF;
    return checkSanConfigChange(&mask_, newConfig);
  }
  Value local() { return loadConfigPlist().value_or(Value()); }
  std::optional<std::string> file(const std::string& name) {
    return machine_.sandbox().readFile(vornFile(name));
  }
  std::size_t unloads() { return recorder().countOf("vornctl unloadProfile"); }

  int revisions_ = 100;
};

TEST_F(ChangeApplyTest, APublishedChangeReachesTheDocumentAndEverySideFile) {
  Value extra;
  extra.set("vornAddr", "10.0.0.50");
  extra.set("ownerEmail", "old@example.test");
  extra.set("primaryZombie", "old");
  extra.set("sharedSecret", "left-by-an-old-release");
  memberWith("CLIENT", extra);
  machine_.sandbox().writeFile(vornFile("fsports"), "old ports\n", 0600);
  Value published = publishedConfig(stringArray({kUrl1, kUrl2}), kRevision2);
  globalsOf(published).erase("ownerEmail");
  publishConfig(published);
  LogCapture logs;

  EXPECT_EQ(check(), 0);

  EXPECT_EQ(mask_, std::uint32_t(kChangeApplied));
  const Value doc = local();
  const Value& globals = globalsOf(published);
  for (const char* key : kCopiedKeys) {
    const Value* want = globals.find(key);
    const Value* got = doc.find(key);
    ASSERT_EQ(want == nullptr, got == nullptr) << key;
    if (want != nullptr) {
      EXPECT_EQ(*got, *want) << key;
    }
  }
  EXPECT_EQ(*doc.findString("sanRevision"), kRevision2);
  EXPECT_EQ(*doc.findString("role"), "CLIENT");
  EXPECT_EQ(*doc.findString("vornAddr"), "10.0.0.50");
  Value ipMap;
  ipMap.set("10.0.0.1", "ctl1.example.test");
  EXPECT_EQ(*doc.find("controllerIPMap"), ipMap);
  EXPECT_EQ(doc.find("sharedSecret"), nullptr);
  EXPECT_EQ(doc.find("configIsNew"), nullptr);

  EXPECT_EQ(file("fsports"), "FsmPortRange 50000-50100\n");
  EXPECT_EQ(machine_.sandbox().fileMode(vornFile("fsports")), 0644u);
  EXPECT_EQ(file(".auth_secret"), kSecret);
  EXPECT_EQ(file("fsnameservers"), "10.0.0.1\n");
  EXPECT_EQ(file("fsmlist"), "Scratch . 0\n");
  EXPECT_TRUE(file("Scratch.cfgp"));
  EXPECT_FALSE(file("Projects.cfgp"));
  EXPECT_EQ(recorder().countOf("qmadmin -e start Scratch"), 1u);
  EXPECT_EQ(unloads(), 0u);

  std::vector<std::string> order;
  for (const std::string& text : logs.texts()) {
    for (const char* line : {"checkSanConfigChange passed newConfig ", "About to get new config",
                             "Got config ", "auth_secret w/o configIsNew"}) {
      if (text.rfind(line, 0) == 0) order.push_back(line);
    }
  }
  EXPECT_EQ(order, (std::vector<std::string>{"checkSanConfigChange passed newConfig ",
                                             "About to get new config", "Got config ",
                                             "auth_secret w/o configIsNew"}));
}

TEST_F(ChangeApplyTest, TheNameServerFileIsRewrittenOnlyWhenItsAddressesDiffer) {
  memberWith("CLIENT");
  machine_.sandbox().writeFile(vornFile("fsnameservers"), "10.0.0.1\n");
  machine_.sandbox().setModificationTime(vornFile("fsnameservers"), 600000000);
  publishChange([](Value&, Value&) {});
  ASSERT_EQ(check(), 0);
  EXPECT_EQ(machine_.sandbox().modificationTime(vornFile("fsnameservers")), 600000000.0);

  publishChange([](Value& globals, Value&) {
    Array list = *globals.findArray("fsnameservers");
    list.emplace(list.begin(), "10.0.0.2");
    globals.set("fsnameservers", Value(std::move(list)));
  });
  ASSERT_EQ(check(), 0);
  EXPECT_EQ(file("fsnameservers"), "10.0.0.2\n10.0.0.1\n");

  publishChange([](Value& globals, Value&) {
    globals.set("fsnameservers", stringArray({"10.0.0.1", "10.0.0.2"}));
  });
  ASSERT_EQ(check(), 0);
  EXPECT_EQ(file("fsnameservers"), "10.0.0.1\n10.0.0.2\n") << "order counts";
}

TEST_F(ChangeApplyTest, TheRoleAndItsMaskBits) {
  struct Case {
    const char* oldRole;  // null: none
    bool listed;          // the member is in "controllers"
    const char* primaryZombie;
    const char* role;
    std::uint32_t mask;
    std::size_t unloads;
  };
  const Case cases[] = {
      {"CLIENT", false, nullptr, "CLIENT", kChangeApplied, 0},
      {nullptr, false, nullptr, "CLIENT", kChangeApplied | kChangeRole, 0},
      {"CLIENT", true, nullptr, "CONTROLLER", kChangeApplied | kChangeRole, 0},
      {"CONTROLLER", true, nullptr, "CONTROLLER", kChangeApplied, 0},
      {"CONTROLLER", false, nullptr, "CLIENT", kChangeApplied | kChangeControllerToClient, 1},
      {"CLIENT", false, kMemberUUID, "CONTROLLER", kChangeApplied | kChangeRole, 0},
      // The host's UUID in lower case names another host here.
      {"CLIENT", false, "5a5a5a5a-1111-4222-8333-44444444cafe", "CLIENT", kChangeApplied, 0},
      {"WEIRD", false, nullptr, "CLIENT", kChangeApplied | kChangeRole, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.oldRole ? c.oldRole : "(none)") + " listed=" +
                 std::to_string(c.listed) + " zombie=" + (c.primaryZombie ? c.primaryZombie : "-"));
    memberWith(c.oldRole);
    publishChange([&](Value& globals, Value&) {
      if (c.listed) {
        globals.findDictionary("controllers")
            ->set(kMemberUUID, controllerEntry("member.example.test", "10.0.0.60"));
      }
      if (c.primaryZombie) globals.set("primaryZombie", c.primaryZombie);
    });
    recorder().commands.clear();
    EXPECT_EQ(check(), 0);
    EXPECT_EQ(*local().findString("role"), c.role);
    EXPECT_EQ(mask_, c.mask);
    EXPECT_EQ(unloads(), c.unloads);
  }
  // The unload: vornctl with one argument, null streams, not waited for.
  const ProcessSpec* unload = nullptr;
  memberWith("CONTROLLER");
  publishChange([](Value&, Value&) {});
  recorder().specs.clear();
  recorder().waited.clear();
  LogCapture logs;
  ASSERT_EQ(check(), 0);
  for (std::size_t i = 0; i < recorder().specs.size(); ++i) {
    if (recorder().specs[i].arguments == std::vector<std::string>{"unloadProfile"}) {
      unload = &recorder().specs[i];
      EXPECT_FALSE(recorder().waited[i]) << "vornctl is not waited for";
    }
  }
  ASSERT_NE(unload, nullptr);
  EXPECT_EQ(unload->executable, "/System/Library/Filesystems/kolt.fs/Contents/bin/vornctl");
  EXPECT_EQ(unload->standardInput.kind, StreamSpec::Kind::kNull);
  EXPECT_EQ(unload->standardOutput.kind, StreamSpec::Kind::kNull);
  EXPECT_EQ(unload->standardError.kind, StreamSpec::Kind::kNull);
  EXPECT_TRUE(logs.contains("vornctl unloadProfile launched"));
}

TEST_F(ChangeApplyTest, ADeadSanUnloadsTheProfileOrRefusesAJoin) {
  auto dead = [](Value& globals, Value& volumes) {
    globals.set("sanState", "dead");
    globals.set("primaryZombie", kControllerUUID);
    globals.erase("controllers");
    globals.erase("fsnameservers");
    volumes = Value::dictionary();
  };
  memberWith("CLIENT");
  publishChange(dead);
  EXPECT_EQ(check(), 0);
  EXPECT_EQ(unloads(), 1u);
  EXPECT_EQ(*local().findString("sanState"), "dead");

  // A controller of a dead SAN: unloaded for the move and for the death.
  memberWith("CONTROLLER");
  publishChange(dead);
  recorder().commands.clear();
  EXPECT_EQ(check(), 0);
  EXPECT_EQ(mask_, std::uint32_t(kChangeApplied | kChangeControllerToClient));
  EXPECT_EQ(unloads(), 2u);

  // A join to a dead SAN is saved, then refused.
  ASSERT_TRUE(machine_.env().removeFile(kConfigPlistPath) == 0);
  recorder().commands.clear();
  Value newConfig = memberDocument(stringArray({kUrl1}), nullptr);
  newConfig.set("sharedSecret", kSecret);
  EXPECT_EQ(check(&newConfig), 500);
  EXPECT_EQ(mask_, std::uint32_t(kChangeNewConfig | kChangeApplied | kChangeRole));
  EXPECT_EQ(*local().findString("sanState"), "dead");
  EXPECT_EQ(local().find("sharedSecret"), nullptr);
  EXPECT_EQ(unloads(), 0u);
}

TEST_F(ChangeApplyTest, ControllerCertificatesAreLoadedByClientsOfANewCertificateSet) {
  auto customCalls = [&] { return directory_->callCount(DirectoryOperation::kCustomCall); };
  memberWith("CLIENT");
  publishChange([](Value& globals, Value&) { globals.set("certSetRevision", kCertSet1); });
  std::size_t before = customCalls();
  ASSERT_EQ(check(), 0);
  EXPECT_EQ(customCalls(), before + 1);
  EXPECT_EQ(directory_->trustedServers(), std::set<std::string>{"ldap://10.0.0.1:389"});

  // The same set again: nothing to load.
  publishChange([](Value& globals, Value&) { globals.set("certSetRevision", kCertSet1); });
  before = customCalls();
  ASSERT_EQ(check(), 0);
  EXPECT_EQ(customCalls(), before);

  // A controller, and a join, load none.
  memberWith("CLIENT", Value());
  publishChange([](Value& globals, Value&) {
    globals.findDictionary("controllers")
        ->set(kMemberUUID, controllerEntry("member.example.test", "10.0.0.60"));
  });
  before = customCalls();
  ASSERT_EQ(check(), 0);
  EXPECT_EQ(customCalls(), before);
  publishChange([](Value&, Value&) {});
  Value newConfig = memberDocument(stringArray({kUrl1}));
  ASSERT_EQ(check(&newConfig), 0);
  EXPECT_EQ(customCalls(), before);

  // A set without any directory URL to ask: said, and nothing loaded.
  for (Value urls : {Value::array(), stringArray({""}), Value()}) {
    memberWith("CLIENT");  // the member still finds the directory through its own URLs
    publishChange([&](Value& globals, Value&) {
      globals.set("certSetRevision", "CE000000-0000-4000-8000-0000000000FF");
      if (urls.isDictionary()) {
        globals.erase("sanConfigURLs");
      } else {
        globals.set("sanConfigURLs", urls);
      }
    });
    before = customCalls();
    LogCapture logs;
    EXPECT_EQ(check(), 0);
    EXPECT_EQ(customCalls(), before);
    EXPECT_TRUE(logs.contains("no controller certificates loaded"));
  }
}

TEST_F(ChangeApplyTest, SearchServiceSettingsThatDifferSetBit4) {
  Value querix;
  querix.set("enableQuerixServer", Value::boolean(true));
  querix.set("querixServerVolumeList", stringArray({"Projects"}));
  memberWith("CLIENT", querix);
  publishChange([](Value&, Value&) {});
  ASSERT_EQ(check(), 0);
  EXPECT_EQ(mask_ & kChangeQuerixServer, 0u) << "without a new document, never";

  publishChange([](Value&, Value&) {});
  Value same = memberDocument(stringArray({kUrl1}));
  same.set("enableQuerixServer", Value::boolean(true));
  same.set("querixServerVolumeList", stringArray({"Projects"}));
  ASSERT_EQ(check(&same), 0);
  EXPECT_EQ(mask_ & kChangeQuerixServer, 0u);

  publishChange([](Value&, Value&) {});
  Value other = same;
  other.set("querixServerVolumeList", stringArray({"Scratch"}));
  ASSERT_EQ(check(&other), 0);
  EXPECT_EQ(mask_ & kChangeQuerixServer, std::uint32_t(kChangeQuerixServer));
}

TEST_F(ChangeApplyTest, AJoinThroughTheDirectory) {
  Value loaded;
  loaded.set("vornAddr", "10.0.0.50");
  loaded.set("migratedVersion", Value::integer(2));
  memberWith("CLIENT", loaded);
  machine_.sandbox().removeFile(vornFile(".auth_secret"));
  publishChange([](Value&, Value&) {});
  CreationModeEnv modes(&machine_.env());
  ScopedEnv scoped(&modes);

  Value newConfig = memberDocument(stringArray({kUrl1}), nullptr);
  newConfig.set("sharedSecret", kSecret);
  newConfig.set("vornAddr", "10.0.0.99");
  newConfig.set("notifications", "mine");
  EXPECT_EQ(check(&newConfig), 0);

  EXPECT_EQ(mask_, std::uint32_t(kChangeNewConfig | kChangeApplied));
  const Value doc = local();
  EXPECT_EQ(*doc.findString("vornAddr"), "10.0.0.50");
  EXPECT_EQ(*doc.find("migratedVersion"), Value::integer(2));
  EXPECT_EQ(*doc.find("notifications"), stringArray({"admin@example.test"}));
  EXPECT_EQ(doc.find("sharedSecret"), nullptr);
  EXPECT_EQ(doc.find("configIsNew"), nullptr);
  EXPECT_EQ(newConfig.find("sharedSecret"), nullptr) << "the caller's document is the one saved";
  EXPECT_EQ(file(".auth_secret"), kSecret);
  EXPECT_EQ(modes.secretModes, std::vector<mode_t>{0600});

  // A new document without a secret keeps the file the check logged in with.
  publishChange([](Value&, Value&) {});
  newConfig = memberDocument(stringArray({kUrl1}), nullptr);
  EXPECT_EQ(check(&newConfig), 0);
  EXPECT_EQ(mask_ & kChangeApplied, std::uint32_t(kChangeApplied));
  EXPECT_EQ(file(".auth_secret"), kSecret);
}

TEST_F(ChangeApplyTest, AJoinWithNameServersOnlyContactsNoDirectory) {
  Value loaded;
  loaded.set("vornAddr", "10.0.0.50");
  memberWith("CLIENT", loaded);
  machine_.sandbox().writeFile(vornFile(".auth_secret"), "old", 0644);

  Value newConfig;
  newConfig.set("sanName", kSanName);
  newConfig.set("sharedSecret", kSecret);
  newConfig.set("fsports", "ports\n");
  Value nameserver;
  nameserver.set("addr", "10.0.0.7");
  nameserver.set("uuid", kMemberUUID);
  Array nameservers{nameserver, Value("10.0.0.8")};
  newConfig.set("fsnameservers", Value(nameservers));
  Value controllers;
  controllers.set(kMemberUUID, controllerEntry("member.example.test", "10.0.0.7"));
  newConfig.set("controllers", controllers);
  const std::string server = "srv.example.test";

  EXPECT_EQ(checkSanConfigChangeWithServer(&server, &mask_, &newConfig), 0);

  EXPECT_TRUE(recorder().openedNodes.empty());
  EXPECT_EQ(directory_->callCount(DirectoryOperation::kOpenNode), 0u);
  EXPECT_EQ(mask_, std::uint32_t(kChangeNewConfig | kChangeApplied | kChangeRole));
  const Value doc = local();
  EXPECT_EQ(*doc.findString("role"), "CONTROLLER");
  EXPECT_EQ(doc.find("vornAddr"), nullptr) << "not carried over on this path";
  Value ipMap;
  ipMap.set("10.0.0.7", "member.example.test");
  EXPECT_EQ(*doc.find("controllerIPMap"), ipMap);
  EXPECT_EQ(doc.find("sharedSecret"), nullptr);
  EXPECT_EQ(doc.find("configIsNew"), nullptr);
  EXPECT_EQ(file(".auth_secret"), kSecret);
  EXPECT_EQ(machine_.sandbox().fileMode(vornFile(".auth_secret")), 0600u);
  EXPECT_EQ(file("fsnameservers"), "10.0.0.7\n10.0.0.8\n");
  EXPECT_EQ(file("fsports"), "ports\n");
  EXPECT_EQ(unloads(), 0u);
}

TEST_F(ChangeApplyTest, AFailedSaveReturns22AndKeepsItsBits) {
  memberWith("CONTROLLER");
  publishChange([](Value&, Value&) {});
  FailingSaveEnv failing(&machine_.env());
  ScopedEnv scoped(&failing);
  EXPECT_EQ(check(), 22);
  EXPECT_EQ(mask_, std::uint32_t(kChangeApplied | kChangeControllerToClient));
  EXPECT_EQ(*local().findString("sanRevision"), kRevision1) << "the next check tries again";
  EXPECT_EQ(file("fsports"), "FsmPortRange 50000-50100\n") << "side files are not rolled back";
}

TEST_F(ChangeApplyTest, HostileShapesInThePublishedConfiguration) {
  memberWith("CLIENT");
  machine_.sandbox().writeFile(vornFile("Scratch.cfgp"), "kept");
  machine_.sandbox().writeFile(vornFile("fsmlist"), "Scratch . 0\n");
  publishChange([](Value& globals, Value& volumes) {
    volumes = Value("not a dictionary");
    globals.set("controllers", stringArray({"x"}));
    globals.set("fsnameservers", "10.0.0.1");
    globals.set("fsports", Value::integer(5));
    globals.set("primaryZombie", Value::integer(1));
  });
  EXPECT_EQ(check(), 0);
  EXPECT_EQ(*local().findString("role"), "CLIENT");
  EXPECT_EQ(*local().find("controllerIPMap"), Value::dictionary());
  EXPECT_EQ(file("Scratch.cfgp"), "kept") << "volumes that are no dictionary touch no volume file";
  EXPECT_EQ(file("fsmlist"), "Scratch . 0\n");
}

TEST_F(ChangeApplyTest, EveryFileIsOldOrNewWhateverWriteFails) {
  Value published = publishedConfig(stringArray({kUrl1, kUrl2}), kRevision2);
  globalsOf(published).set("certSetRevision", kCertSet1);
  publishConfig(published);
  auto prepare = [](MemoryMachine& m) {
    ScopedEnv use(&m.env());
    Value doc = memberDocument(stringArray({kUrl1, kUrl2}), "CONTROLLER", kRevision1);
    ASSERT_TRUE(saveConfigPlist(doc));
    m.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
    m.sandbox().writeFile(vornFile("fsports"), "old ports\n");
    m.sandbox().writeFile(vornFile("fsnameservers"), "10.9.9.9\n");
    m.sandbox().writeFile(vornFile("Old.cfgp"), "<plist/>");
    m.sandbox().writeFile(vornFile("Scratch.cfgp"), "<plist>old</plist>");
    m.sandbox().writeFile(vornFile("fsmlist"), "Old . 0\n");
  };
  // One clean run counts the steps and gives the new state.
  MemoryMachine clean(directory_, kMemberUUID);
  prepare(clean);
  const FileSnapshot before = snapshotFiles(clean.sandbox().root());
  int steps = 0;
  {
    FaultEnv counting(&clean.env());
    ScopedEnv use(&counting);
    ASSERT_EQ(checkSanConfigChange(&mask_, nullptr), 0);
    steps = counting.steps();
  }
  const FileSnapshot after = snapshotFiles(clean.sandbox().root());
  ASSERT_GT(steps, 10);
  ASSERT_FALSE(differences(before, after).empty());

  for (int k = 1; k <= steps; ++k) {
    for (bool powerLoss : {false, true}) {
      SCOPED_TRACE("step " + std::to_string(k) + (powerLoss ? " power loss" : " fails"));
      MemoryMachine m(directory_, kMemberUUID);
      prepare(m);
      FaultEnv faults(&m.env());
      {
        ScopedEnv use(&faults);
        if (powerLoss) {
          faults.crashAfterSteps(k - 1);
        } else {
          faults.failStep(k, EIO);
        }
        checkSanConfigChange(&mask_, nullptr);
        if (powerLoss) {
          ASSERT_EQ(faults.crash(), 0);
        }
      }
      EXPECT_EQ(neitherOldNorNew(before, after, snapshotFiles(m.sandbox().root())),
                std::vector<std::string>{});
    }
  }
}

TEST_F(ChangeApplyTest, TheSecretReachesNoLogAndNoOtherFile) {
  LogCapture logs;
  publishChange([](Value&, Value&) {});
  Value newConfig = memberDocument(stringArray({kUrl1}), nullptr);
  newConfig.set("sharedSecret", kSecret);
  ASSERT_EQ(check(&newConfig), 0);  // a join
  publishChange([](Value& globals, Value&) { globals.set("ownerName", "Someone Else"); });
  ASSERT_EQ(check(), 0);  // a change
  Value again = memberDocument(stringArray({kUrl1}), nullptr, nullptr);
  again.set("sanRevision", *local().findString("sanRevision"));
  again.set("sharedSecret", kSecret);
  ASSERT_EQ(check(&again), 0);  // a join at the same revision
  ASSERT_EQ(mask_, std::uint32_t(kChangeNewConfig));

  for (const std::string& line : logs.texts()) {
    EXPECT_EQ(line.find(kSecret), std::string::npos) << line;
  }
  EXPECT_TRUE(logs.contains("********"));
  EXPECT_EQ(filesContaining(snapshotFiles(machine_.sandbox().root()), kSecret),
            std::vector<std::string>{"Library/Preferences/Vorn/.auth_secret"});
}

TEST_F(ChangeApplyTest, MembersInOneProcessKeepTheirOwnIdentityAndFiles) {
  publishChange([](Value&, Value&) {});
  MemoryMachine controller(directory_, kControllerUUID);  // (its sandbox becomes current)
  auto join = [&](MemoryMachine& m, std::uint32_t* mask) {
    ScopedEnv use(&m.env());
    Value newConfig = memberDocument(stringArray({kUrl1}), nullptr);
    newConfig.set("sharedSecret", kSecret);
    return checkSanConfigChange(mask, &newConfig);
  };
  std::uint32_t controllerMask = 0;
  ASSERT_EQ(join(machine_, &mask_), 0);
  ASSERT_EQ(join(controller, &controllerMask), 0);

  {
    ScopedEnv use(&machine_.env());
    EXPECT_EQ(*local().findString("role"), "CLIENT");
    EXPECT_EQ(file("fsmlist"), "Scratch . 0\n");
  }
  {
    ScopedEnv use(&controller.env());
    EXPECT_EQ(*loadConfigPlist()->findString("role"), "CONTROLLER");
    EXPECT_EQ(controller.sandbox().readFile(vornFile("fsmlist")), "Projects . 0\n");
  }
  EXPECT_EQ(recorder().countOf("qmadmin -e start Projects"), 1u);
  EXPECT_EQ(controller.processes().countOf("qmadmin -e start Projects"), 1u);
}

}  // namespace
}  // namespace kolt::testing
