// The local document: loading, durable saving, the three questions answered
// from it, and the host-UUID cache.
#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <set>
#include <thread>

#include "fixtures/fault_env.h"
#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "kolt/local_config.h"

namespace kolt {
namespace {

using testing::FaultEnv;
using testing::LogCapture;
using testing::LogLine;
using testing::Sandbox;

constexpr std::array<std::uint8_t, 16> kHostBytes = {
    0x4c, 0x4c, 0x45, 0x44, 0x00, 0x42, 0x35, 0x10, 0x80, 0x52, 0xb3, 0xc0, 0x4f, 0x4e, 0x32, 0xab};
constexpr const char* kHostUUID = "4C4C4544-0042-3510-8052-B3C04F4E32AB";

// A binary property list of one top-level container holding two strings:
// a dictionary {first: second} or an array [first, second].
std::string binaryList(bool dictionary, const std::string& first, const std::string& second) {
  std::string out = "bplist00";
  std::vector<std::size_t> offsets;
  offsets.push_back(out.size());
  out += static_cast<char>(dictionary ? 0xD1 : 0xA2);
  out += '\x01';
  out += '\x02';
  for (const std::string& s : {first, second}) {
    offsets.push_back(out.size());
    out += static_cast<char>(0x50 | s.size());  // ASCII string, length < 15
    out += s;
  }
  const std::size_t tableOffset = out.size();
  for (std::size_t o : offsets) out += static_cast<char>(o);
  const char trailer[32] = {
      0, 0, 0, 0, 0, 0, 1, 1, 0, 0, 0, 0, 0, 0, 0, 3,
      0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, static_cast<char>(tableOffset)};
  out.append(trailer, sizeof trailer);
  return out;
}

Value sampleDocument() {
  Value doc;
  doc.set("sanName", Value("Studio SAN"));
  doc.set("sanUUID", Value("1F0C6A52-9D7B-4C3E-8E1A-2B3C4D5E6F70"));
  doc.set("role", Value("CONTROLLER"));
  doc.set("vornAddr", Value("10.0.0.7"));
  doc.set("sanState", Value("active"));
  doc.set("migratedVersion", Value::integer(2));
  doc.set("enableQuerixServer", Value::boolean(true));
  doc.set("sanConfigURLs", Value(Array{Value("ldap://10.0.0.7/"), Value("ldap://10.0.0.8/")}));
  Value ipMap;
  ipMap.set("10.0.0.7", Value("mdc-1"));
  doc.set("controllerIPMap", ipMap);
  doc.set("notifications",
          Value(Array{Value::real(0.25), Value::integer(-9), Value::date(700000000),
                      Value::data(std::string("\0\xff", 2))}));
  doc.set("ownerName", Value("Zoë <admin> & \"ops\""));
  return doc;
}

class LocalDocumentTest : public ::testing::Test {
 protected:
  void SetUp() override {
    // The codec lands separately; until then nothing here can run.
    if (!writeXmlPropertyList(Value::dictionary())) GTEST_SKIP() << "property-list codec missing";
  }
  Sandbox box_;
};

TEST_F(LocalDocumentTest, WhatIsNotADictionaryDocumentLoadsAsNothing) {
  errno = 0;
  EXPECT_FALSE(loadConfigPlist().has_value());
  EXPECT_EQ(errno, ENOENT);
  const std::pair<const char*, std::string> cases[] = {
      {"empty", ""},
      {"array root",
       "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<array>\n\t<string>"
       "a</string>\n</array>\n</plist>\n"},
      {"string root", "<plist version=\"1.0\"><string>role</string></plist>"},
      {"binary array root", binaryList(false, "role", "CONTROLLER")},
      {"garbage", "\x89PNG\r\n\x1a\n not a property list"},
      {"truncated", "<?xml version=\"1.0\"?><plist version=\"1.0\"><dict><key>role</key>"},
  };
  for (const auto& [what, bytes] : cases) {
    box_.writeFile(kConfigPlistPath, bytes);
    errno = 0;
    EXPECT_FALSE(loadConfigPlist().has_value()) << what;
    EXPECT_EQ(errno, EINVAL) << what;
  }
  box_.removeFile(kConfigPlistPath);
  box_.makeDirectory(kConfigPlistPath);
  EXPECT_FALSE(loadConfigPlist().has_value());
  EXPECT_NE(errno, 0);
}

TEST_F(LocalDocumentTest, ABinaryDocumentLoads) {
  box_.writeFile(kConfigPlistPath, binaryList(true, "role", "CONTROLLER"));
  const std::optional<Value> doc = loadConfigPlist();
  ASSERT_TRUE(doc.has_value());
  EXPECT_TRUE(configPlistIsController(*doc));
}

TEST_F(LocalDocumentTest, ASavedDocumentLoadsBackEqualAsAnXmlFile) {
  const Value doc = sampleDocument();
  ASSERT_TRUE(saveConfigPlist(doc));
  const std::optional<Value> loaded = loadConfigPlist();
  ASSERT_TRUE(loaded.has_value());
  EXPECT_EQ(*loaded, doc);
  const std::string text = *box_.readFile(kConfigPlistPath);
  EXPECT_EQ(text.rfind("<?xml", 0), 0u);
  EXPECT_NE(text.find("<plist version=\"1.0\">"), std::string::npos);
  EXPECT_EQ(box_.fileMode(kConfigPlistPath), 0644u);
  EXPECT_EQ(box_.listNames(kVornDirectory), std::vector<std::string>{"config.plist"});
}

TEST_F(LocalDocumentTest, ADocumentHoldingTheSecretIsReadableByItsOwnerOnly) {
  Value doc = sampleDocument();
  doc.set("sharedSecret", Value("correct horse battery staple"));
  ASSERT_TRUE(saveConfigPlist(doc));
  EXPECT_EQ(box_.fileMode(kConfigPlistPath), 0600u);
  doc.erase("sharedSecret");
  ASSERT_TRUE(saveConfigPlist(doc));
  EXPECT_EQ(box_.fileMode(kConfigPlistPath), 0644u);
}

TEST_F(LocalDocumentTest, SavingIntoAMissingDirectoryFails) {
  box_.removeFile("/Library/Preferences/Vorn");
  ASSERT_FALSE(box_.exists("/Library/Preferences/Vorn"));
  EXPECT_FALSE(saveConfigPlist(sampleDocument()));
}

TEST_F(LocalDocumentTest, AFailedSaveAtAnyStepLeavesThePreviousDocumentReadable) {
  Value before = sampleDocument();
  ASSERT_TRUE(saveConfigPlist(before));
  Value after = before;
  after.set("sanRevision", Value("8E6F3C1A-0000-4000-8000-000000000001"));
  after.set("role", Value("CLIENT"));

  FaultEnv counter(&box_.env());
  {
    ScopedEnv scoped(&counter);
    ASSERT_TRUE(saveConfigPlist(before));
  }
  const int steps = counter.steps();
  ASSERT_GE(steps, 6);
  for (int k = 1; k <= steps; ++k) {
    SCOPED_TRACE("failing step " + std::to_string(k));
    ASSERT_TRUE(saveConfigPlist(before));
    FaultEnv env(&box_.env());
    env.failStep(k, EIO);
    {
      ScopedEnv scoped(&env);
      EXPECT_FALSE(saveConfigPlist(after));
    }
    const std::optional<Value> loaded = loadConfigPlist();
    ASSERT_TRUE(loaded.has_value());
    // Only the last step (the directory sync) comes after the rename.
    EXPECT_EQ(*loaded, k == steps ? after : before);
    EXPECT_EQ(box_.listNames(kVornDirectory), std::vector<std::string>{"config.plist"});
  }
}

TEST_F(LocalDocumentTest, PowerLossDuringASaveLeavesTheOldOrTheNewDocument) {
  const Value before = sampleDocument();
  Value after = before;
  after.set("sanState", Value("dead"));
  int steps = 0;
  {
    ASSERT_TRUE(saveConfigPlist(before));
    FaultEnv counter(&box_.env());
    ScopedEnv scoped(&counter);
    ASSERT_TRUE(saveConfigPlist(after));
    steps = counter.steps();
  }
  for (int k = 0; k <= steps; ++k) {
    SCOPED_TRACE("power lost after step " + std::to_string(k));
    ASSERT_TRUE(saveConfigPlist(before));
    FaultEnv env(&box_.env());
    env.crashAfterSteps(k);
    bool saved;
    {
      ScopedEnv scoped(&env);
      saved = saveConfigPlist(after);
    }
    ASSERT_EQ(env.crash(), 0);
    const std::optional<Value> loaded = loadConfigPlist();
    ASSERT_TRUE(loaded.has_value());
    EXPECT_TRUE(*loaded == before || *loaded == after);
    // A save that reported success survives the power loss.
    if (saved) {
      EXPECT_EQ(*loaded, after);
    }
  }
}

TEST(LocalDocumentQuestions, ControllerIsExactlyTheUpperCaseRole) {
  Value doc;
  EXPECT_FALSE(configPlistIsController(doc));
  for (const char* role : {"controller", "Controller", "CONTROLLER ", "CLIENT", ""}) {
    doc.set("role", Value(role));
    EXPECT_FALSE(configPlistIsController(doc)) << role;
  }
  doc.set("role", Value::integer(1));
  EXPECT_FALSE(configPlistIsController(doc));
  doc.set("role", Value("CONTROLLER"));
  EXPECT_TRUE(configPlistIsController(doc));
  EXPECT_FALSE(configPlistIsController(Value(Array{Value("CONTROLLER")})));
}

TEST(LocalDocumentQuestions, NoDocumentIsEverAMaster) {
  Value doc;
  EXPECT_FALSE(configPlistIsMaster(doc));
  doc.set("role", Value("CONTROLLER"));
  doc.set("master", Value::boolean(true));
  EXPECT_FALSE(configPlistIsMaster(doc));
}

class ZombieTest : public ::testing::Test {
 protected:
  ZombieTest() : env_(&box_.env()), scoped_(&env_) { env_.fakeHardwareUUID(kHostBytes); }
  Sandbox box_;
  FaultEnv env_;
  ScopedEnv scoped_;
};

TEST_F(ZombieTest, NeedsActivationMakesAZombieWhateverThePrimaryZombie) {
  Value doc;
  doc.set("needsActivation", Value::boolean(true));
  EXPECT_TRUE(configPlistIsZombie(doc));
  for (const char* primary : {"", "00000000-0000-0000-0000-000000000000", kHostUUID, "junk"}) {
    doc.set("primaryZombie", Value(primary));
    EXPECT_TRUE(configPlistIsZombie(doc)) << primary;
  }
  doc.set("primaryZombie", Value::integer(5));
  EXPECT_TRUE(configPlistIsZombie(doc));
  doc.set("needsActivation", Value::integer(1));  // a number's truth value counts
  EXPECT_TRUE(configPlistIsZombie(doc));
}

TEST_F(ZombieTest, PrimaryZombieMatchesTheHostUUIDIgnoringCase) {
  Value doc;
  EXPECT_FALSE(configPlistIsZombie(doc));
  doc.set("needsActivation", Value::boolean(false));
  EXPECT_FALSE(configPlistIsZombie(doc));
  doc.set("primaryZombie", Value("4c4c4544-0042-3510-8052-b3c04f4e32ab"));
  EXPECT_TRUE(configPlistIsZombie(doc));
  doc.set("primaryZombie", Value(kHostUUID));
  EXPECT_TRUE(configPlistIsZombie(doc));
  doc.set("primaryZombie", Value("4C4C4544-0042-3510-8052-B3C04F4E32AC"));
  EXPECT_FALSE(configPlistIsZombie(doc));
  doc.set("primaryZombie", Value("4C4C4544-0042-3510-8052-B3C04F4E32AB "));
  EXPECT_FALSE(configPlistIsZombie(doc));
  doc.set("primaryZombie", Value::data(kHostUUID));  // not a string
  EXPECT_FALSE(configPlistIsZombie(doc));
}

TEST(HostUUID, IsTheHardwareUUIDInUpperCaseAskedForOnce) {
  Sandbox box;
  FaultEnv env(&box.env());
  env.fakeHardwareUUID(kHostBytes);
  ScopedEnv scoped(&env);
  const std::string& first = getOurUUID();
  EXPECT_EQ(first, kHostUUID);
  EXPECT_EQ(first.size(), 36u);
  EXPECT_EQ(&getOurUUID(), &first);
  fillInOurUUID();
  EXPECT_EQ(env.hardwareUUIDCalls(), 1);
}

TEST(HostUUID, APlatformThatCannotTellGivesTheZeroUUIDAndALogLine) {
  Sandbox box;
  FaultEnv env(&box.env());
  env.failHardwareUUID(EIO);
  ScopedEnv scoped(&env);
  LogCapture capture;
  EXPECT_EQ(getOurUUID(), kZeroUUID);
  EXPECT_EQ(getOurUUID(), "00000000-0000-0000-0000-000000000000");
  EXPECT_EQ(capture.lines(), (std::vector<LogLine>{{13, "fillInOurUUID returned error 5"}}));
  EXPECT_EQ(env.hardwareUUIDCalls(), 1);
}

TEST(HostUUID, APartlyFilledAnswerOfAFailingPlatformIsNotUsed) {
  // A platform call that scribbles on its output and then fails.
  class Scribbling : public EnvWrapper {
   public:
    using EnvWrapper::EnvWrapper;
    int hardwareUUID(std::array<std::uint8_t, 16>* uuid) override {
      uuid->fill(0xee);
      return EPERM;
    }
  };
  Sandbox box;
  Scribbling env(&box.env());
  ScopedEnv scoped(&env);
  LogCapture capture;
  EXPECT_EQ(getOurUUID(), kZeroUUID);
  EXPECT_TRUE(capture.contains("fillInOurUUID returned error 1"));
}

TEST(HostUUID, ThreadsRacingForTheFirstFillAskThePlatformOnce) {
  // A slow platform widens the window in which threads would each fill.
  class SlowUUID : public FaultEnv {
   public:
    using FaultEnv::FaultEnv;
    int hardwareUUID(std::array<std::uint8_t, 16>* uuid) override {
      std::this_thread::sleep_for(std::chrono::milliseconds(30));
      return FaultEnv::hardwareUUID(uuid);
    }
  };
  Sandbox box;
  SlowUUID env(&box.env());
  env.fakeHardwareUUID(kHostBytes);
  ScopedEnv scoped(&env);
  constexpr int kThreads = 8;
  std::atomic<int> ready{0};
  std::vector<std::string> answers(kThreads);
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&, i] {
      ++ready;
      while (ready.load() < kThreads) {
      }
      answers[i] = getOurUUID();
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(env.hardwareUUIDCalls(), 1);
  EXPECT_EQ(std::set<std::string>(answers.begin(), answers.end()),
            std::set<std::string>{kHostUUID});
}

TEST(HostUUID, ComesFromTheSandboxedMachinesOwnFiles) {
  Sandbox box;
  box.setHardwareUUID("4c4c4544-0042-3510-8052-b3c04f4e32ab");
  EXPECT_EQ(getOurUUID(), kHostUUID);
  // Each simulated machine (Env) has its own identity.
  Sandbox other;
  other.writeFile("/etc/machine-id", "0123456789abcdef0123456789abcdef\n");
  EXPECT_EQ(getOurUUID(), "01234567-89AB-CDEF-0123-456789ABCDEF");
}

}  // namespace
}  // namespace kolt
