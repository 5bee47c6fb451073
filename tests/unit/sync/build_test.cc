// The controller-side build against an in-memory directory: what a first
// build publishes, what makes a later build publish and what does not, a new
// controller, the alias file, dead and foreign records, its own errors and
// its string forms.
#include "kolt/build.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <functional>
#include <iterator>

#include "config/hosted_volume_list.h"
#include "fixtures/log_capture.h"
#include "kolt/controller_helpers.h"
#include "unit/sync/build_world.h"

namespace kolt {
namespace {

using namespace testing::build_world;
using testing::LogCapture;
using testing::StderrCapture;

constexpr const char* kZeroUUID = "00000000-0000-0000-0000-000000000000";
constexpr double kNine = 700000000;

std::string stringAt(const Value& v, std::string_view key) {
  const std::string* s = v.findString(key);
  return s ? *s : "<absent>";
}

bool isCanonicalUUID(const std::string& s) {
  if (s.size() != 36) return false;
  for (std::size_t i = 0; i < s.size(); ++i) {
    const bool dash = i == 8 || i == 13 || i == 18 || i == 23;
    if (dash ? s[i] != '-'
             : !std::isxdigit(static_cast<unsigned char>(s[i])) || std::islower(s[i])) {
      return false;
    }
  }
  return true;
}

Value controllerEntry(const std::string& host, const std::string& address) {
  Value e;
  e.set("hostName", host);
  e.set("IPAddress", address);
  return e;
}

Value volumeEntry(const std::string& marker, std::vector<std::string> controllers) {
  Value e;
  Value config;
  config.set("marker", marker);
  e.set("config", config);
  e.set("mtime", Value::date(kNine));
  Array list;
  for (auto& c : controllers) list.emplace_back(c);
  e.set("controllers", Value(std::move(list)));
  return e;
}

// A record published earlier by another controller (kOtherUUID at 10.1.2.9).
Value recordOfAnotherController() {
  Value record = newVornConfig();
  Value& g = *record.find("globals");
  g.set("revision", "11111111-2222-3333-4444-555555555555");
  g.set("certSetRevision", "66666666-2222-3333-4444-555555555555");
  g.set("sanName", kSanName);
  g.set("sanUUID", kSanUUID);
  g.set("sanState", "active");
  g.set("sharedSecret", kSecret);
  g.set("controllers",
        Value(Dictionary::fromEntries({{kOtherUUID, controllerEntry("ctrl-b", "10.1.2.9")}})));
  Value& volumes = *record.find("volumes");
  volumes.set("Archive", volumeEntry("archive", {kOtherUUID}));
  volumes.set("Scratch", volumeEntry("scratch", {kOtherUUID}));
  return record;
}

class BuildTest : public ::testing::Test {
 protected:
  BuildWorld world_;
  LogCapture logs_;
};

// --- A first build and a build with nothing changed ---------------------------

TEST_F(BuildTest, FirstBuildOfAnInitializingControllerCreatesAndPublishesTheRecord) {
  ASSERT_EQ(world_.build(), 0);

  const std::string user = ldapSanUserNameForName(kSanName);
  EXPECT_TRUE(world_.directory->passwordMatches(user, kSecret));
  EXPECT_EQ(world_.directory->members(ldapSanConfNameForName(kSanName)),
            std::vector<std::string>{user});
  const Value g = world_.globals();
  EXPECT_EQ(stringAt(g, "sanName"), kSanName);
  EXPECT_EQ(stringAt(g, "sanUUID"), kSanUUID);
  EXPECT_EQ(stringAt(g, "sanState"), "active");
  EXPECT_EQ(stringAt(g, "sharedSecret"), kSecret);
  EXPECT_EQ(stringAt(g, "fsports"), "MinPort 2000\n");
  EXPECT_EQ(stringAt(g, "ownerName"), "Storage Team");
  EXPECT_EQ(stringAt(g, "sanAuthMethod"), "auth_secret");
  EXPECT_TRUE(*g.find("sanConfigURLs") == Value(Array{Value("ldap://10.1.2.3")}));
  EXPECT_EQ(g.find("notifications"), nullptr);
  EXPECT_TRUE(*g.find("controllers") ==
              Value(Dictionary::fromEntries({{kOurUUID, controllerEntry("ctrl-a", "10.1.2.3")}})));
  Value ns;
  ns.set("addr", "10.1.2.3");
  ns.set("uuid", kOurUUID);
  EXPECT_TRUE(*g.find("fsnameservers") == Value(Array{ns}));
  EXPECT_TRUE(isCanonicalUUID(stringAt(g, "revision")));
  EXPECT_NE(stringAt(g, "revision"), kZeroUUID);
  EXPECT_TRUE(isCanonicalUUID(stringAt(g, "certSetRevision")));
  EXPECT_NE(stringAt(g, "certSetRevision"), kZeroUUID);

  const Value local = world_.local();
  EXPECT_EQ(stringAt(local, "sanState"), "active");
  EXPECT_EQ(stringAt(local, "sanRevision"), stringAt(g, "revision"));
  EXPECT_TRUE(logs_.contains("We are a new controller inside of buildGlobalConfig"));
  EXPECT_TRUE(logs_.contains("New config time"));
}

TEST_F(BuildTest, BuildWithNothingChangedWritesNothingToTheDirectory) {
  // A volume converted from a source whose date has a fraction: the record
  // keeps whole seconds, the file does not.
  world_.sandbox.writeFile(kFsmlistPath, "Scratch . 0\n");
  std::ifstream sample(std::string(KOLT_SOURCE_DIR) + "/tests/fixtures/volumes/Scratch.cfgx");
  world_.sandbox.writeFile(kVornDir + "Scratch.cfgx",
                           std::string(std::istreambuf_iterator<char>(sample), {}));
  world_.sandbox.setModificationTime(kVornDir + "Scratch.cfgx", kNine + 0.625);
  ASSERT_EQ(world_.build(), 0);
  const std::string revision = world_.revision();
  const std::optional<std::string> bytes = world_.publishedBytes();
  const std::size_t writes = world_.directoryWrites();
  ASSERT_TRUE(world_.published()->find("volumes")->find("Scratch"));
  ASSERT_FALSE(world_.sandbox.exists(kVornDir + "Scratch.cfgx"));

  for (int run = 0; run < 2; ++run) {
    // The local revision is stored again even though nothing is published.
    Value local = world_.local();
    local.set("sanRevision", "stale");
    world_.writeLocal(local);
    ASSERT_EQ(world_.build(), 0);
    EXPECT_EQ(world_.directoryWrites(), writes);
    EXPECT_EQ(world_.publishedBytes(), bytes);
    EXPECT_EQ(stringAt(world_.local(), "sanRevision"), revision);
  }
}

TEST_F(BuildTest, WithoutFsportsFileOrKeyNothingIsPublished) {
  world_.sandbox.removeFile(kVornDir + "fsports");
  ASSERT_EQ(world_.build(), 0);
  EXPECT_EQ(world_.globals().find("fsports"), nullptr);
  const std::size_t writes = world_.directoryWrites();
  ASSERT_EQ(world_.build(), 0);
  EXPECT_EQ(world_.directoryWrites(), writes);
}

// --- What publishes ------------------------------------------------------------

struct Change {
  const char* name;
  std::function<void(BuildWorld&)> make;
  std::function<void(const Value& globals, const Value& record)> check;
};

class BuildChangeTest : public ::testing::TestWithParam<int> {};

const std::vector<Change>& changes() {
  static const std::vector<Change> list = {
      {"owner name",
       [](BuildWorld& w) {
         Value d = w.local();
         d.set("ownerName", "Night Shift");
         w.writeLocal(d);
       },
       [](const Value& g, const Value&) { EXPECT_EQ(stringAt(g, "ownerName"), "Night Shift"); }},
      {"removed setting",
       [](BuildWorld& w) {
         Value d = w.local();
         d.erase("ownerEmail");
         w.writeLocal(d);
       },
       [](const Value& g, const Value&) { EXPECT_EQ(g.find("ownerEmail"), nullptr); }},
      {"secret file",
       [](BuildWorld& w) { w.sandbox.writeFile(kVornDir + ".auth_secret", "new-secret", 0600); },
       [](const Value& g, const Value&) { EXPECT_EQ(stringAt(g, "sharedSecret"), "new-secret"); }},
      {"fsports removed", [](BuildWorld& w) { w.sandbox.removeFile(kVornDir + "fsports"); },
       [](const Value& g, const Value&) { EXPECT_EQ(g.find("fsports"), nullptr); }},
      {"host name", [](BuildWorld& w) { w.faults.fakeHostName("ctrl-a-renamed"); },
       [](const Value& g, const Value&) {
         EXPECT_EQ(stringAt(*g.find("controllers")->find(kOurUUID), "hostName"), "ctrl-a-renamed");
       }},
      {"address",
       [](BuildWorld& w) {
         Value d = w.local();
         d.set("vornAddr", "10.1.2.4");
         w.writeLocal(d);
       },
       [](const Value& g, const Value&) {
         EXPECT_EQ(stringAt(*g.find("controllers")->find(kOurUUID), "IPAddress"), "10.1.2.4");
       }},
      {"name servers",
       [](BuildWorld& w) {
         w.sandbox.writeFile(kVornDir + "fsnameservers", "10.1.2.3\n10.1.2.9\n");
       },
       [](const Value& g, const Value&) {
         const Array& list = *g.findArray("fsnameservers");
         ASSERT_EQ(list.size(), 2u);
         EXPECT_EQ(stringAt(list[1], "addr"), "10.1.2.9");
         EXPECT_EQ(list[1].find("uuid"), nullptr);  // no controller has that address
       }},
      {"volume edit",
       [](BuildWorld& w) {
         w.sandbox.writeFile(kFsmlistPath, "Scratch . 0\n");
         Value config;
         config.set("marker", "edited");
         w.sandbox.writeFile(kVornDir + "Scratch.cfgp", *writeXmlPropertyList(config));
         w.sandbox.setModificationTime(kVornDir + "Scratch.cfgp", kNine);
       },
       [](const Value&, const Value& record) {
         EXPECT_EQ(stringAt(*record.find("volumes")->find("Scratch")->find("config"), "marker"),
                   "edited");
       }},
  };
  return list;
}

TEST_P(BuildChangeTest, EachLocalChangePublishesAFreshRevision) {
  const Change& change = changes()[GetParam()];
  SCOPED_TRACE(change.name);
  BuildWorld world;
  ASSERT_EQ(world.build(), 0);
  const std::string revision = world.revision();
  const std::string certSet = stringAt(world.globals(), "certSetRevision");

  change.make(world);
  ASSERT_EQ(world.build(), 0);

  const Value record = *world.published();
  const Value& g = *record.find("globals");
  EXPECT_NE(stringAt(g, "revision"), revision);
  EXPECT_EQ(stringAt(world.local(), "sanRevision"), stringAt(g, "revision"));
  // A controller already in the table keeps the certificate set.
  EXPECT_EQ(stringAt(g, "certSetRevision"), certSet);
  change.check(g, record);
}

INSTANTIATE_TEST_SUITE_P(Changes, BuildChangeTest,
                         ::testing::Range(0, static_cast<int>(changes().size())));

// --- A new controller, migrated members, the alias file --------------------------

TEST_F(BuildTest, NewControllerJoinsEveryVolumeRenewsTheCertificateSetAndWritesItsFiles) {
  world_.seedRecord(recordOfAnotherController());
  Value local = testing::build_world::controllerDocument();
  local.set("sanState", "active");
  world_.writeLocal(local);

  ASSERT_EQ(world_.build(), 0);

  const Value record = *world_.published();
  const Value& g = *record.find("globals");
  EXPECT_NE(stringAt(g, "revision"), "11111111-2222-3333-4444-555555555555");
  EXPECT_NE(stringAt(g, "certSetRevision"), "66666666-2222-3333-4444-555555555555");
  EXPECT_TRUE(isCanonicalUUID(stringAt(g, "certSetRevision")));
  EXPECT_TRUE(*g.find("controllers")->find(kOtherUUID) == controllerEntry("ctrl-b", "10.1.2.9"));
  EXPECT_TRUE(*g.find("controllers")->find(kOurUUID) == controllerEntry("ctrl-a", "10.1.2.3"));
  for (const char* volume : {"Archive", "Scratch"}) {
    EXPECT_TRUE(*record.find("volumes")->find(volume)->find("controllers") ==
                Value(Array{Value(kOtherUUID), Value(kOurUUID)}))
        << volume;
  }
  // The volume update ran for the volumes it now hosts.
  EXPECT_EQ(world_.sandbox.readFile(kFsmlistPath), "Archive . 0\nScratch . 0\n");
  EXPECT_EQ(world_.sandbox.modificationTime(kVornDir + "Archive.cfgp"), kNine);
  EXPECT_EQ(world_.sandbox.waitForToolCalls(2).size(), 2u);
}

TEST_F(BuildTest, MembersOfAnOlderReleaseBecomeControllers) {
  Value local = world_.local();
  Value computer;
  computer.set("uuid", kOtherUUID);
  computer.set("ipAddresses", Value(Array{Value("192.168.0.9"), Value("10.1.2.9")}));
  computer.set("legacyHostName", "old-ctrl");
  Value client;
  client.set("uuid", "C1C1C1C1-1111-4222-8333-444444444444");
  client.set("ipAddresses", Value(Array{Value("10.1.2.77")}));
  client.set("legacyHostName", "client");
  local.set("computers", Value(Array{computer, client}));
  world_.writeLocal(local);
  world_.sandbox.writeFile(kVornDir + "fsnameservers", "10.1.2.3\n10.1.2.9\n");

  ASSERT_EQ(world_.build(), 0);

  const Value& g = world_.globals();
  EXPECT_TRUE(*g.find("controllers")->find(kOtherUUID) == controllerEntry("old-ctrl", "10.1.2.9"));
  EXPECT_EQ(g.find("controllers")->find("C1C1C1C1-1111-4222-8333-444444444444"), nullptr);
  EXPECT_EQ(stringAt(g.findArray("fsnameservers")->at(1), "uuid"), kOtherUUID);
  EXPECT_TRUE(logs_.contains("foundControllers"));
}

TEST_F(BuildTest, AliasFileRetiresTheEarlierIdentity) {
  Value record = recordOfAnotherController();
  record.find("globals")->find("controllers")->set(kOurUUID, controllerEntry("ctrl-a", "10.1.2.3"));
  record.find("volumes")->find("Archive")->set(
      "controllers", Value(Array{Value(kOtherUUID), Value(kOurUUID), Value(kOtherUUID)}));
  world_.seedRecord(record);
  world_.sandbox.writeFile(kFsmlistPath, "Archive . 0\n");
  world_.sandbox.writeFile(kVornDir + "Archive.cfgp",
                           *writeXmlPropertyList(*volumeEntry("archive", {}).find("config")));
  world_.sandbox.setModificationTime(kVornDir + "Archive.cfgp", kNine);
  ASSERT_EQ(world_.build(), 0);
  const Value first = *world_.published();
  ASSERT_EQ(world_.build(), 0);
  EXPECT_TRUE(first == *world_.published());
  const std::string revision = world_.revision();

  // The file holds the earlier UUID in lower case, with a line end. The alias
  // is the only change, and it is published.
  world_.sandbox.writeFile(kVornDir + "uuid", "0b0b0b0b-1111-4222-8333-444444444444\n");
  ASSERT_EQ(world_.build(), 0);
  EXPECT_NE(world_.revision(), revision);

  const Value published = *world_.published();
  const Value& g = *published.find("globals");
  EXPECT_TRUE(*g.find("aliasControllers") == Value(Array{Value(kOtherUUID)}));
  EXPECT_EQ(g.find("controllers")->find(kOtherUUID), nullptr);
  EXPECT_TRUE(*published.find("volumes")->find("Archive")->find("controllers") ==
              Value(Array{Value(kOurUUID)}));
  EXPECT_TRUE(*published.find("volumes")->find("Scratch")->find("controllers") == Value(Array()));
  EXPECT_FALSE(world_.sandbox.exists(kVornDir + "uuid"));
}

TEST_F(BuildTest, AliasFileWithOurOwnUuidOrGarbageIsRemovedAndChangesNothing) {
  ASSERT_EQ(world_.build(), 0);
  const std::size_t writes = world_.directoryWrites();
  for (const std::string& text :
       {std::string(kOurUUID) + "\n", std::string("not a uuid"), std::string("")}) {
    world_.sandbox.writeFile(kVornDir + "uuid", text);
    ASSERT_EQ(world_.build(), 0);
    EXPECT_FALSE(world_.sandbox.exists(kVornDir + "uuid"));
    EXPECT_EQ(world_.directoryWrites(), writes);
    EXPECT_EQ(world_.globals().find("aliasControllers"), nullptr);
  }
}

// --- Dead, bare and foreign records ------------------------------------------------

TEST_F(BuildTest, InitializingControllerReplacesADeadRecord) {
  Value dead = recordOfAnotherController();
  Value& g = *dead.find("globals");
  g.set("sanState", "dead");
  g.set("primaryZombie", kOtherUUID);
  g.erase("controllers");
  g.erase("fsnameservers");
  dead.set("volumes", Value::dictionary());
  world_.seedRecord(dead);

  ASSERT_EQ(world_.build(), 0);

  EXPECT_TRUE(logs_.contains("About to cul old SAN config"));
  EXPECT_EQ(world_.directory->callCount(DirectoryOperation::kDeleteRecord), 2u);
  const Value& fresh = world_.globals();
  EXPECT_EQ(stringAt(fresh, "sanState"), "active");
  EXPECT_EQ(fresh.find("primaryZombie"), nullptr);
  EXPECT_TRUE(*fresh.find("controllers") ==
              Value(Dictionary::fromEntries({{kOurUUID, controllerEntry("ctrl-a", "10.1.2.3")}})));
  EXPECT_TRUE(world_.directory->passwordMatches(ldapSanUserNameForName(kSanName), kSecret));
  EXPECT_EQ(stringAt(world_.local(), "sanState"), "active");
}

TEST_F(BuildTest, ActiveControllerGoesOnWithADeadRecord) {
  Value dead = recordOfAnotherController();
  dead.find("globals")->set("sanState", "dead");
  world_.seedRecord(dead);
  Value local = world_.local();
  local.set("sanState", "active");
  world_.writeLocal(local);

  ASSERT_EQ(world_.build(), 0);

  EXPECT_EQ(world_.directory->callCount(DirectoryOperation::kDeleteRecord), 0u);
  EXPECT_EQ(stringAt(world_.globals(), "sanState"), "dead");
}

TEST_F(BuildTest, RecordsLeftByABuildThatFailedBeforeItsFirstSaveAreFilledAsNew) {
  Value bare = newVornConfig();
  bare.find("globals")->set("sharedSecret", kSecret);
  world_.seedRecord(bare);

  ASSERT_EQ(world_.build(), 0);

  const Value& g = world_.globals();
  EXPECT_EQ(stringAt(g, "sanName"), kSanName);
  EXPECT_EQ(stringAt(g, "sanState"), "active");
  EXPECT_NE(stringAt(g, "revision"), kZeroUUID);
}

TEST_F(BuildTest, NameOrUuidMismatchLeavesDirectoryAndLocalDocumentUnchanged) {
  struct Case {
    const char* key;
    const char* value;
    int code;
    const char* text;
  };
  for (const Case& c :
       {Case{"sanName", "Other SAN", 502, "San name mismatch"},
        Case{"sanUUID", "00000000-0000-4000-8000-000000000BAD", 503, "San UUID mismatch"}}) {
    SCOPED_TRACE(c.text);
    BuildWorld world;
    Value record = recordOfAnotherController();
    record.find("globals")->set(c.key, c.value);
    world.seedRecord(record);
    world.sandbox.writeFile(kVornDir + "uuid", std::string(kOtherUUID) + "\n");
    const auto published = world.publishedBytes();
    const auto local = world.localBytes();

    ErrorSlot error;
    EXPECT_EQ(world.build(&error), c.code);

    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain(), kVornErrorDomain);
    EXPECT_EQ(error->description(), c.text);
    EXPECT_EQ(world.publishedBytes(), published);
    EXPECT_EQ(world.localBytes(), local);
    EXPECT_EQ(world.directoryWrites(), 0u);
    EXPECT_TRUE(world.sandbox.exists(kVornDir + "uuid"));
  }
  EXPECT_TRUE(logs_.contains(
      "buildSanConfig returning error Error Domain=com.orvat.vorn.ErrorDomain Code=502"));
}

// --- The build's own errors ---------------------------------------------------------

TEST_F(BuildTest, OwnErrorsAreLoggedWithTheirCodeAndLeaveTheLocalDocument) {
  struct Case {
    const char* name;
    std::function<void(BuildWorld&)> make;
    int code;
    const char* text;
    bool loggedFirst;    // "buildSanConfig: returnign error code ..."
    bool recordCreated;  // the empty records made before the failing step stay
  };
  const std::vector<Case> cases = {
      {"no document", [](BuildWorld& w) { w.sandbox.removeFile(kVornDir + "config.plist"); }, 2,
       "Unable to open config.plist", true, false},
      {"client",
       [](BuildWorld& w) {
         Value d = w.local();
         d.set("role", "CLIENT");
         w.writeLocal(d);
       },
       22, "System is not a controller", true, false},
      {"dead",
       [](BuildWorld& w) {
         Value d = w.local();
         d.set("sanState", "dead");
         w.writeLocal(d);
       },
       500, "San has been deleted", false, false},
      {"no address",
       [](BuildWorld& w) {
         Value d = w.local();
         d.erase("vornAddr");
         d.set("metadataNetwork", "10.9.0.0/16");
         w.writeLocal(d);
       },
       22, "Unable to determine Vorn IP address", true, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    BuildWorld world;
    LogCapture logs;
    c.make(world);
    const auto local = world.localBytes();
    ErrorSlot error;
    EXPECT_EQ(world.build(&error), c.code);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), c.code);
    EXPECT_EQ(error->description(), c.text);
    EXPECT_EQ(world.localBytes(), local);
    if (c.recordCreated) {
      EXPECT_EQ(world.globals().find("sanName"), nullptr);
    } else {
      EXPECT_FALSE(world.publishedBytes());
    }
    EXPECT_EQ(logs.countStartingWith("buildSanConfig: returnign error code " +
                                     std::to_string(c.code) + " dict "),
              c.loggedFirst ? 1u : 0u);
    EXPECT_EQ(logs.countStartingWith("buildSanConfig returning error "), 1u);
  }
}

TEST_F(BuildTest, AddressComesFromTheMetadataNetworkUnlessOneIsSet) {
  Value local = world_.local();
  local.erase("vornAddr");
  local.set("metadataNetwork", "10.1.0.0/16");
  world_.writeLocal(local);
  world_.faults.fakeInterfaceAddresses(
      {testing::build_world::ipv4("lo0", 10, 1, 9, 9), testing::build_world::ipv4("en0", 10, 1, 2, 3)});

  StderrCapture err;
  ASSERT_EQ(world_.build(), 0);
  EXPECT_EQ(err.finish(), "Found metadata IP '10.1.2.3'\n");

  Value after = world_.local();
  EXPECT_EQ(stringAt(after, "vornAddr"), "10.1.2.3");
  EXPECT_EQ(after.find("metadataNetwork"), nullptr);
  EXPECT_EQ(stringAt(*world_.globals().find("controllers")->find(kOurUUID), "IPAddress"),
            "10.1.2.3");

  // A set address wins, and the network stays.
  after.set("vornAddr", "10.1.2.50");
  after.set("metadataNetwork", "10.1.0.0/16");
  world_.writeLocal(after);
  ASSERT_EQ(world_.build(), 0);
  EXPECT_EQ(stringAt(world_.local(), "metadataNetwork"), "10.1.0.0/16");
  EXPECT_EQ(stringAt(*world_.globals().find("controllers")->find(kOurUUID), "IPAddress"),
            "10.1.2.50");
}

TEST_F(BuildTest, CredentialsAreSetOnARemoteNodeOnly) {
  const std::string remote = "ldap://127.0.0.1";
  const std::string admin = world_.directory->adminName();
  const std::string wrong = "wrong";
  ErrorSlot error;
  EXPECT_EQ(buildSanConfig(&remote, &admin, &wrong, &error), 49);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain(), kDirectoryErrorDomain);
  EXPECT_FALSE(world_.publishedBytes());

  // Anonymous on a remote node: may not write.
  EXPECT_NE(buildSanConfig(&remote, nullptr, nullptr, nullptr), 0);

  const std::string password = world_.directory->adminPassword();
  EXPECT_EQ(buildSanConfig(&remote, &admin, &password, nullptr), 0);
  // On the local node, credentials (even wrong ones) are not used.
  const std::string local = testing::build_world::kLocalNode;
  EXPECT_EQ(buildSanConfig(&local, &admin, &wrong, nullptr), 0);
  EXPECT_EQ(world_.directory->callCount(DirectoryOperation::kSetCredentials), 2u);
}

TEST_F(BuildTest, SecretNeverReachesALogLineOrStandardError) {
  StderrCapture err;
  ASSERT_EQ(world_.build(), 0);
  world_.sandbox.writeFile(kVornDir + ".auth_secret", "second-Secret-77", 0600);
  ASSERT_EQ(world_.build(), 0);
  const std::string stderrText = err.finish();
  ASSERT_TRUE(logs_.contains("buildSanConfig saving config"));
  for (const std::string& line : logs_.texts()) {
    EXPECT_EQ(line.find(kSecret), std::string::npos) << line;
    EXPECT_EQ(line.find("second-Secret-77"), std::string::npos) << line;
  }
  EXPECT_EQ(stderrText.find(kSecret), std::string::npos);
}

// --- String and CF forms ------------------------------------------------------------

TEST_F(BuildTest, StringFormHandsOutAnAllocatedMessageOnFailureAndNullOnSuccess) {
  char* message = reinterpret_cast<char*>(0x1);
  EXPECT_EQ(buildSanConfigC(testing::build_world::kLocalNode, nullptr, nullptr, &message), 0);
  EXPECT_EQ(message, nullptr);

  Value d = world_.local();
  d.set("role", "CLIENT");
  world_.writeLocal(d);
  EXPECT_EQ(buildSanConfigC(testing::build_world::kLocalNode, "user", "password", &message), 22);
  ASSERT_NE(message, nullptr);
  EXPECT_STREQ(message, "System is not a controller");
  std::free(message);

  // Without a place for the message, only the code; a null node is no node.
  EXPECT_EQ(buildSanConfigC(nullptr, nullptr, nullptr, nullptr), 22);
}

TEST_F(BuildTest, CFFormHandsOutTheSameErrorObject) {
  world_.sandbox.removeFile(kVornDir + "config.plist");
  ErrorSlot a, b;
  const std::string node = testing::build_world::kLocalNode;
  EXPECT_EQ(buildSanConfig(&node, nullptr, nullptr, &a), 2);
  EXPECT_EQ(buildSanConfigCF(&node, nullptr, nullptr, &b), 2);
  ASSERT_TRUE(a && b);
  EXPECT_EQ(*a, *b);
  EXPECT_EQ(a->domain(), kPosixErrorDomain);
}

}  // namespace
}  // namespace kolt
