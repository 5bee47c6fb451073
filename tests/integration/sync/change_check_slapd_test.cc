// The change check against two private slapd servers that replicate each
// other: joins and changes, the role's moves, a dead SAN, failover and
// replication, failures half-way, and the shared secret. Each member has its
// own sandbox root; the stand-in tools record what was started.
#include <gtest/gtest.h>

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <functional>
#include <thread>

#include "fixtures/fault_env.h"
#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "fixtures/slapd.h"
#include "kolt/change_check.h"
#include "kolt/controller_helpers.h"
#include "platform/directory/trust_store.h"
#include "unit/sync/change_check_support.h"

namespace kolt::testing {
namespace {

namespace fs = std::filesystem;

// One member machine: its own root, host UUID and stand-in tools.
class Member {
 public:
  // `withTools`: install the stand-ins (a member whose processes a
  // ProcessRecorder takes needs none).
  explicit Member(const std::string& hostUUID, bool withTools = true) {
    sandbox_.setHardwareUUID(hostUUID);
    if (withTools) {
      sandbox_.installTool("vornctl");
      sandbox_.installTool("qmadmin");
    }
  }
  Sandbox& sandbox() { return sandbox_; }
  Env& env() { return sandbox_.env(); }
  FileSnapshot files() const { return snapshotFiles(sandbox_.root()); }
  // The member's files, without the stand-ins' own records.
  FileSnapshot vornFiles() const {
    FileSnapshot all = files();
    std::erase_if(all, [](const auto& entry) { return entry.first.rfind("Library/", 0) != 0; });
    return all;
  }
  std::optional<std::string> file(const std::string& name) const {
    return sandbox_.readFile(vornFile(name));
  }
  void trust(const std::string& caPath) {
    const std::string dir = sandbox_.root() + std::string(kTrustStoreDirectory);
    fs::create_directories(dir);
    fs::copy_file(caPath, dir + "/ca.pem", fs::copy_options::overwrite_existing);
  }

 private:
  Sandbox sandbox_;
};

// A node that runs a hook before its first query (to stop the server in the
// middle of a check).
class HookedNode : public DirectoryNode {
 public:
  HookedNode(std::unique_ptr<DirectoryNode> node, std::function<void()> beforeQuery)
      : node_(std::move(node)), beforeQuery_(std::move(beforeQuery)) {}
  const std::string& nodeName() const override { return node_->nodeName(); }
  bool setCredentials(std::string_view type, const std::string& name, const std::string& password,
                      ErrorSlot* error) override {
    return node_->setCredentials(type, name, password, error);
  }
  std::optional<std::vector<std::unique_ptr<DirectoryRecord>>> queryRecords(
      RecordType type, const std::string& name, Attribute attribute, std::size_t max,
      ErrorSlot* error) override {
    if (beforeQuery_) std::exchange(beforeQuery_, nullptr)();
    return node_->queryRecords(type, name, attribute, max, error);
  }
  std::unique_ptr<DirectoryRecord> createRecord(
      RecordType type, const std::string& name,
      const std::map<Attribute, std::vector<std::string>>& attributes, ErrorSlot* error) override {
    return node_->createRecord(type, name, attributes, error);
  }
  bool customCall(int code, ErrorSlot* error) override { return node_->customCall(code, error); }

 private:
  std::unique_ptr<DirectoryNode> node_;
  std::function<void()> beforeQuery_;
};

class HookedNodeEnv : public EnvWrapper {
 public:
  HookedNodeEnv(Env* target, std::function<void()> beforeQuery)
      : EnvWrapper(target), beforeQuery_(std::move(beforeQuery)) {}
  std::unique_ptr<DirectoryNode> openDirectoryNode(const std::string& name,
                                                   ErrorSlot* error) override {
    auto node = EnvWrapper::openDirectoryNode(name, error);
    if (!node) return node;
    return std::make_unique<HookedNode>(std::move(node), beforeQuery_);
  }

 private:
  std::function<void()> beforeQuery_;
};

class ChangeCheckSlapdTest : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    std::unique_ptr<Slapd> a, b;
    std::string error;
    if (Slapd::startReplicatingPair(&a, &b, &error)) {
      a_ = a.release();
      b_ = b.release();
    } else {
      startError_ = new std::string(error);
    }
  }
  static void TearDownTestSuite() {
    delete a_;
    delete b_;
    a_ = b_ = nullptr;
  }
  void SetUp() override {
    ASSERT_NE(a_, nullptr) << (startError_ ? *startError_ : "");
    for (Slapd* s : {a_, b_}) {
      if (!s->running()) {
        ASSERT_TRUE(s->restart());
      }
    }
  }

  static Value urls(std::initializer_list<Slapd*> servers) {
    Array list;
    for (Slapd* s : servers) list.emplace_back(s->ldapUrl());
    return Value(std::move(list));
  }
  // Publishes on `server` as its administrator, from a throwaway root.
  static void publishOn(Slapd* server, const Value& config) {
    Sandbox admin;
    ErrorSlot error;
    auto node = currentEnv().openDirectoryNode("/LDAPv3/" + server->ldapUrl(), &error);
    ASSERT_TRUE(node && node->setCredentials(kRecordTypeUsers, server->adminName(),
                                             server->adminPassword(), &error))
        << (error ? error->printed() : "");
    std::string why;
    ASSERT_TRUE(publish(*node, config, &why)) << why;
  }
  static Value joinDocument(const Value& urls) {
    Value document = memberDocument(urls, nullptr);
    document.set("sharedSecret", kSecret);
    return document;
  }
  // Checks until `revision` is applied: replication takes a moment. At most
  // 10 seconds.
  static int checkUntilApplied(Member& m, const std::string& revision, std::uint32_t* mask) {
    ScopedEnv use(&m.env());
    const auto giveUp = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    for (;;) {
      const int rc = checkSanConfigChange(mask, nullptr);
      const std::optional<Value> doc = loadConfigPlist();
      const std::string* applied = doc ? doc->findString("sanRevision") : nullptr;
      if ((rc == 0 && applied != nullptr && *applied == revision) ||
          std::chrono::steady_clock::now() > giveUp) {
        return rc;
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
  }

  // The runs of the vornctl stand-in, once at least `expected` were
  // recorded (it is not waited for), at most 20 seconds.
  static std::size_t unloads(Member& m, std::size_t expected) {
    const auto giveUp = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (m.sandbox().toolCalls("vornctl").size() < expected &&
           std::chrono::steady_clock::now() < giveUp) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return m.sandbox().toolCalls("vornctl").size();
  }

  static Slapd* a_;
  static Slapd* b_;
  static std::string* startError_;
};

Slapd* ChangeCheckSlapdTest::a_ = nullptr;
Slapd* ChangeCheckSlapdTest::b_ = nullptr;
std::string* ChangeCheckSlapdTest::startError_ = nullptr;

TEST_F(ChangeCheckSlapdTest, AMemberJoinsFollowsChangesAndLeavesADeadSan) {
  Value config = publishedConfig(urls({a_, b_}), kRevision1);
  publishOn(a_, config);
  Member member(kMemberUUID);
  ScopedEnv use(&member.env());
  LogCapture logs;
  std::uint32_t mask = 0;

  // The join.
  Value newConfig = joinDocument(urls({a_}));
  ASSERT_EQ(checkSanConfigChange(&mask, &newConfig), 0);
  EXPECT_EQ(mask, std::uint32_t(kChangeNewConfig | kChangeApplied | kChangeRole));
  EXPECT_EQ(member.file(".auth_secret"), kSecret);
  EXPECT_EQ(member.sandbox().fileMode(vornFile(".auth_secret")), 0600u);
  EXPECT_EQ(member.file("fsmlist"), "Scratch . 0\n");
  EXPECT_EQ(member.file("fsnameservers"), "10.0.0.1\n");
  EXPECT_EQ(*loadConfigPlist()->find("sanConfigURLs"), urls({a_, b_})) << "the published URLs";
  EXPECT_EQ(member.sandbox().waitForToolCalls(2).size(), 2u) << "qmadmin starts both volumes";

  // Nothing new: not a byte or a date changes.
  const FileSnapshot unchanged = member.files();
  ASSERT_EQ(checkSanConfigChange(&mask, nullptr), 0);
  EXPECT_EQ(mask, 0u);
  EXPECT_EQ(differences(unchanged, member.files()), std::vector<std::string>{});

  // Made a controller, with a new certificate set: no certificates for it.
  globalsOf(config).set("revision", kRevision2);
  globalsOf(config).set("certSetRevision", kCertSet1);
  globalsOf(config)
      .findDictionary("controllers")
      ->set(kMemberUUID, controllerEntry("member.example.test", "10.0.0.60"));
  publishOn(a_, config);
  ASSERT_EQ(checkSanConfigChange(&mask, nullptr), 0);
  EXPECT_EQ(mask, std::uint32_t(kChangeApplied | kChangeRole));
  EXPECT_EQ(*loadConfigPlist()->findString("role"), "CONTROLLER");
  EXPECT_FALSE(fs::exists(member.sandbox().root() + std::string(kTrustStoreDirectory)));

  // Back to a client, with another certificate set: the profile is unloaded
  // once and the first controller's certificates are trusted.
  globalsOf(config).set("revision", "0F0F0F0F-0000-4000-8000-000000000003");
  globalsOf(config).set("certSetRevision", "CE000000-0000-4000-8000-000000000002");
  globalsOf(config).findDictionary("controllers")->erase(kMemberUUID);
  publishOn(a_, config);
  ASSERT_EQ(checkSanConfigChange(&mask, nullptr), 0);
  EXPECT_EQ(mask, std::uint32_t(kChangeApplied | kChangeControllerToClient));
  ASSERT_EQ(unloads(member, 1), 1u);
  EXPECT_EQ(member.sandbox().toolCalls("vornctl")[0].arguments,
            std::vector<std::string>{"unloadProfile"});
  EXPECT_FALSE(fs::is_empty(member.sandbox().root() + std::string(kTrustStoreDirectory)));

  // The SAN is destroyed: applied, then unloaded.
  {
    Sandbox admin;
    auto node = currentEnv().openDirectoryNode("/LDAPv3/" + a_->ldapUrl(), nullptr);
    ASSERT_TRUE(
        node->setCredentials(kRecordTypeUsers, a_->adminName(), a_->adminPassword(), nullptr));
    const std::string sanName = kSanName;
    ASSERT_EQ(destroyVornConfig(*node, &sanName, nullptr), 0);
  }
  ASSERT_EQ(checkSanConfigChange(&mask, nullptr), 0);
  EXPECT_EQ(mask, std::uint32_t(kChangeApplied));
  EXPECT_EQ(*loadConfigPlist()->findString("sanState"), "dead");
  EXPECT_EQ(unloads(member, 2), 2u);
  EXPECT_FALSE(member.file("fsmlist")) << "a dead SAN hosts no volume";

  // A newcomer joining the dead SAN is saved, then refused.
  Member late("0B0B0B0B-1111-4222-8333-444444444444");
  {
    ScopedEnv useLate(&late.env());
    Value lateConfig = joinDocument(urls({b_}));
    EXPECT_EQ(checkSanConfigChange(&mask, &lateConfig), 500);
    EXPECT_EQ(*loadConfigPlist()->findString("sanState"), "dead");
  }

  // The secret: in ".auth_secret" only, in no log line.
  for (Member* m : {&member, &late}) {
    EXPECT_EQ(filesContaining(m->files(), kSecret),
              std::vector<std::string>{"Library/Preferences/Vorn/.auth_secret"});
  }
  for (const std::string& line : logs.texts()) {
    EXPECT_EQ(line.find(kSecret), std::string::npos) << line;
  }
}

TEST_F(ChangeCheckSlapdTest, AJoinWithNameServersOnlyContactsNoDirectory) {
  Member member(kMemberUUID);
  ScopedEnv use(&member.env());
  LogCapture logs;
  Value newConfig;
  newConfig.set("sanName", kSanName);
  newConfig.set("sharedSecret", kSecret);
  newConfig.set("fsnameservers", stringArray({"10.0.0.7"}));
  std::uint32_t mask = 0;
  EXPECT_EQ(checkSanConfigChange(&mask, &newConfig), 0);
  EXPECT_EQ(mask, std::uint32_t(kChangeNewConfig | kChangeApplied | kChangeRole));
  EXPECT_FALSE(logs.contains("About to get new config"));
  EXPECT_EQ(member.file("fsnameservers"), "10.0.0.7\n");
  EXPECT_EQ(member.file(".auth_secret"), kSecret);
  EXPECT_EQ(loadConfigPlist()->find("sharedSecret"), nullptr);
}

TEST_F(ChangeCheckSlapdTest, AStoppedServerIsPassedOverForTheNext) {
  publishOn(b_, publishedConfig(urls({a_, b_}), kRevision1));
  Member member(kMemberUUID);
  {
    ScopedEnv use(&member.env());
    ASSERT_TRUE(saveConfigPlist(memberDocument(urls({a_, b_}), "CLIENT")));
    member.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  }
  ASSERT_TRUE(a_->stop());
  LogCapture logs;
  std::uint32_t mask = 0;
  EXPECT_EQ(checkUntilApplied(member, kRevision1, &mask), 0);
  EXPECT_EQ(mask & kChangeApplied, std::uint32_t(kChangeApplied));
  EXPECT_TRUE(logs.contains("Unable to contact node " + a_->ldapUrl()));
}

TEST_F(ChangeCheckSlapdTest, AConfigurationSavedOnOneServerIsAppliedFromTheOther) {
  Member first(kMemberUUID);
  Member second("0B0B0B0B-1111-4222-8333-444444444444");
  for (auto [m, server] : {std::pair{&first, b_}, std::pair{&second, a_}}) {
    ScopedEnv use(&m->env());
    ASSERT_TRUE(saveConfigPlist(memberDocument(urls({server}), "CLIENT")));
    m->sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  }
  std::uint32_t mask = 0;
  // Saved on A, read from B...
  publishOn(a_, publishedConfig(urls({a_, b_}), kRevision1));
  EXPECT_EQ(checkUntilApplied(first, kRevision1, &mask), 0);
  EXPECT_EQ(first.file("fsmlist"), "Scratch . 0\n");
  // ... and saved on B, read from A.
  publishOn(b_, publishedConfig(urls({a_, b_}), kRevision2));
  EXPECT_EQ(checkUntilApplied(second, kRevision2, &mask), 0);
  ScopedEnv use(&second.env());
  EXPECT_EQ(*loadConfigPlist()->findString("sanRevision"), kRevision2);
}

TEST_F(ChangeCheckSlapdTest, TheServerNamedByTheCallerIsAskedFirstOverTls) {
  publishOn(a_, publishedConfig(urls({a_, b_}), kRevision1));
  Member member(kMemberUUID, /*withTools=*/false);
  member.trust(a_->caCertificatePath());
  ProcessRecorder recorder(&member.env());
  ScopedEnv use(&recorder);
  Value document = memberDocument(urls({b_}), "CLIENT");
  document.set("certSetRevision", kZeroUUID);  // no certificates to load
  ASSERT_TRUE(saveConfigPlist(document));
  member.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  const std::string server = "127.0.0.1:" + std::to_string(a_->ldapsPort());
  LogCapture logs;
  std::uint32_t mask = 0;
  EXPECT_EQ(checkSanConfigChangeWithServer(&server, &mask, nullptr), 0);
  EXPECT_EQ(mask, std::uint32_t(kChangeApplied));
  EXPECT_EQ(recorder.openedNodes, std::vector<std::string>{"/LDAPv3/ldaps://" + server});
  EXPECT_FALSE(logs.contains("Set Cred returned"));
}

TEST_F(ChangeCheckSlapdTest, FailuresBeforeTheFetchChangeNoFile) {
  publishOn(a_, publishedConfig(urls({a_}), kRevision2));
  Member member(kMemberUUID);
  ScopedEnv use(&member.env());
  ASSERT_TRUE(saveConfigPlist(memberDocument(urls({a_}), "CLIENT", kRevision1)));
  member.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  member.sandbox().writeFile(vornFile("fsmlist"), "Old . 0\n");
  const FileSnapshot before = member.files();
  std::uint32_t mask = 0;

  {
    // The server stops between the bind and the fetch.
    HookedNodeEnv hooked(&member.env(), [] { a_->stop(); });
    ScopedEnv useHooked(&hooked);
    EXPECT_EQ(checkSanConfigChange(&mask, nullptr), -1);
    EXPECT_EQ(mask, 0u);
    EXPECT_EQ(differences(before, member.files()), std::vector<std::string>{});
    ASSERT_TRUE(a_->restart());
  }
  {
    // A wrong secret: the record stays out of sight.
    member.sandbox().writeFile(vornFile(".auth_secret"), "wrong", 0600);
    const FileSnapshot wrong = member.files();
    LogCapture logs;
    EXPECT_EQ(checkSanConfigChange(&mask, nullptr), 501);
    EXPECT_TRUE(logs.contains("Set Cred returned "));
    EXPECT_EQ(differences(wrong, member.files()), std::vector<std::string>{});
    member.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  }
  {
    // A record that is no property list.
    Sandbox admin;
    auto node = currentEnv().openDirectoryNode("/LDAPv3/" + a_->ldapUrl(), nullptr);
    ASSERT_TRUE(
        node->setCredentials(kRecordTypeUsers, a_->adminName(), a_->adminPassword(), nullptr));
    auto found = node->queryRecords(RecordType::kGroups, ldapSanConfNameForName(kSanName),
                                    Attribute::kXMLPlist, 1, nullptr);
    ASSERT_TRUE(found && found->size() == 1);
    ASSERT_TRUE((*found)[0]->setValues(Attribute::kXMLPlist, {"<plist><dict><key>"}, nullptr));
  }
  const FileSnapshot current = member.files();
  EXPECT_EQ(checkSanConfigChange(&mask, nullptr), 22);
  EXPECT_EQ(differences(current, member.files()), std::vector<std::string>{});
}

TEST_F(ChangeCheckSlapdTest, AFailureAtAnyWriteLeavesEveryFileOldOrNew) {
  Value config = publishedConfig(urls({a_}), kRevision2);
  publishOn(a_, config);
  auto prepare = [&](Member& m) {
    ScopedEnv use(&m.env());
    Value document = memberDocument(urls({a_}), "CONTROLLER", kRevision1);
    document.set("certSetRevision", kZeroUUID);  // no certificates to load
    ASSERT_TRUE(saveConfigPlist(document));
    m.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
    m.sandbox().writeFile(vornFile("fsports"), "old ports\n");
    m.sandbox().writeFile(vornFile("fsnameservers"), "10.9.9.9\n");
    m.sandbox().writeFile(vornFile("Scratch.cfgp"), "<plist>old</plist>");
    m.sandbox().writeFile(vornFile("fsmlist"), "Old . 0\n");
  };
  Member clean(kMemberUUID, /*withTools=*/false);
  prepare(clean);
  const FileSnapshot before = clean.vornFiles();
  std::uint32_t mask = 0;
  int steps = 0;
  {
    ProcessRecorder processes(&clean.env());
    FaultEnv counting(&processes);
    ScopedEnv use(&counting);
    ASSERT_EQ(checkSanConfigChange(&mask, nullptr), 0);
    steps = counting.steps();
  }
  const FileSnapshot after = clean.vornFiles();
  ASSERT_GT(steps, 10);
  for (int k = 1; k <= steps; ++k) {
    SCOPED_TRACE("step " + std::to_string(k));
    Member m(kMemberUUID, /*withTools=*/false);
    prepare(m);
    ProcessRecorder processes(&m.env());  // no stand-in outlives the sandbox
    FaultEnv faults(&processes);
    {
      ScopedEnv use(&faults);
      faults.failStep(k, EIO);
      checkSanConfigChange(&mask, nullptr);
    }
    EXPECT_EQ(neitherOldNorNew(before, after, m.vornFiles()), std::vector<std::string>{});
  }
}

}  // namespace
}  // namespace kolt::testing
