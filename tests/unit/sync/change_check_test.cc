// The change check up to the fetch: validation, the URL list and node
// choice, the revision gate, and the results that leave every file alone.
#include "kolt/change_check.h"

#include <gtest/gtest.h>

#include "fixtures/log_capture.h"
#include "kolt/controller_helpers.h"
#include "unit/sync/change_check_support.h"
#include "unit/sync/memory_member_test.h"

namespace kolt::testing {
namespace {

constexpr const char* kLocalNode = "/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi";

Error contactError() {
  return Error(std::string(kDirectoryErrorDomain), -1, "Can't contact LDAP server");
}

class ChangeCheckTest : public MemoryMemberTest {
 protected:
  // A member of the SAN at kUrl1 (and kUrl2), holding the secret.
  void joinedMember(const char* role = "CLIENT", const char* sanRevision = kRevision1) {
    ASSERT_TRUE(saveConfigPlist(memberDocument(stringArray({kUrl1, kUrl2}), role, sanRevision)));
    machine_.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  }
  int check(Value* newConfig = nullptr, const std::string* server = nullptr) {
    mask_ = 0xFFFFFFFF;  // the check must clear it
    return checkSanConfigChangeWithServer(server, &mask_, newConfig);
  }
  FileSnapshot files() { return snapshotFiles(machine_.sandbox().root()); }

};

TEST_F(ChangeCheckTest, WithoutAMaskNothingIsReadOrChanged) {
  joinedMember();
  const FileSnapshot before = files();
  const int reads = recorder().reads;
  Value newConfig = memberDocument(stringArray({kUrl1}));
  const Value original = newConfig;

  EXPECT_EQ(checkSanConfigChangeWithServer(nullptr, nullptr, nullptr), 14);
  EXPECT_EQ(checkSanConfigChange(nullptr, &newConfig), 14);

  EXPECT_EQ(recorder().reads, reads);
  EXPECT_TRUE(recorder().openedNodes.empty());
  EXPECT_EQ(newConfig, original);
  EXPECT_TRUE(differences(before, files()).empty());
}

TEST_F(ChangeCheckTest, ANewConfigWithoutNameOrServerIsRefusedBeforeAnyRead) {
  joinedMember();
  const int reads = recorder().reads;
  struct Case {
    Value newConfig;
    int expected;
  };
  Value noName;
  noName.set("sanConfigURLs", stringArray({kUrl1}));
  noName.set("sharedSecret", kSecret);
  Value nameNotText = noName;
  nameNotText.set("sanName", Value::integer(7));
  Value noServer;
  noServer.set("sanName", kSanName);
  noServer.set("sharedSecret", kSecret);
  for (Case c : {Case{noName, 504}, Case{nameNotText, 504}, Case{noServer, 505}}) {
    const Value original = c.newConfig;
    EXPECT_EQ(checkSanConfigChange(&mask_, &c.newConfig), c.expected);
    EXPECT_EQ(mask_, 0u);
    EXPECT_EQ(c.newConfig, original) << "no marker is left in a refused document";
  }
  EXPECT_EQ(recorder().reads, reads);
  EXPECT_TRUE(recorder().openedNodes.empty());
}

TEST_F(ChangeCheckTest, NothingToDoWithoutDirectoryURLs) {
  // No config.plist at all, then one without "sanConfigURLs".
  EXPECT_EQ(check(), 0);
  EXPECT_EQ(mask_, 0u);
  Value document;
  document.set("sanName", kSanName);
  document.set("role", "CLIENT");
  ASSERT_TRUE(saveConfigPlist(document));
  const FileSnapshot before = files();
  EXPECT_EQ(check(), 0);
  EXPECT_EQ(mask_, 0u);
  EXPECT_TRUE(recorder().openedNodes.empty());
  EXPECT_TRUE(differences(before, files()).empty());
}

TEST_F(ChangeCheckTest, ALocalDocumentWithURLsButNoSanNameIsRefusedUncontacted) {
  Value document = memberDocument(stringArray({kUrl1}));
  document.erase("sanName");
  ASSERT_TRUE(saveConfigPlist(document));
  const FileSnapshot before = files();
  EXPECT_EQ(check(), 504);
  EXPECT_EQ(mask_, 0u);
  EXPECT_TRUE(recorder().openedNodes.empty());
  EXPECT_EQ(directory_->callCount(DirectoryOperation::kOpenNode), 0u);
  EXPECT_TRUE(differences(before, files()).empty());
}

TEST_F(ChangeCheckTest, URLsGoServerFirstThenTheLocalDirectoryThenTheSansOwn) {
  joinedMember("CONTROLLER");
  const std::string server = "srv.example.test:1636";
  for (const std::string& url : {"ldaps://" + server, std::string("ldapi://%2Fvar%2Frun%2Fldapi"),
                                 std::string(kUrl1), std::string(kUrl2)}) {
    directory_->setReachable("/LDAPv3/" + url, false);
  }
  LogCapture logs;
  const FileSnapshot before = files();

  // Every server is down: no node opens, and the last error ends the check.
  EXPECT_EQ(check(nullptr, &server), -1);

  EXPECT_EQ(
      recorder().openedNodes,
      (std::vector<std::string>{"/LDAPv3/ldaps://" + server, kLocalNode,
                                "/LDAPv3/" + std::string(kUrl1), "/LDAPv3/" + std::string(kUrl2)}));
  EXPECT_EQ(logs.countStartingWith("Unable to contact node "), 4u);
  EXPECT_TRUE(logs.contains("Unable to contact node ldaps://" + server));
  EXPECT_TRUE(logs.contains("NodeChecking hated all of it"));
  EXPECT_EQ(mask_, 0u);
  EXPECT_TRUE(differences(before, files()).empty());

  // A client has no local directory, and one URL may stand alone as a string.
  ASSERT_TRUE(saveConfigPlist(memberDocument(Value(std::string(kUrl2)), "CLIENT")));
  recorder().openedNodes.clear();
  check();
  EXPECT_EQ(recorder().openedNodes, std::vector<std::string>{"/LDAPv3/" + std::string(kUrl2)});
}

TEST_F(ChangeCheckTest, AFailingURLIsLoggedAndTheNextOneServes) {
  publishConfig(publishedConfig(stringArray({kUrl1, kUrl2}), kRevision2));
  joinedMember();
  {
    // The first server's node cannot be opened.
    LogCapture logs;
    directory_->failOperation(DirectoryOperation::kOpenNode, 1, contactError());
    EXPECT_EQ(check(), 0);
    EXPECT_TRUE(logs.contains("Unable to contact node ldap://10.0.0.1"));
    EXPECT_EQ(mask_ & kChangeApplied, kChangeApplied);
    EXPECT_EQ(*loadConfigPlist()->findString("sanRevision"), kRevision2);
  }
  {
    // The first server opens but refuses the bind.
    publishConfig(publishedConfig(stringArray({kUrl1, kUrl2}), kRevision1));
    directory_->failOperation(DirectoryOperation::kSetCredentials, 1,
                              Error(std::string(kDirectoryErrorDomain), 49, "Invalid credentials"));
    LogCapture logs;
    EXPECT_EQ(check(), 0);
    EXPECT_EQ(logs.countStartingWith("Set Cred returned "), 1u);
    EXPECT_FALSE(logs.contains("Unable to contact node"));
    EXPECT_EQ(*loadConfigPlist()->findString("sanRevision"), kRevision1);
  }
}

TEST_F(ChangeCheckTest, NoUsableNodeEndsTheCheckWithTheLastError) {
  joinedMember();
  {
    // The first refuses the bind, the last cannot be opened: its error ends it.
    machine_.sandbox().writeFile(vornFile(".auth_secret"), "wrong", 0600);
    const FileSnapshot before = files();
    directory_->failOperation(DirectoryOperation::kOpenNode, 2,
                              Error(std::string(kDirectoryErrorDomain), -11, "Connect error"));
    LogCapture logs;
    EXPECT_EQ(check(), -11);
    EXPECT_TRUE(logs.contains("Set Cred returned "));
    EXPECT_TRUE(logs.contains("Unable to contact node ldap://10.0.0.2"));
    EXPECT_TRUE(logs.contains("NodeChecking hated all of it"));
    EXPECT_FALSE(logs.contains("About to get new config"));
    EXPECT_TRUE(differences(before, files()).empty());
  }
  {
    // An empty URL list: nothing to try, nothing to report.
    ASSERT_TRUE(saveConfigPlist(memberDocument(Value::array())));
    LogCapture logs;
    EXPECT_EQ(check(), 0);
    EXPECT_EQ(mask_, 0u);
    EXPECT_TRUE(logs.contains("NodeChecking hated all of it"));
  }
}

TEST_F(ChangeCheckTest, AWrongSecretStillFetchesAnonymouslyAndChangesNothing) {
  publishConfig(publishedConfig(stringArray({kUrl1, kUrl2}), kRevision2));
  joinedMember();
  machine_.sandbox().writeFile(vornFile(".auth_secret"), "not-the-secret", 0600);
  const FileSnapshot before = files();
  const std::size_t queries = directory_->callCount(DirectoryOperation::kQuery);
  LogCapture logs;

  // Anonymous sessions see no record.
  EXPECT_EQ(check(), 501);

  EXPECT_EQ(logs.countStartingWith("Set Cred returned "), 2u);
  EXPECT_GT(directory_->callCount(DirectoryOperation::kQuery), queries);
  EXPECT_EQ(mask_, 0u);
  EXPECT_TRUE(differences(before, files()).empty());
}

TEST_F(ChangeCheckTest, AFailedOrUnusableFetchChangesNothing) {
  joinedMember();
  const std::string user = ldapSanUserNameForName(kSanName);
  const std::string group = ldapSanConfNameForName(kSanName);
  ASSERT_TRUE(directory_->addUser(user, kSecret));
  ASSERT_TRUE(directory_->addGroup(group, std::nullopt, "<plist><dict><key>", {user}));
  const FileSnapshot before = files();
  EXPECT_EQ(check(), 22) << "an unreadable record";

  auto store = [&](const Value& config) {
    auto node = directory_->openNode("/LDAPv3/" + std::string(kUrl1), nullptr);
    ASSERT_TRUE(node->setCredentials(kRecordTypeUsers, directory_->adminName(),
                                     directory_->adminPassword(), nullptr));
    const std::string sanName = kSanName;
    Value copy = config;
    ASSERT_EQ(saveVornConfig(*node, copy, &sanName, false, nullptr), 0);
  };
  Value config = publishedConfig(stringArray({kUrl1}), kRevision2);
  globalsOf(config).set("sanName", "Another SAN");
  store(config);
  EXPECT_EQ(check(), 502) << "a configuration of another SAN";
  EXPECT_EQ(mask_, 0u);

  config.set("globals", "not a dictionary");
  store(config);
  EXPECT_EQ(check(), 502) << "a configuration without globals";

  directory_->failOperation(DirectoryOperation::kQuery, 1,
                            Error(std::string(kDirectoryErrorDomain), 51, "Server is busy"));
  EXPECT_EQ(check(), 51) << "a failing query";
  EXPECT_TRUE(differences(before, files()).empty());
  EXPECT_TRUE(recorder().commands.empty());
}

TEST_F(ChangeCheckTest, AnUnchangedRevisionWritesNothing) {
  publishConfig(publishedConfig(stringArray({kUrl1, kUrl2}), kRevision1));
  joinedMember("CLIENT", kRevision2);
  ASSERT_EQ(check(), 0);  // applies kRevision1 and writes every side file
  ASSERT_EQ(mask_ & kChangeApplied, kChangeApplied);
  recorder().commands.clear();
  const FileSnapshot before = files();
  ASSERT_TRUE(before.count("Library/Preferences/Vorn/Scratch.cfgp"));

  LogCapture logs;
  EXPECT_EQ(check(), 0);
  EXPECT_EQ(mask_, 0u);
  EXPECT_TRUE(differences(before, files()).empty());
  EXPECT_TRUE(recorder().commands.empty());
  EXPECT_TRUE(logs.contains("Got config "));
}

TEST_F(ChangeCheckTest, AnUnchangedRevisionWithANewConfigSavesItSecretApart) {
  publishConfig(publishedConfig(stringArray({kUrl1}), kRevision1));
  Value loaded = memberDocument(stringArray({kUrl1}), "CLIENT", kRevision1);
  loaded.set("vornAddr", "10.0.0.50");
  ASSERT_TRUE(saveConfigPlist(loaded));

  Value newConfig = memberDocument(stringArray({kUrl1}), "CONTROLLER", kRevision1);
  newConfig.set("sharedSecret", kSecret);
  newConfig.set("vornAddr", "10.0.0.99");
  EXPECT_EQ(check(&newConfig), 0);
  EXPECT_EQ(mask_, std::uint32_t(kChangeNewConfig));

  const Value saved = *loadConfigPlist();
  EXPECT_EQ(*saved.findString("role"), "CLIENT") << "the loaded document's role stands";
  EXPECT_EQ(*saved.findString("vornAddr"), "10.0.0.50");
  EXPECT_EQ(saved.find("configIsNew"), nullptr);
  EXPECT_EQ(saved.find("sharedSecret"), nullptr);
  EXPECT_EQ(machine_.sandbox().readFile(vornFile(".auth_secret")), kSecret);
  EXPECT_EQ(machine_.sandbox().fileMode(vornFile(".auth_secret")), 0600u);
  EXPECT_EQ(machine_.sandbox().fileMode(kConfigPlistPath), 0644u);
  EXPECT_FALSE(machine_.sandbox().exists(vornFile("fsports")));
  EXPECT_FALSE(machine_.sandbox().exists(vornFile("fsnameservers")));
  EXPECT_TRUE(recorder().commands.empty());
  EXPECT_EQ(filesContaining(files(), kSecret),
            std::vector<std::string>{"Library/Preferences/Vorn/.auth_secret"});

  // A loaded document without a role leaves the new one without a role.
  loaded.erase("role");
  ASSERT_TRUE(saveConfigPlist(loaded));
  newConfig = memberDocument(stringArray({kUrl1}), "CLIENT", kRevision1);
  EXPECT_EQ(check(&newConfig), 0);
  EXPECT_EQ(loadConfigPlist()->find("role"), nullptr);
  EXPECT_EQ(machine_.sandbox().readFile(vornFile(".auth_secret")), kSecret)
      << "a document without a secret leaves the file that the check logged in with";
}

}  // namespace
}  // namespace kolt::testing
