// The in-memory directory's own features: fault injection, reachability,
// inspection and the Env routing. Its shared behaviour with the LDAP client
// is covered by the directory behaviour suite.
#include "platform/directory/memory_directory.h"

#include <gtest/gtest.h>

#include <functional>
#include <thread>

#include "fixtures/memory_directory_env.h"

namespace kolt {
namespace {

const Error kInjected("test.domain", 52, "injected");

class MemoryDirectoryTest : public ::testing::Test {
 protected:
  std::unique_ptr<DirectoryNode> openAdmin() {
    auto node = dir->openNode("/LDAPv3/127.0.0.1", nullptr);
    EXPECT_TRUE(
        node->setCredentials(kRecordTypeUsers, dir->adminName(), dir->adminPassword(), nullptr));
    return node;
  }
  std::shared_ptr<MemoryDirectory> dir = MemoryDirectory::create("admin", "pw");
};

TEST_F(MemoryDirectoryTest, FailsTheNthCallOfAnOperation) {
  auto node = openAdmin();
  dir->failOperation(DirectoryOperation::kCreateRecord, 2, kInjected);
  ErrorSlot error;
  EXPECT_NE(node->createRecord(RecordType::kGroups, "g1", {}, &error), nullptr);
  EXPECT_EQ(node->createRecord(RecordType::kGroups, "g2", {}, &error), nullptr);
  EXPECT_EQ(error, kInjected);
  EXPECT_FALSE(dir->hasRecord(RecordType::kGroups, "g2"));
  EXPECT_NE(node->createRecord(RecordType::kGroups, "g3", {}, &error), nullptr);
  EXPECT_EQ(dir->callCount(DirectoryOperation::kCreateRecord), 3u);
}

TEST_F(MemoryDirectoryTest, EveryOperationKindCanFail) {
  auto node = openAdmin();
  auto user = node->createRecord(RecordType::kUsers, "u", {}, nullptr);
  auto group = node->createRecord(RecordType::kGroups, "g", {}, nullptr);
  ASSERT_TRUE(user && group);
  struct Case {
    DirectoryOperation operation;
    std::function<bool()> call;
  };
  const std::vector<Case> cases = {
      {DirectoryOperation::kOpenNode,
       [&] { return dir->openNode("/LDAPv3/h", nullptr) != nullptr; }},
      {DirectoryOperation::kSetCredentials,
       [&] { return node->setCredentials(kRecordTypeUsers, "admin", "pw", nullptr); }},
      {DirectoryOperation::kQuery,
       [&] {
         return node->queryRecords(RecordType::kGroups, "g", Attribute::kXMLPlist, 1, nullptr)
             .has_value();
       }},
      {DirectoryOperation::kCreateRecord,
       [&] { return node->createRecord(RecordType::kGroups, "x", {}, nullptr) != nullptr; }},
      {DirectoryOperation::kReadValues,
       [&] { return group->valuesForAttribute(Attribute::kXMLPlist, nullptr).has_value(); }},
      {DirectoryOperation::kSetValues,
       [&] { return group->setValues(Attribute::kXMLPlist, {"v"}, nullptr); }},
      {DirectoryOperation::kSynchronize, [&] { return group->synchronize(nullptr); }},
      {DirectoryOperation::kChangePassword,
       [&] { return user->changePassword(std::nullopt, "new", nullptr); }},
      {DirectoryOperation::kAddMember, [&] { return group->addMemberRecord(*user, nullptr); }},
      {DirectoryOperation::kCustomCall,
       [&] { return node->customCall(kCustomCallClientAddCACerts, nullptr); }},
      {DirectoryOperation::kDeleteRecord, [&] { return group->deleteRecord(nullptr); }},
  };
  for (const auto& c : cases) {
    dir->failOperation(c.operation, 1, kInjected);
    EXPECT_FALSE(c.call()) << static_cast<int>(c.operation);
    EXPECT_TRUE(c.call()) << static_cast<int>(c.operation);
  }
  // The faults changed nothing: the last delete went through only once.
  EXPECT_FALSE(dir->hasRecord(RecordType::kGroups, "g"));
  EXPECT_TRUE(dir->passwordMatches("u", "new"));
}

TEST_F(MemoryDirectoryTest, PersistentFaultsAndClearing) {
  auto node = openAdmin();
  dir->failOperation(DirectoryOperation::kQuery, 1, kInjected, /*andLater=*/true);
  for (int i = 0; i < 3; ++i) {
    EXPECT_FALSE(node->queryRecords(RecordType::kUsers, "admin", Attribute::kXMLPlist, 1, nullptr));
  }
  dir->clearFaults();
  EXPECT_TRUE(node->queryRecords(RecordType::kUsers, "admin", Attribute::kXMLPlist, 1, nullptr));
}

TEST_F(MemoryDirectoryTest, UnreachableServersFailOpeningAndEveryCallUntilBack) {
  auto node = openAdmin();
  dir->setReachable("/LDAPv3/ldap://127.0.0.1:389", false);
  ErrorSlot error;
  EXPECT_FALSE(node->queryRecords(RecordType::kUsers, "admin", Attribute::kXMLPlist, 1, &error));
  EXPECT_EQ(error->code(), -1);
  // Opening contacts the server, as an LDAP node does.
  error.reset();
  EXPECT_EQ(dir->openNode("/LDAPv3/127.0.0.1", &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), -1);
  // Another server of the same directory is still reachable.
  auto other = dir->openNode("/LDAPv3/ldaps://127.0.0.1", nullptr);
  EXPECT_TRUE(other->setCredentials(kRecordTypeUsers, "admin", "pw", nullptr));
  dir->setReachable("/LDAPv3/127.0.0.1", true);
  EXPECT_TRUE(node->queryRecords(RecordType::kUsers, "admin", Attribute::kXMLPlist, 1, nullptr));
}

TEST_F(MemoryDirectoryTest, CustomCallRecordsTheTrustedServer) {
  auto node = dir->openNode("/LDAPv3/ldaps://DS.example.com:1636", nullptr);
  ASSERT_TRUE(node->customCall(kCustomCallClientAddCACerts, nullptr));
  EXPECT_EQ(dir->trustedServers(), std::set<std::string>{"ldaps://ds.example.com:1636"});
  ErrorSlot error;
  EXPECT_FALSE(node->customCall(1234, &error));
  EXPECT_EQ(error->code(), -12);
}

TEST_F(MemoryDirectoryTest, ConcurrentWritersLoseNothing) {
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([this, t] {
      auto node = openAdmin();
      for (int i = 0; i < 50; ++i) {
        const std::string name = "g" + std::to_string(t) + "-" + std::to_string(i);
        auto r = node->createRecord(RecordType::kGroups, name, {}, nullptr);
        if (r) r->setValues(Attribute::kXMLPlist, {name}, nullptr);
      }
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(dir->recordCount(), 1u + 200u);
  EXPECT_EQ(dir->xmlPlist("g3-49"), "g3-49");
}

TEST_F(MemoryDirectoryTest, EnvRoutesNodesToTheDirectory) {
  std::unique_ptr<Env> base = newPosixEnv("/nonexistent-root");
  testing::MemoryDirectoryEnv env(base.get(), dir);
  auto node = env.openDirectoryNode("/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi", nullptr);
  ASSERT_NE(node, nullptr);
  // ldapi without credentials is the local superuser.
  EXPECT_NE(node->createRecord(RecordType::kGroups, "made-by-root", {}, nullptr), nullptr);
  EXPECT_TRUE(dir->hasRecord(RecordType::kGroups, "MADE-BY-ROOT"));
}

}  // namespace
}  // namespace kolt
