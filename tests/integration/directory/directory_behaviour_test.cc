// One behavioural suite for every directory implementation: the in-memory
// directory and the LDAP client against a private slapd must behave alike.
#include <gtest/gtest.h>

#include <stdlib.h>

#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "fixtures/slapd.h"
#include "kolt/directory.h"
#include "kolt/env.h"
#include "platform/directory/memory_directory.h"

namespace kolt::testing {
namespace {

using Records = std::vector<std::unique_ptr<DirectoryRecord>>;

// The servers the suite runs against.
class DirectoryBackend {
 public:
  virtual ~DirectoryBackend() = default;

  // Node names reaching the server in each form the mapping knows.
  virtual std::string ldapUrlNode() = 0;   // "/LDAPv3/ldap://127.0.0.1:<port>"
  virtual std::string hostPortNode() = 0;  // "/LDAPv3/127.0.0.1:<port>"
  virtual std::string ldapsNode() = 0;     // "/LDAPv3/ldaps://127.0.0.1:<port>", trusted
  virtual std::string ldapiNode() = 0;     // "/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi"
  // A well-formed node name whose server does not answer.
  virtual std::string unreachableNode() = 0;

  // Opens a node through the Env (as the library does).
  virtual std::unique_ptr<DirectoryNode> open(const std::string& nodeName, ErrorSlot* error) = 0;

  virtual std::string adminName() = 0;
  virtual std::string adminPassword() = 0;

  // Stops the server of ldapUrlNode() or starts it again with its data.
  virtual bool setServerUp(bool up) = 0;
};

class MemoryBackend final : public DirectoryBackend {
 public:
  std::string ldapUrlNode() override { return "/LDAPv3/ldap://127.0.0.1:3890"; }
  std::string hostPortNode() override { return "/LDAPv3/127.0.0.1:3890"; }
  std::string ldapsNode() override { return "/LDAPv3/ldaps://127.0.0.1:6360"; }
  std::string ldapiNode() override { return "/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi"; }
  std::string unreachableNode() override {
    const std::string name = "/LDAPv3/ldap://127.0.0.1:1";
    directory_->setReachable(name, false);
    return name;
  }
  std::unique_ptr<DirectoryNode> open(const std::string& nodeName, ErrorSlot* error) override {
    return directory_->openNode(nodeName, error);
  }
  std::string adminName() override { return directory_->adminName(); }
  std::string adminPassword() override { return directory_->adminPassword(); }
  bool setServerUp(bool up) override {
    directory_->setReachable(ldapUrlNode(), up);
    return true;
  }

 private:
  std::shared_ptr<MemoryDirectory> directory_ = MemoryDirectory::create();
};

// A private slapd, reached through a PosixEnv whose sandbox root holds the
// server's ldapi socket at /var/run/ldapi and its CA in kolt's trust store.
class SlapdBackend final : public DirectoryBackend {
 public:
  static std::unique_ptr<SlapdBackend> start(std::string* error) {
    std::unique_ptr<SlapdBackend> b(new SlapdBackend());
    char tmpl[] = "/tmp/kolt-sandbox-XXXXXX";
    if (::mkdtemp(tmpl) == nullptr) return nullptr;
    b->root_ = tmpl;
    SlapdOptions options;
    options.ldapiSocketPath = b->root_ + "/var/run/ldapi";
    b->slapd_ = Slapd::start(options, error);
    if (!b->slapd_) return nullptr;
    b->env_ = newPosixEnv(b->root_);
    std::filesystem::create_directories(b->root_ + "/var/db/kolt/trust");
    std::filesystem::copy_file(b->slapd_->caCertificatePath(),
                               b->root_ + "/var/db/kolt/trust/test-ca.pem");
    return b;
  }
  ~SlapdBackend() override {
    slapd_.reset();
    std::error_code ignored;
    if (!root_.empty()) std::filesystem::remove_all(root_, ignored);
  }

  Slapd& slapd() { return *slapd_; }
  Env& env() { return *env_; }
  const std::string& root() const { return root_; }

  std::string ldapUrlNode() override { return "/LDAPv3/" + slapd_->ldapUrl(); }
  std::string hostPortNode() override {
    return "/LDAPv3/127.0.0.1:" + std::to_string(slapd_->ldapPort());
  }
  std::string ldapsNode() override { return "/LDAPv3/" + slapd_->ldapsUrl(); }
  std::string ldapiNode() override { return "/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi"; }
  std::string unreachableNode() override {
    return "/LDAPv3/ldap://127.0.0.1:" + std::to_string(freeLoopbackPort());
  }
  std::unique_ptr<DirectoryNode> open(const std::string& nodeName, ErrorSlot* error) override {
    return env_->openDirectoryNode(nodeName, error);
  }
  std::string adminName() override { return slapd_->adminName(); }
  std::string adminPassword() override { return slapd_->adminPassword(); }
  bool setServerUp(bool up) override {
    std::string error;
    const bool ok = up ? slapd_->restart(&error) : slapd_->stop();
    EXPECT_TRUE(ok) << error;
    return ok;
  }

 private:
  SlapdBackend() = default;
  std::string root_;
  std::unique_ptr<Slapd> slapd_;
  std::unique_ptr<Env> env_;
};

// One backend per kind for the whole run (a private slapd starts once).
DirectoryBackend* backendFor(const std::string& kind, std::string* error) {
  static std::map<std::string, std::unique_ptr<DirectoryBackend>> backends;
  static std::string startError;
  auto& slot = backends[kind];
  if (!slot && startError.empty()) {
    if (kind == "memory") {
      slot = std::make_unique<MemoryBackend>();
    } else {
      slot = SlapdBackend::start(&startError);
    }
  }
  *error = startError;
  return slot.get();
}

class DirectoryBehaviourTest : public ::testing::TestWithParam<std::string> {
 protected:
  void SetUp() override {
    std::string error;
    backend_ = backendFor(GetParam(), &error);
    ASSERT_NE(backend_, nullptr) << error;
  }
  DirectoryBackend& backend() { return *backend_; }

  // A prefix that keeps this test's record names apart from other tests'.
  std::string tag() {
    static int counter = 0;
    if (tag_.empty()) tag_ = "t" + std::to_string(++counter) + "-";
    return tag_;
  }

  std::unique_ptr<DirectoryNode> openAnonymous() {
    ErrorSlot error;
    auto node = backend().open(backend().ldapUrlNode(), &error);
    EXPECT_NE(node, nullptr) << (error ? error->printed() : "");
    return node;
  }

  std::unique_ptr<DirectoryNode> openAs(const std::string& user, const std::string& password) {
    auto node = openAnonymous();
    if (!node) return nullptr;
    ErrorSlot error;
    EXPECT_TRUE(node->setCredentials(kRecordTypeUsers, user, password, &error))
        << (error ? error->printed() : "");
    return node;
  }

  std::unique_ptr<DirectoryNode> openAdmin() {
    return openAs(backend().adminName(), backend().adminPassword());
  }

  static Records query(DirectoryNode& node, RecordType type, const std::string& name,
                       ErrorSlot* error = nullptr) {
    ErrorSlot local;
    auto results = node.queryRecords(type, name, Attribute::kXMLPlist, 1, error ? error : &local);
    if (!error) {
      EXPECT_TRUE(results.has_value()) << (local ? local->printed() : "");
    }
    return results ? std::move(*results) : Records{};
  }

  static std::string firstValue(DirectoryRecord& record, Attribute attribute) {
    ErrorSlot error;
    auto values = record.valuesForAttribute(attribute, &error);
    EXPECT_TRUE(values.has_value()) << (error ? error->printed() : "");
    if (!values || values->empty()) return "<none>";
    return std::string((*values)[0]);
  }

  std::unique_ptr<DirectoryRecord> createGroup(DirectoryNode& node, const std::string& name,
                                               const std::string& xml) {
    ErrorSlot error;
    auto record = node.createRecord(
        RecordType::kGroups, name,
        {{Attribute::kXMLPlist, {xml}}, {Attribute::kFullName, {"full " + name}}}, &error);
    EXPECT_NE(record, nullptr) << "creating group '" << name
                               << "': " << (error ? error->printed() : "");
    return record;
  }

  std::unique_ptr<DirectoryRecord> createUser(DirectoryNode& node, const std::string& name,
                                              const std::string& password) {
    ErrorSlot error;
    auto record = node.createRecord(RecordType::kUsers, name,
                                    {{Attribute::kFullName, {"full " + name}}}, &error);
    EXPECT_NE(record, nullptr) << "creating user '" << name
                               << "': " << (error ? error->printed() : "");
    if (record) {
      EXPECT_TRUE(record->changePassword(std::nullopt, password, &error))
          << (error ? error->printed() : "");
    }
    return record;
  }

  // A SAN's two records as the records code makes them: a user with a
  // password and a configuration group holding `xml` with that user as member.
  void createSan(DirectoryNode& admin, const std::string& san, const std::string& password,
                 const std::string& xml) {
    auto user = createUser(admin, "auth." + san, password);
    auto group = createGroup(admin, "conf." + san, xml);
    ASSERT_TRUE(user && group);
    ErrorSlot error;
    ASSERT_TRUE(group->addMemberRecord(*user, &error)) << (error ? error->printed() : "");
  }

 private:
  std::string tag_;
  DirectoryBackend* backend_ = nullptr;
};

TEST_P(DirectoryBehaviourTest, OpensNodesByEveryNameForm) {
  for (const std::string& name : {backend().ldapUrlNode(), backend().hostPortNode(),
                                  backend().ldapsNode(), backend().ldapiNode()}) {
    ErrorSlot error;
    auto node = backend().open(name, &error);
    ASSERT_NE(node, nullptr) << name << ": " << (error ? error->printed() : "");
    EXPECT_EQ(node->nodeName(), name);
    EXPECT_TRUE(node->setCredentials(kRecordTypeUsers, backend().adminName(),
                                     backend().adminPassword(), &error))
        << name << ": " << (error ? error->printed() : "");
    EXPECT_EQ(query(*node, RecordType::kUsers, backend().adminName()).size(), 1u) << name;
  }
}

TEST_P(DirectoryBehaviourTest, RefusesNamesThatAreNoNodes) {
  for (const std::string name :
       {"", "/LDAPv3/", "/Local/Default", "/LDAPv3/http://127.0.0.1", "/LDAPv3/ldap://",
        "/LDAPv3/ldap://127.0.0.1/dc=other", "/LDAPv3/ldap://127.0.0.1:99999",
        "/LDAPv3/ldap://127.0.0.1:389?cn", "/LDAPv3/ldap://user@127.0.0.1",
        "/LDAPv3/127.0.0.1:", "/LDAPv3/ldapi://relative"}) {
    ErrorSlot error;
    EXPECT_EQ(backend().open(name, &error), nullptr) << name;
    ASSERT_TRUE(error.has_value()) << name;
    EXPECT_EQ(error->domain(), kDirectoryErrorDomain);
    EXPECT_EQ(error->code(), -9) << name;
  }
}

TEST_P(DirectoryBehaviourTest, OpeningContactsTheServer) {
  ErrorSlot error;
  EXPECT_EQ(backend().open(backend().unreachableNode(), &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->domain(), kDirectoryErrorDomain);
  EXPECT_EQ(error->code(), -1) << error->printed();
}

TEST_P(DirectoryBehaviourTest, AnOpenNodeOutlivesAServerRestart) {
  auto admin = openAdmin();
  ASSERT_NE(admin, nullptr);
  ASSERT_TRUE(createGroup(*admin, tag() + "before", "<before/>"));

  // Down: the node's operations and new nodes fail with -1.
  ASSERT_TRUE(backend().setServerUp(false));
  ErrorSlot error;
  EXPECT_FALSE(
      admin->queryRecords(RecordType::kGroups, tag() + "before", Attribute::kXMLPlist, 1, &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), -1) << error->printed();
  error.reset();
  EXPECT_EQ(backend().open(backend().ldapUrlNode(), &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), -1) << error->printed();

  // Back: the node connects again, still as the administrator.
  ASSERT_TRUE(backend().setServerUp(true));
  EXPECT_EQ(query(*admin, RecordType::kGroups, tag() + "before").size(), 1u);
  EXPECT_TRUE(createGroup(*admin, tag() + "after", "<after/>"));

  // Down and up between two operations: the next one does not notice.
  ASSERT_TRUE(backend().setServerUp(false));
  ASSERT_TRUE(backend().setServerUp(true));
  EXPECT_EQ(query(*admin, RecordType::kGroups, tag() + "after").size(), 1u);
  EXPECT_TRUE(createGroup(*admin, tag() + "later", "<later/>"));
  auto user = openAnonymous();
  ASSERT_NE(user, nullptr);
  ASSERT_TRUE(backend().setServerUp(false));
  ASSERT_TRUE(backend().setServerUp(true));
  EXPECT_TRUE(user->setCredentials(kRecordTypeUsers, backend().adminName(),
                                   backend().adminPassword(), &error))
      << (error ? error->printed() : "");
}

TEST_P(DirectoryBehaviourTest, CredentialsAreCheckedAndPasswordsNeverReachErrors) {
  auto node = openAnonymous();
  ASSERT_NE(node, nullptr);
  ErrorSlot error;
  EXPECT_TRUE(node->setCredentials(kRecordTypeUsers, backend().adminName(),
                                   backend().adminPassword(), &error));

  const std::string wrong = "wrong-" + backend().adminPassword() + "-Pa55";
  for (const auto& [user, password] : std::vector<std::pair<std::string, std::string>>{
           {backend().adminName(), wrong},
           {backend().adminName(), ""},
           {tag() + "nobody", wrong},
       }) {
    error.reset();
    EXPECT_FALSE(node->setCredentials(kRecordTypeUsers, user, password, &error)) << user;
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->domain(), kDirectoryErrorDomain);
    EXPECT_EQ(error->code(), 49) << error->printed();
    if (!password.empty()) {
      EXPECT_EQ(error->printed().find(password), std::string::npos) << error->printed();
    }
  }
  // The failed bind left the node anonymous: it sees no record.
  EXPECT_TRUE(query(*node, RecordType::kUsers, backend().adminName()).empty());
}

TEST_P(DirectoryBehaviourTest, HostileNamesNameOnlyTheirOwnRecord) {
  auto admin = openAdmin();
  ASSERT_NE(admin, nullptr);
  const std::string t = tag();
  const std::vector<std::string> names = {
      t + "My",
      t + "My*",
      t + "*",
      t + "a)(cn=*",
      t + "(x)",
      t + "back\\sl",
      t + "com,ma",
      t + "plus+cn=b",
      t + "eq=ual",
      t + "semi;colon",
      "#" + t + "h",
      " " + t + "lead",
      t + "trail ",
      t + "quo\"te",
      t + "<angle>",
      t + "x,cn=users",
      t + "nön-ASCII é 日本",
      t + "nul\\00",
  };
  for (const auto& name : names) ASSERT_TRUE(createGroup(*admin, name, "<xml>" + name + "</xml>"));

  for (const auto& name : names) {
    Records found = query(*admin, RecordType::kGroups, name);
    ASSERT_EQ(found.size(), 1u) << "'" << name << "'";
    EXPECT_EQ(firstValue(*found[0], Attribute::kXMLPlist), "<xml>" + name + "</xml>") << name;
    EXPECT_EQ(firstValue(*found[0], Attribute::kFullName), "full " + name) << name;
  }
  // Nothing matches by pattern, and no name reached another container.
  EXPECT_TRUE(query(*admin, RecordType::kGroups, t + "M").empty());
  EXPECT_TRUE(query(*admin, RecordType::kGroups, t + "My**").empty());
  EXPECT_TRUE(query(*admin, RecordType::kGroups, t + "x").empty());
  EXPECT_TRUE(query(*admin, RecordType::kGroups, t + "plus").empty());
  EXPECT_TRUE(query(*admin, RecordType::kUsers, t + "x").empty());
  EXPECT_TRUE(query(*admin, RecordType::kUsers, t + "x,cn=users").empty());
}

TEST_P(DirectoryBehaviourTest, NamesDifferingInCaseOrRepeatedBlanksAreOneRecord) {
  auto admin = openAdmin();
  ASSERT_NE(admin, nullptr);
  const std::string name = tag() + "Case  Name";
  ASSERT_TRUE(createGroup(*admin, name, "<one/>"));
  Records found = query(*admin, RecordType::kGroups, tag() + "CASE NAME");
  ASSERT_EQ(found.size(), 1u);
  EXPECT_EQ(firstValue(*found[0], Attribute::kXMLPlist), "<one/>");
  ErrorSlot error;
  EXPECT_EQ(admin->createRecord(RecordType::kGroups, tag() + "case name", {}, &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 68);
}

TEST_P(DirectoryBehaviourTest, RecordLifecycle) {
  auto admin = openAdmin();
  ASSERT_NE(admin, nullptr);
  const std::string name = tag() + "conf.Life";
  ErrorSlot error;
  EXPECT_TRUE(query(*admin, RecordType::kGroups, name).empty());
  ASSERT_TRUE(createGroup(*admin, name, "<v1/>"));

  error.reset();
  EXPECT_EQ(admin->createRecord(RecordType::kGroups, name, {}, &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 68);

  Records found = query(*admin, RecordType::kGroups, name);
  ASSERT_EQ(found.size(), 1u);
  EXPECT_EQ(found[0]->recordName(), name);
  EXPECT_EQ(found[0]->recordType(), RecordType::kGroups);
  ASSERT_TRUE(found[0]->setValues(Attribute::kXMLPlist, {"<v2/>"}, &error));
  EXPECT_EQ(firstValue(*found[0], Attribute::kXMLPlist), "<v2/>");
  ASSERT_TRUE(found[0]->synchronize(&error));
  Records again = query(*admin, RecordType::kGroups, name);
  ASSERT_EQ(again.size(), 1u);
  EXPECT_EQ(firstValue(*again[0], Attribute::kXMLPlist), "<v2/>");

  // A user cannot hold the configuration attribute; a group holds one value.
  auto user = createUser(*admin, tag() + "auth.Life", "secret-1");
  ASSERT_NE(user, nullptr);
  error.reset();
  EXPECT_FALSE(user->setValues(Attribute::kXMLPlist, {"<x/>"}, &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 65);
  error.reset();
  EXPECT_FALSE(again[0]->setValues(Attribute::kXMLPlist, {"<a/>", "<b/>"}, &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 19);

  ASSERT_TRUE(again[0]->deleteRecord(&error)) << error->printed();
  EXPECT_TRUE(query(*admin, RecordType::kGroups, name).empty());
  error.reset();
  EXPECT_FALSE(found[0]->deleteRecord(&error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 32);
  error.reset();
  EXPECT_FALSE(found[0]->setValues(Attribute::kXMLPlist, {"<v3/>"}, &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 32);
}

TEST_P(DirectoryBehaviourTest, ChangePasswordAndMembership) {
  auto admin = openAdmin();
  ASSERT_NE(admin, nullptr);
  const std::string san = tag() + "S";
  ASSERT_NO_FATAL_FAILURE(createSan(*admin, san, "first-secret", "<conf/>"));
  auto user = query(*admin, RecordType::kUsers, "auth." + san);
  ASSERT_EQ(user.size(), 1u);
  EXPECT_EQ(firstValue(*user[0], Attribute::kFullName), "full auth." + san);

  ErrorSlot error;
  ASSERT_TRUE(user[0]->changePassword(std::nullopt, "second-secret", &error));
  auto member = openAnonymous();
  EXPECT_FALSE(member->setCredentials(kRecordTypeUsers, "auth." + san, "first-secret", &error));
  ASSERT_TRUE(member->setCredentials(kRecordTypeUsers, "auth." + san, "second-secret", &error));
  Records conf = query(*member, RecordType::kGroups, "conf." + san);
  ASSERT_EQ(conf.size(), 1u);
  EXPECT_EQ(firstValue(*conf[0], Attribute::kXMLPlist), "<conf/>");

  // Adding the member again changes nothing; an empty password is refused.
  auto group = query(*admin, RecordType::kGroups, "conf." + san);
  ASSERT_EQ(group.size(), 1u);
  EXPECT_TRUE(group[0]->addMemberRecord(*user[0], &error));
  error.reset();
  EXPECT_FALSE(user[0]->changePassword(std::nullopt, "", &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_TRUE(member->setCredentials(kRecordTypeUsers, "auth." + san, "second-secret", &error));
}

TEST_P(DirectoryBehaviourTest, LargeValuesRoundTripByteForByte) {
  auto admin = openAdmin();
  ASSERT_NE(admin, nullptr);
  std::string big(2 * 1024 * 1024, '\0');
  for (std::size_t i = 0; i < big.size(); ++i) big[i] = static_cast<char>((i * 7919) >> 3);
  const std::string name = tag() + "big";
  ASSERT_TRUE(createGroup(*admin, name, "small"));
  Records found = query(*admin, RecordType::kGroups, name);
  ASSERT_EQ(found.size(), 1u);
  ErrorSlot error;
  ASSERT_TRUE(found[0]->setValues(Attribute::kXMLPlist, {big}, &error))
      << (error ? error->printed() : "");
  Records again = query(*openAdmin(), RecordType::kGroups, name);
  ASSERT_EQ(again.size(), 1u);
  auto values = again[0]->valuesForAttribute(Attribute::kXMLPlist, &error);
  ASSERT_TRUE(values.has_value());
  ASSERT_EQ(values->size(), 1u);
  EXPECT_TRUE((*values)[0] == big) << "size " << (*values)[0].size();
}

TEST_P(DirectoryBehaviourTest, AccessRules) {
  auto admin = openAdmin();
  ASSERT_NE(admin, nullptr);
  const std::string a = tag() + "A", b = tag() + "B";
  ASSERT_NO_FATAL_FAILURE(createSan(*admin, a, "secret-a", "<a-secret/>"));
  ASSERT_NO_FATAL_FAILURE(createSan(*admin, b, "secret-b", "<b-secret/>"));

  // Anonymous sessions and another SAN's user see no trace of SAN A.
  auto anonymous = openAnonymous();
  EXPECT_TRUE(query(*anonymous, RecordType::kGroups, "conf." + a).empty());
  EXPECT_TRUE(query(*anonymous, RecordType::kUsers, "auth." + a).empty());
  auto userB = openAs("auth." + b, "secret-b");
  EXPECT_TRUE(query(*userB, RecordType::kGroups, "conf." + a).empty());
  EXPECT_EQ(query(*userB, RecordType::kGroups, "conf." + b).size(), 1u);

  // SAN A's user reads its group but changes nothing, not even its password.
  auto userA = openAs("auth." + a, "secret-a");
  Records conf = query(*userA, RecordType::kGroups, "conf." + a);
  ASSERT_EQ(conf.size(), 1u);
  EXPECT_EQ(firstValue(*conf[0], Attribute::kXMLPlist), "<a-secret/>");
  ErrorSlot error;
  EXPECT_FALSE(conf[0]->setValues(Attribute::kXMLPlist, {"<taken/>"}, &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 50);
  error.reset();
  EXPECT_FALSE(conf[0]->deleteRecord(&error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 50);
  // Its own user record stays hidden, so it has nothing to change a
  // password on (the LDAP suite also tries the server's own operation).
  EXPECT_TRUE(query(*userA, RecordType::kUsers, "auth." + a).empty());
  error.reset();
  EXPECT_EQ(userA->createRecord(RecordType::kGroups, tag() + "forged", {}, &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 50);
  error.reset();
  EXPECT_EQ(anonymous->createRecord(RecordType::kUsers, tag() + "forged", {}, &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 8);  // anonymous writes need authentication first

  Records stored = query(*admin, RecordType::kGroups, "conf." + a);
  ASSERT_EQ(stored.size(), 1u);
  EXPECT_EQ(firstValue(*stored[0], Attribute::kXMLPlist), "<a-secret/>");
}

TEST_P(DirectoryBehaviourTest, TheLocalSuperuserManagesOverLdapi) {
  ErrorSlot error;
  auto node = backend().open(backend().ldapiNode(), &error);
  ASSERT_NE(node, nullptr);
  const std::string name = tag() + "root-made";
  ASSERT_TRUE(createGroup(*node, name, "<root/>"));
  EXPECT_EQ(query(*node, RecordType::kGroups, name).size(), 1u);
  EXPECT_EQ(query(*openAdmin(), RecordType::kGroups, name).size(), 1u);
  // The custom call needs TLS, which an ldapi node has not.
  error.reset();
  EXPECT_FALSE(node->customCall(kCustomCallClientAddCACerts, &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), -12);
}

INSTANTIATE_TEST_SUITE_P(Directories, DirectoryBehaviourTest,
                         ::testing::Values(std::string("memory"), std::string("slapd")),
                         [](const auto& info) { return info.param; });

}  // namespace
}  // namespace kolt::testing
