// The SAN's records on the in-memory directory: names, creation, reading,
// saving, destroying, removing, and every failure path of them.
#include <gtest/gtest.h>

#include "fixtures/log_capture.h"
#include "kolt/directory_records.h"
#include "kolt/local_config.h"
#include "platform/directory/memory_directory.h"

namespace kolt {
namespace {

using testing::LogCapture;

const std::string kSan = "My SAN";
const std::string kSecret = "s3cret-Shared";

Error directoryError(int code, const char* text) {
  return Error(std::string(kDirectoryErrorDomain), code, text);
}

class DirectoryRecordsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    directory_ = MemoryDirectory::create();
    node_ = openAdmin();
  }

  std::unique_ptr<DirectoryNode> openAdmin() {
    ErrorSlot error;
    auto node = directory_->openNode("/LDAPv3/127.0.0.1", &error);
    EXPECT_TRUE(node) << (error ? error->printed() : "");
    EXPECT_TRUE(node->setCredentials(kRecordTypeUsers, directory_->adminName(),
                                     directory_->adminPassword(), &error));
    return node;
  }

  void create() {
    ErrorSlot error;
    ASSERT_EQ(createNewVornConfig(*node_, &kSan, &kSecret, &error), 0)
        << (error ? error->printed() : "");
    EXPECT_FALSE(error);
  }

  Value stored() {
    ErrorSlot error;
    std::optional<Value> config = getVornConfig(*node_, &kSan, &error);
    EXPECT_TRUE(config) << (error ? error->printed() : "");
    return config.value_or(Value());
  }

  std::shared_ptr<MemoryDirectory> directory_;
  std::unique_ptr<DirectoryNode> node_;
};

TEST(SanRecordNamesTest, EscapesEverythingButUrlHostCharacters) {
  EXPECT_EQ(ldapSanNameForName("My SAN"), "My_20SAN");
  EXPECT_EQ(ldapSanNameForName("a_b"), "a_5Fb");
  EXPECT_EQ(ldapSanNameForName("50%"), "50_25");
  EXPECT_EQ(ldapSanNameForName("\xC3\xA9"), "_C3_A9");
  EXPECT_EQ(ldapSanNameForName("san-1.x"), "san-1.x");
  EXPECT_EQ(ldapSanNameForName("a*(b),c+d=e;f#g\\"), "a*(b),c+d=e;f_23g_5C");
  EXPECT_EQ(ldapSanNameForName(std::string("a\0b", 3)), "a_00b");
  EXPECT_EQ(ldapSanConfNameForName("My SAN"), "com.orvat.vorn.conf.My_20SAN");
  EXPECT_EQ(ldapSanUserNameForName("My SAN"), "com.orvat.vorn.auth.My_20SAN");
  EXPECT_EQ(ldapSanAccessNameForName("My SAN"), "com.orvat.vorn.access.My_20SAN");
  // Distinct names stay distinct: the escape is reversible.
  EXPECT_NE(ldapSanNameForName("a_20b"), ldapSanNameForName("a b"));
}

TEST(NewVornConfigTest, HasZeroRevisionsAndEmptyTables) {
  Value config = newVornConfig();
  const Value* globals = config.find("globals");
  ASSERT_TRUE(globals);
  EXPECT_EQ(*globals->findString("revision"), kZeroUUID);
  EXPECT_EQ(*globals->findString("certSetRevision"), kZeroUUID);
  EXPECT_TRUE(globals->findDictionary("controllers")->empty());
  EXPECT_EQ(globals->asDictionary()->size(), 3u);
  EXPECT_TRUE(config.findDictionary("volumes")->empty());
}

TEST_F(DirectoryRecordsTest, CreateStoresBareConfigurationUserAndMembership) {
  create();
  const std::string user = ldapSanUserNameForName(kSan);
  const std::string group = ldapSanConfNameForName(kSan);
  EXPECT_TRUE(directory_->passwordMatches(user, kSecret));
  EXPECT_EQ(directory_->fullName(RecordType::kUsers, user), "com.orvat.vorn.auth.My SAN");
  EXPECT_EQ(directory_->fullName(RecordType::kGroups, group), "com.orvat.vorn.conf.My SAN");
  EXPECT_EQ(directory_->members(group), std::vector<std::string>{user});

  Value config = stored();
  const Dictionary* globals = config.findDictionary("globals");
  ASSERT_TRUE(globals);
  std::vector<std::string> keys;
  for (const auto& [key, value] : *globals) keys.push_back(key);
  EXPECT_EQ(keys, (std::vector<std::string>{"certSetRevision", "controllers", "revision",
                                            "sharedSecret"}));
  EXPECT_EQ(*globals->find("sharedSecret")->asString(), kSecret);
}

TEST_F(DirectoryRecordsTest, SanUserReadsItsConfigurationButCannotWriteIt) {
  create();
  ErrorSlot error;
  auto member = directory_->openNode("/LDAPv3/127.0.0.1", &error);
  ASSERT_TRUE(
      member->setCredentials(kRecordTypeUsers, ldapSanUserNameForName(kSan), kSecret, &error));
  std::optional<Value> config = getVornConfig(*member, &kSan, &error);
  ASSERT_TRUE(config);
  EXPECT_NE(saveVornConfig(*member, *config, &kSan, true, &error), 0);
  EXPECT_TRUE(error);
}

TEST_F(DirectoryRecordsTest, GetReportsMissingAndUnreadableRecords) {
  ErrorSlot error;
  EXPECT_FALSE(getVornConfig(*node_, &kSan, &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(*error, Error::vorn(kVornNoConfiguration));

  error.reset();
  EXPECT_FALSE(getVornConfig(*node_, nullptr, &error));
  EXPECT_EQ(error->code(), kVornNoConfiguration);

  // An empty name looks up the bare prefix and finds nothing.
  const std::string empty;
  error.reset();
  EXPECT_FALSE(getVornConfig(*node_, &empty, &error));
  EXPECT_EQ(error->code(), kVornNoConfiguration);

  for (const char* garbage :
       {"", "not a plist", "<plist version=\"1.0\"><string>x</string></plist>",
        "<plist version=\"1.0\"><dict><key>a</key></dict></plist>"}) {
    const std::string name = std::string("bad ") + garbage;
    ASSERT_TRUE(
        directory_->addGroup(ldapSanConfNameForName(name), std::nullopt, std::string(garbage)));
    error.reset();
    EXPECT_FALSE(getVornConfig(*node_, &name, &error)) << garbage;
    ASSERT_TRUE(error) << garbage;
    EXPECT_EQ(error->domain(), kPosixErrorDomain);
    EXPECT_EQ(error->code(), kPosixEINVAL);
    EXPECT_TRUE(error->description().has_value());
  }
  // Without a slot nothing is written and nothing breaks.
  EXPECT_FALSE(getVornConfig(*node_, &kSan, nullptr));
}

TEST_F(DirectoryRecordsTest, SaveKeepsOrRenewsTheRevision) {
  create();
  Value config = stored();
  config.findDictionary("globals")->set("sanName", kSan);
  ErrorSlot error = Error::vorn(kVornSanDeleted);  // a stale error is cleared on success
  ASSERT_EQ(saveVornConfig(*node_, config, nullptr, false, &error), 0);
  EXPECT_FALSE(error);
  EXPECT_EQ(*stored().findDictionary("globals")->find("revision")->asString(), kZeroUUID);

  ASSERT_EQ(saveVornConfig(*node_, config, &kSan, true, &error), 0);
  const std::string revision = *config.findDictionary("globals")->find("revision")->asString();
  EXPECT_EQ(revision.size(), 36u);
  EXPECT_NE(revision, kZeroUUID);
  for (char c : revision) EXPECT_TRUE(c == '-' || isdigit(c) || (c >= 'A' && c <= 'F')) << revision;
  EXPECT_EQ(stored(), config);

  ASSERT_EQ(saveVornConfig(*node_, config, &kSan, true, &error), 0);
  EXPECT_NE(*config.findDictionary("globals")->find("revision")->asString(), revision);
}

TEST_F(DirectoryRecordsTest, SaveWithoutRecordCreatesNothing) {
  Value config = newVornConfig();
  ErrorSlot error;
  EXPECT_EQ(saveVornConfig(*node_, config, &kSan, true, &error), 1);
  EXPECT_EQ(*error, Error::vorn(kVornNoConfiguration));
  EXPECT_FALSE(directory_->hasRecord(RecordType::kGroups, ldapSanConfNameForName(kSan)));
}

TEST_F(DirectoryRecordsTest, EmptyOrAbsentNameFailsWithoutErrorObject) {
  const std::string empty;
  Value config = newVornConfig();
  for (const std::string* name : {static_cast<const std::string*>(nullptr), &empty}) {
    ErrorSlot error;
    EXPECT_EQ(createNewVornConfig(*node_, name, &kSecret, &error), 1);
    EXPECT_EQ(saveVornConfig(*node_, config, name, false, &error), 1);
    EXPECT_EQ(destroyVornConfig(*node_, name, &error), 1);
    EXPECT_EQ(culVornConfig(*node_, name, &error), 1);
    EXPECT_FALSE(error);
  }
  EXPECT_EQ(directory_->recordCount(), 1u);  // the administrator alone
}

TEST_F(DirectoryRecordsTest, DestroyMarksDeadAndNamesAPrimaryZombie) {
  create();
  Value config = stored();
  Dictionary* globals = config.findDictionary("globals");
  globals->set("sanName", kSan);
  Value controllers = Value::dictionary();
  controllers.set("BBBB", Value::dictionary());
  controllers.set("AAAA", Value::dictionary());
  globals->set("controllers", controllers);
  globals->set("fsnameservers", Array{Value("10.0.0.1")});
  config.findDictionary("volumes")->set("vol1", Value::dictionary());
  ErrorSlot error;
  ASSERT_EQ(saveVornConfig(*node_, config, &kSan, true, &error), 0);

  LogCapture logs;
  ASSERT_EQ(destroyVornConfig(*node_, &kSan, &error), 0);
  EXPECT_FALSE(error);
  Value dead = stored();
  const Value* g = dead.find("globals");
  EXPECT_EQ(*g->findString("sanState"), "dead");
  EXPECT_EQ(*g->findString("primaryZombie"), "AAAA");
  EXPECT_FALSE(g->find("controllers"));
  EXPECT_FALSE(g->find("fsnameservers"));
  EXPECT_TRUE(dead.findDictionary("volumes")->empty());
  EXPECT_NE(*g->findString("revision"), *globals->find("revision")->asString());
  // The configuration holds the secret: the log line must not.
  EXPECT_EQ(logs.countStartingWith("destroyVornConfig: built "), 1u);
  EXPECT_TRUE(logs.contains(" and rv 0"));
  EXPECT_FALSE(logs.contains(kSecret));

  // A second destroy finds no controller and keeps the zombie it named.
  ASSERT_EQ(destroyVornConfig(*node_, &kSan, &error), 0);
  EXPECT_EQ(*stored().find("globals")->findString("primaryZombie"), "AAAA");
}

TEST_F(DirectoryRecordsTest, DestroyWithoutRecordReports501) {
  ErrorSlot error;
  EXPECT_EQ(destroyVornConfig(*node_, &kSan, &error), 1);
  EXPECT_EQ(error->code(), kVornNoConfiguration);
}

TEST_F(DirectoryRecordsTest, CulRemovesBothAndReportsTheFirstMissing) {
  ErrorSlot error;
  EXPECT_EQ(culVornConfig(*node_, &kSan, &error), 1);
  EXPECT_EQ(*error, Error::vorn(kVornNoConfiguration));

  create();
  error.reset();
  EXPECT_EQ(culVornConfig(*node_, &kSan, &error), 0);
  EXPECT_FALSE(error);
  EXPECT_EQ(directory_->recordCount(), 1u);

  // The user is missing: the group still goes, and the result names 501.
  ASSERT_TRUE(directory_->addGroup(ldapSanConfNameForName(kSan), std::nullopt, std::nullopt));
  EXPECT_EQ(culVornConfig(*node_, &kSan, &error), 1);
  EXPECT_EQ(error->code(), kVornNoConfiguration);
  EXPECT_FALSE(directory_->hasRecord(RecordType::kGroups, ldapSanConfNameForName(kSan)));
}

// Every step of the creation failing in turn: which records remain, which
// error the caller gets, which lines are logged.
TEST_F(DirectoryRecordsTest, CreationFailuresStopAtTheFailingStep) {
  struct Case {
    DirectoryOperation operation;
    std::size_t nth;
    bool userRemains;
    bool groupRemains;
    bool passwordLine;
  };
  const Case cases[] = {
      {DirectoryOperation::kCreateRecord, 1, false, false, false},
      {DirectoryOperation::kSynchronize, 1, true, false, false},
      {DirectoryOperation::kChangePassword, 1, true, false, true},
      {DirectoryOperation::kCreateRecord, 2, true, false, false},
      {DirectoryOperation::kSynchronize, 2, true, true, false},  // the user's second sync
      {DirectoryOperation::kSynchronize, 3, true, true, false},  // the group's sync
      {DirectoryOperation::kAddMember, 1, true, true, false},
  };
  for (const Case& c : cases) {
    SetUp();
    LogCapture logs;
    const Error injected = directoryError(50, "Insufficient access");
    directory_->failOperation(c.operation, c.nth, injected);
    ErrorSlot error;
    EXPECT_EQ(createNewVornConfig(*node_, &kSan, &kSecret, &error), 1);
    EXPECT_EQ(error, injected);
    EXPECT_EQ(directory_->hasRecord(RecordType::kUsers, ldapSanUserNameForName(kSan)),
              c.userRemains);
    EXPECT_EQ(directory_->hasRecord(RecordType::kGroups, ldapSanConfNameForName(kSan)),
              c.groupRemains);
    EXPECT_EQ(logs.countStartingWith("ChangePassword failed with error "),
              c.passwordLine ? 1u : 0u);
    EXPECT_FALSE(logs.contains(kSecret));
    // culVornConfig clears whatever creation left.
    directory_->clearFaults();
    culVornConfig(*node_, &kSan, nullptr);
    EXPECT_EQ(directory_->recordCount(), 1u);
  }
}

TEST_F(DirectoryRecordsTest, SaveAndDestroyFailuresPassTheDirectoryErrorOn) {
  create();
  Value config = stored();
  const Error injected = directoryError(51, "Server is busy");
  for (DirectoryOperation op : {DirectoryOperation::kQuery, DirectoryOperation::kSetValues,
                                DirectoryOperation::kSynchronize}) {
    directory_->clearFaults();
    directory_->failOperation(op, 1, injected);
    ErrorSlot error;
    EXPECT_EQ(saveVornConfig(*node_, config, &kSan, true, &error), 1);
    EXPECT_EQ(error, injected);
    directory_->clearFaults();
    directory_->failOperation(op, op == DirectoryOperation::kQuery ? 2 : 1, injected);
    error.reset();
    EXPECT_EQ(destroyVornConfig(*node_, &kSan, &error), 1);
    EXPECT_EQ(error, injected);
    directory_->clearFaults();
    // Values are stored when set; only a failure before that leaves the
    // configuration live.
    if (op != DirectoryOperation::kSynchronize) {
      EXPECT_FALSE(stored().find("globals")->find("sanState"));
    }
  }
}

TEST_F(DirectoryRecordsTest, CulFailuresReportTheFirstAndStillTryTheGroup) {
  create();
  const Error injected = directoryError(50, "Insufficient access");
  directory_->failOperation(DirectoryOperation::kDeleteRecord, 1, injected);
  ErrorSlot error;
  EXPECT_EQ(culVornConfig(*node_, &kSan, &error), 1);
  EXPECT_EQ(error, injected);
  EXPECT_TRUE(directory_->hasRecord(RecordType::kUsers, ldapSanUserNameForName(kSan)));
  EXPECT_FALSE(directory_->hasRecord(RecordType::kGroups, ldapSanConfNameForName(kSan)));
}

TEST_F(DirectoryRecordsTest, HostileNamesNameOnlyTheirOwnRecords) {
  create();
  for (const std::string hostile : {"My*", "My SAN*", "*", "My SAN)(cn=*", "My SAN,cn=groups",
                                    " My SAN", "My SAN ", "My\\2aSAN"}) {
    ErrorSlot error;
    EXPECT_FALSE(getVornConfig(*node_, &hostile, &error)) << hostile;
    EXPECT_EQ(error->code(), kVornNoConfiguration) << hostile;
    Value config = newVornConfig();
    EXPECT_EQ(saveVornConfig(*node_, config, &hostile, true, &error), 1) << hostile;
    EXPECT_EQ(culVornConfig(*node_, &hostile, &error), 1) << hostile;
  }
  EXPECT_TRUE(directory_->hasRecord(RecordType::kGroups, ldapSanConfNameForName(kSan)));
  EXPECT_FALSE(stored().find("globals")->find("sanState"));
}

}  // namespace
}  // namespace kolt
