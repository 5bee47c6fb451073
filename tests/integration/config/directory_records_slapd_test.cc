// The SAN's records against a real directory: kolt's LDAP client on a
// private slapd with the example access rules. Hostile SAN names, who may
// read and write a SAN's records, secrets in logs and errors, the whole
// lifecycle, and records as plain LDAP tools and Python's plistlib see them.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "fixtures/slapd.h"
#include "kolt/directory_records.h"
#include "kolt/local_config.h"

namespace kolt::testing {
namespace {

std::string printed(const ErrorSlot& e) {
  return e ? e->printed() : "(no error)";
}

class DirectoryRecordsSlapdTest : public ::testing::Test {
 protected:
  void SetUp() override {
    SlapdOptions options;
    options.ldapiSocketPath = sandbox_.hostPath("/var/run/ldapi");
    std::string error;
    slapd_ = Slapd::start(options, &error);
    ASSERT_NE(slapd_, nullptr) << error;
    admin_ = openAs(slapd_->adminName(), slapd_->adminPassword());
    ASSERT_NE(admin_, nullptr);
  }

  std::string ldapNode() const { return "/LDAPv3/" + slapd_->ldapUrl(); }

  std::unique_ptr<DirectoryNode> open(const std::string& nodeName) {
    ErrorSlot error;
    auto node = sandbox_.env().openDirectoryNode(nodeName, &error);
    EXPECT_NE(node, nullptr) << nodeName << ": " << printed(error);
    return node;
  }
  std::unique_ptr<DirectoryNode> openAs(const std::string& user, const std::string& password) {
    auto node = open(ldapNode());
    ErrorSlot error;
    if (!node || !node->setCredentials(kRecordTypeUsers, user, password, &error)) {
      ADD_FAILURE() << "binding as " << user << ": " << printed(error);
      return nullptr;
    }
    return node;
  }
  std::unique_ptr<DirectoryNode> openSanUser(const std::string& san, const std::string& secret) {
    return openAs(ldapSanUserNameForName(san), secret);
  }

  void create(const std::string& san, const std::string& secret, DirectoryNode* node = nullptr) {
    ErrorSlot error;
    ASSERT_EQ(createNewVornConfig(node ? *node : *admin_, &san, &secret, &error), 0)
        << "'" << san << "': " << printed(error);
    EXPECT_FALSE(error);
  }

  Value stored(const std::string& san) {
    ErrorSlot error;
    std::optional<Value> config = getVornConfig(*admin_, &san, &error);
    EXPECT_TRUE(config) << "'" << san << "': " << printed(error);
    return config.value_or(Value());
  }

  // The configuration group's bytes exactly as the server holds them
  // (nothing when the record is absent).
  std::optional<std::string> storedBytes(const std::string& san) {
    ErrorSlot error;
    auto records = admin_->queryRecords(RecordType::kGroups, ldapSanConfNameForName(san),
                                        Attribute::kXMLPlist, 1, &error);
    EXPECT_TRUE(records) << printed(error);
    if (!records || records->empty()) return std::nullopt;
    auto values = (*records)[0]->valuesForAttribute(Attribute::kXMLPlist, &error);
    if (!values || values->size() != 1) return std::string("<not one value>");
    return std::string((*values)[0]);
  }

  // An entry as `ldapsearch` of the superuser lists it.
  struct Entry {
    std::string dnLine;                   // "dn: ..." or "dn:: <base64>"
    std::vector<std::string> attributes;  // names, one per value, sorted
    std::string text;
  };
  // Every entry below the base.
  std::vector<Entry> entries() {
    std::string out;
    EXPECT_EQ(slapd_->search({"-b", Slapd::kBaseDn, "-s", "sub", "*"}, &out), 0) << out;
    std::vector<Entry> list;
    std::istringstream in(out);
    std::string line;
    Entry entry;
    auto finish = [&] {
      if (entry.dnLine.empty()) return;
      std::sort(entry.attributes.begin(), entry.attributes.end());
      list.push_back(std::move(entry));
      entry = Entry();
    };
    while (std::getline(in, line)) {
      if (line.empty()) {
        finish();
        continue;
      }
      entry.text += line + "\n";
      if (line.rfind("dn:", 0) == 0) {
        entry.dnLine = line;
      } else {
        entry.attributes.push_back(line.substr(0, line.find(':')));
      }
    }
    finish();
    return list;
  }

  Sandbox sandbox_;
  std::unique_ptr<Slapd> slapd_;
  std::unique_ptr<DirectoryNode> admin_;
};

// Names holding every character that means something in a DN or a filter,
// blanks at either end and non-ASCII letters each name only their own
// records: reading, saving, destroying and removing through one leaves every
// other byte for byte.
TEST_F(DirectoryRecordsSlapdTest, HostileSanNamesNameOnlyTheirOwnRecords) {
  const std::vector<std::string> names = {
      "My",     "My*", "*",           "My(",         "My)",     "My)(cn=*", "My\\",
      "My\\2a", "My,", "My,cn=users", "My+",         "My+cn=x", "My=",      "My;",
      "#My",    " My", "My ",         "Mÿ Sän 日本", "My_2A",   "My%2A",
  };
  // Before "My*" exists, nothing done through it reaches "My".
  create("My", "secret-of-My");
  const std::optional<std::string> myBytes = storedBytes("My");
  for (const std::string& san : {std::string("My*"), std::string("*"), std::string("My)(cn=*")}) {
    ErrorSlot error;
    EXPECT_FALSE(getVornConfig(*admin_, &san, &error)) << san;
    ASSERT_TRUE(error) << san;
    EXPECT_EQ(error->code(), kVornNoConfiguration) << san;
    Value config = newVornConfig();
    EXPECT_EQ(saveVornConfig(*admin_, config, &san, true, &error), 1) << san;
    EXPECT_EQ(destroyVornConfig(*admin_, &san, &error), 1) << san;
    EXPECT_EQ(culVornConfig(*admin_, &san, &error), 1) << san;
    EXPECT_EQ(error->code(), kVornNoConfiguration) << san;
    // Its user does not accept My's secret.
    auto node = open(ldapNode());
    EXPECT_FALSE(
        node->setCredentials(kRecordTypeUsers, ldapSanUserNameForName(san), "secret-of-My", &error))
        << san;
  }
  EXPECT_EQ(storedBytes("My"), myBytes);

  const std::size_t before = entries().size();
  for (std::size_t i = 1; i < names.size(); ++i) create(names[i], "secret-" + std::to_string(i));
  // One user and one group each, nothing else: no name added an entry, an
  // attribute, a second name or a second member.
  const std::vector<Entry> all = entries();
  EXPECT_EQ(all.size(), before + 2 * (names.size() - 1));
  const std::vector<std::string> groupAttributes = {"cn", "displayName", "member", "objectClass",
                                                    "vornXMLPlist"};
  const std::vector<std::string> userAttributes = {"cn", "objectClass", "sn", "uid",
                                                   "userPassword"};
  std::size_t groups = 0, users = 0;
  for (const Entry& entry : all) {
    if (entry.text.find("objectClass: vornGroup\n") != std::string::npos) {
      ++groups;
      EXPECT_EQ(entry.attributes, groupAttributes) << entry.text;
    } else if (entry.text.find("objectClass: inetOrgPerson\n") != std::string::npos &&
               entry.text.find("uid: diradmin\n") == std::string::npos) {
      ++users;
      EXPECT_EQ(entry.attributes, userAttributes) << entry.text;
    }
  }
  EXPECT_EQ(groups, names.size());
  EXPECT_EQ(users, names.size());

  std::map<std::string, std::string> snapshot;
  auto takeSnapshot = [&] {
    snapshot.clear();
    for (const std::string& name : names) {
      if (auto bytes = storedBytes(name)) snapshot[name] = *bytes;
    }
  };
  auto othersUnchanged = [&](const std::string& actor, const char* step) {
    for (const std::string& name : names) {
      if (name == actor) continue;
      auto it = snapshot.find(name);
      const std::optional<std::string> now = storedBytes(name);
      if (it == snapshot.end()) {
        EXPECT_FALSE(now) << step << " through '" << actor << "' created '" << name << "'";
      } else {
        EXPECT_EQ(now, it->second) << step << " through '" << actor << "' changed '" << name << "'";
      }
    }
  };

  for (std::size_t i = 0; i < names.size(); ++i) {
    const std::string& san = names[i];
    SCOPED_TRACE("SAN '" + san + "'");
    takeSnapshot();
    Value config = stored(san);
    config.findDictionary("globals")->set("sanName", san);
    ErrorSlot error;
    ASSERT_EQ(saveVornConfig(*admin_, config, nullptr, true, &error), 0) << printed(error);
    EXPECT_EQ(stored(san), config);
    othersUnchanged(san, "save");

    // Its own user reads it, and only it.
    const std::string secret = i == 0 ? "secret-of-My" : "secret-" + std::to_string(i);
    auto user = openSanUser(san, secret);
    ASSERT_NE(user, nullptr);
    EXPECT_EQ(getVornConfig(*user, &san, &error), config);
    for (const std::string& other : names) {
      if (other == san) continue;
      error.reset();
      EXPECT_FALSE(getVornConfig(*user, &other, &error)) << other;
      EXPECT_EQ(error->code(), kVornNoConfiguration) << other;
    }

    takeSnapshot();
    ASSERT_EQ(destroyVornConfig(*admin_, &san, &error), 0) << printed(error);
    EXPECT_EQ(*stored(san).find("globals")->findString("sanState"), "dead");
    othersUnchanged(san, "destroy");
  }
  // Removing goes the other way round, so that every removal happens while
  // the names that might be confused with it still exist.
  for (std::size_t i = names.size(); i-- > 0;) {
    const std::string& san = names[i];
    takeSnapshot();
    ErrorSlot error;
    ASSERT_EQ(culVornConfig(*admin_, &san, &error), 0) << "'" << san << "': " << printed(error);
    EXPECT_FALSE(storedBytes(san)) << san;
    othersUnchanged(san, "cul");
  }
  EXPECT_EQ(entries().size(), before - 2);
}

TEST_F(DirectoryRecordsSlapdTest, OnlyTheSansOwnUserReadsItsRecordAndItWritesNothing) {
  create("Alpha", "alpha-secret");
  create("Beta", "beta-secret");
  const std::string alpha = "Alpha", beta = "Beta";
  const std::optional<std::string> alphaBytes = storedBytes(alpha);

  // Anonymous, and another SAN's user: as if absent.
  auto anonymous = open(ldapNode());
  auto userB = openSanUser(beta, "beta-secret");
  ASSERT_TRUE(anonymous && userB);
  for (DirectoryNode* node : {anonymous.get(), userB.get()}) {
    ErrorSlot error;
    EXPECT_FALSE(getVornConfig(*node, &alpha, &error));
    ASSERT_TRUE(error);
    EXPECT_EQ(*error, Error::vorn(kVornNoConfiguration));
    Value config = newVornConfig();
    EXPECT_EQ(saveVornConfig(*node, config, &alpha, true, &error), 1);
    EXPECT_EQ(culVornConfig(*node, &alpha, &error), 1);
  }
  EXPECT_TRUE(getVornConfig(*userB, &beta, nullptr));

  // Wrong passwords are refused, also those close to the right one.
  for (const std::string wrong : {"alpha-secreT", "alpha-secret ", "", "beta-secret"}) {
    auto node = open(ldapNode());
    ErrorSlot error;
    EXPECT_FALSE(
        node->setCredentials(kRecordTypeUsers, ldapSanUserNameForName(alpha), wrong, &error))
        << "'" << wrong << "'";
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), 49);
    EXPECT_FALSE(getVornConfig(*node, &alpha, nullptr));
  }

  // Its own user reads it but changes nothing.
  auto userA = openSanUser(alpha, "alpha-secret");
  ASSERT_NE(userA, nullptr);
  ErrorSlot error;
  std::optional<Value> config = getVornConfig(*userA, &alpha, &error);
  ASSERT_TRUE(config) << printed(error);
  EXPECT_EQ(*config->find("globals")->findString("sharedSecret"), "alpha-secret");
  config->findDictionary("globals")->set("sanState", "dead");
  EXPECT_EQ(saveVornConfig(*userA, *config, &alpha, true, &error), 1);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code(), 50) << printed(error);
  error.reset();
  EXPECT_EQ(destroyVornConfig(*userA, &alpha, &error), 1);
  EXPECT_EQ(error->code(), 50) << printed(error);
  error.reset();
  // Its user record is hidden from it, so removal finds nothing to delete;
  // the group it may read, but not delete.
  EXPECT_EQ(culVornConfig(*userA, &alpha, &error), 1);
  ASSERT_TRUE(error);
  const std::string gamma = "Gamma", gammaSecret = "gamma-secret";
  EXPECT_EQ(createNewVornConfig(*userA, &gamma, &gammaSecret, &error), 1);
  EXPECT_EQ(error->code(), 50) << printed(error);
  EXPECT_EQ(storedBytes(alpha), alphaBytes);
  EXPECT_FALSE(storedBytes(gamma));

  // Nor can it change its own password with the server's operation.
  std::string out;
  EXPECT_NE(slapd_->runTool(
                "ldappasswd",
                {"-x", "-H", slapd_->ldapUrl(), "-D", Slapd::userDn(ldapSanUserNameForName(alpha)),
                 "-w", "alpha-secret", "-s", "taken-over"},
                "", &out),
            0)
      << out;
  EXPECT_NE(openSanUser(alpha, "alpha-secret"), nullptr);
}

TEST_F(DirectoryRecordsSlapdTest, NoSecretReachesALogLineOrAnErrorText) {
  const std::string san = "Secretive SAN";
  const std::string secret = "Zq8-shared-SECRET-7f";
  std::vector<std::string> texts;
  auto keep = [&](const ErrorSlot& error) {
    if (error) texts.push_back(error->printed());
  };
  {
    LogCapture logs;
    create(san, secret);
    ErrorSlot error;
    // Creating again fails on the existing user; as the SAN's user it fails
    // for want of rights; anonymously for want of authentication.
    EXPECT_EQ(createNewVornConfig(*admin_, &san, &secret, &error), 1);
    keep(error);
    auto user = openSanUser(san, secret);
    ASSERT_NE(user, nullptr);
    const std::string other = "Other", otherSecret = secret + "-other";
    error.reset();
    EXPECT_EQ(createNewVornConfig(*user, &other, &otherSecret, &error), 1);
    keep(error);
    auto anonymous = open(ldapNode());
    error.reset();
    EXPECT_EQ(createNewVornConfig(*anonymous, &other, &otherSecret, &error), 1);
    keep(error);
    // An empty secret: the password step fails and is logged.
    const std::string empty, bare = "Bare";
    error.reset();
    EXPECT_EQ(createNewVornConfig(*admin_, &bare, &empty, &error), 1);
    keep(error);
    EXPECT_EQ(logs.countStartingWith("ChangePassword failed with error "), 1u);
    // Binds that fail with passwords near the secret.
    for (const std::string& wrong :
         {secret + "x", secret.substr(1), slapd_->adminPassword() + "x"}) {
      auto node = open(ldapNode());
      error.reset();
      EXPECT_FALSE(
          node->setCredentials(kRecordTypeUsers, ldapSanUserNameForName(san), wrong, &error));
      keep(error);
      error.reset();
      EXPECT_FALSE(node->setCredentials(kRecordTypeUsers, slapd_->adminName(), wrong, &error));
      keep(error);
    }
    // Saving as the user, destroying (which logs the configuration), and a
    // read of a record whose text is garbage.
    std::optional<Value> config = getVornConfig(*user, &san, &error);
    ASSERT_TRUE(config);
    error.reset();
    EXPECT_EQ(saveVornConfig(*user, *config, &san, true, &error), 1);
    keep(error);
    error.reset();
    ASSERT_EQ(destroyVornConfig(*admin_, &san, &error), 0) << printed(error);
    EXPECT_EQ(logs.countStartingWith("destroyVornConfig: built "), 1u);
    ASSERT_TRUE(slapd_->addGroup(ldapSanConfNameForName("Garbled"),
                                 "<plist><dict><key>sharedSecret</key><string>" + secret, {}));
    const std::string garbled = "Garbled";
    error.reset();
    EXPECT_FALSE(getVornConfig(*admin_, &garbled, &error));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), kPosixEINVAL);
    keep(error);

    EXPECT_GE(texts.size(), 12u);
    for (const std::string& text : logs.texts()) texts.push_back(text);
  }
  for (const std::string& text : texts) {
    EXPECT_EQ(text.find(secret), std::string::npos) << text;
    EXPECT_EQ(text.find(slapd_->adminPassword()), std::string::npos) << text;
  }
}

TEST_F(DirectoryRecordsSlapdTest, Lifecycle) {
  const std::string san = "My SAN", secret = "s3cret-Shared";
  create(san, secret);
  // The records as the directory holds them.
  std::string out;
  ASSERT_EQ(slapd_->search({"-b", Slapd::groupDn("com.orvat.vorn.conf.My_20SAN"), "-s", "base",
                            "displayName", "member"},
                           &out),
            0)
      << out;
  EXPECT_NE(out.find("displayName: com.orvat.vorn.conf.My SAN\n"), std::string::npos) << out;
  EXPECT_NE(out.find("member: uid=com.orvat.vorn.auth.My_20SAN,cn=users,dc=vorn,dc=test"),
            std::string::npos)
      << out;
  ASSERT_EQ(slapd_->search({"-b", Slapd::userDn("com.orvat.vorn.auth.My_20SAN"), "-s", "base", "cn",
                            "userPassword"},
                           &out),
            0)
      << out;
  EXPECT_NE(out.find("cn: com.orvat.vorn.auth.My SAN\n"), std::string::npos) << out;
  EXPECT_EQ(out.find(secret), std::string::npos) << "the server stores the password hashed";

  Value config = stored(san);
  std::vector<std::string> keys;
  for (const auto& [key, value] : *config.findDictionary("globals")) keys.push_back(key);
  EXPECT_EQ(keys, (std::vector<std::string>{"certSetRevision", "controllers", "revision",
                                            "sharedSecret"}));
  EXPECT_EQ(*config.find("globals")->findString("revision"), kZeroUUID);

  // Saving keeps or renews the revision.
  Dictionary* globals = config.findDictionary("globals");
  globals->set("sanName", san);
  ErrorSlot error = Error::vorn(kVornSanDeleted);
  ASSERT_EQ(saveVornConfig(*admin_, config, nullptr, false, &error), 0) << printed(error);
  EXPECT_FALSE(error);
  EXPECT_EQ(stored(san), config);
  Value controllers = Value::dictionary();
  controllers.set("BBBB", Value::dictionary());
  controllers.set("AAAA", Value::dictionary());
  globals->set("controllers", controllers);
  globals->set("fsnameservers", Array{Value("10.0.0.1")});
  config.findDictionary("volumes")->set("vol1", Value::dictionary());
  ASSERT_EQ(saveVornConfig(*admin_, config, &san, true, &error), 0) << printed(error);
  const std::string revision = *config.find("globals")->findString("revision");
  EXPECT_EQ(revision.size(), 36u);
  EXPECT_NE(revision, kZeroUUID);
  EXPECT_EQ(revision.find_first_not_of("0123456789ABCDEF-"), std::string::npos) << revision;
  EXPECT_EQ(stored(san), config);

  // Saving a SAN without records creates nothing.
  const std::string none = "None";
  Value fresh = newVornConfig();
  error.reset();
  EXPECT_EQ(saveVornConfig(*admin_, fresh, &none, true, &error), 1);
  EXPECT_EQ(*error, Error::vorn(kVornNoConfiguration));
  EXPECT_FALSE(storedBytes(none));

  // The SAN's user reads what was saved.
  auto user = openSanUser(san, secret);
  ASSERT_NE(user, nullptr);
  EXPECT_EQ(getVornConfig(*user, &san, &error), config);

  // Destroying marks it dead and names a primary zombie.
  {
    LogCapture logs;
    ASSERT_EQ(destroyVornConfig(*admin_, &san, &error), 0) << printed(error);
    EXPECT_EQ(logs.countStartingWith("destroyVornConfig: built "), 1u);
    EXPECT_TRUE(logs.contains(" and rv 0"));
  }
  Value dead = stored(san);
  const Value* g = dead.find("globals");
  EXPECT_EQ(*g->findString("sanState"), "dead");
  EXPECT_EQ(*g->findString("primaryZombie"), "AAAA");
  EXPECT_FALSE(g->find("controllers"));
  EXPECT_FALSE(g->find("fsnameservers"));
  EXPECT_TRUE(dead.findDictionary("volumes")->empty());
  EXPECT_NE(*g->findString("revision"), revision);
  EXPECT_EQ(getVornConfig(*user, &san, nullptr), dead);

  // Removing takes both records; a second removal finds none.
  error.reset();
  EXPECT_EQ(culVornConfig(*admin_, &san, &error), 0) << printed(error);
  EXPECT_FALSE(storedBytes(san));
  auto gone = open(ldapNode());
  EXPECT_FALSE(
      gone->setCredentials(kRecordTypeUsers, ldapSanUserNameForName(san), secret, nullptr));
  EXPECT_EQ(culVornConfig(*admin_, &san, &error), 1);
  EXPECT_EQ(*error, Error::vorn(kVornNoConfiguration));
  // With the user missing, the group still goes and 501 is reported.
  ASSERT_TRUE(slapd_->addGroup(ldapSanConfNameForName(san), "<plist/>", {}));
  error.reset();
  EXPECT_EQ(culVornConfig(*admin_, &san, &error), 1);
  EXPECT_EQ(*error, Error::vorn(kVornNoConfiguration));
  EXPECT_FALSE(storedBytes(san));

  // Unreadable texts are POSIX 22; empty names touch nothing.
  for (const std::string garbage :
       {"not a plist", "<plist version=\"1.0\"><string>x</string></plist>"}) {
    const std::string name = "bad " + garbage;
    ASSERT_TRUE(slapd_->addGroup(ldapSanConfNameForName(name), garbage, {}));
    error.reset();
    EXPECT_FALSE(getVornConfig(*admin_, &name, &error)) << garbage;
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain(), kPosixErrorDomain);
    EXPECT_EQ(error->code(), kPosixEINVAL);
  }
  const std::size_t count = entries().size();
  const std::string empty;
  error.reset();
  EXPECT_EQ(createNewVornConfig(*admin_, &empty, &secret, &error), 1);
  EXPECT_EQ(destroyVornConfig(*admin_, &empty, &error), 1);
  EXPECT_EQ(culVornConfig(*admin_, &empty, &error), 1);
  EXPECT_FALSE(error);
  EXPECT_FALSE(getVornConfig(*admin_, &empty, &error));
  EXPECT_EQ(error->code(), kVornNoConfiguration);
  EXPECT_EQ(entries().size(), count);
}

TEST_F(DirectoryRecordsSlapdTest, TheLocalSuperuserCreatesOverLdapi) {
  auto root = open("/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi");
  ASSERT_NE(root, nullptr);
  create("Rooted", "rooted-secret", root.get());
  const std::string san = "Rooted";
  auto user = openSanUser(san, "rooted-secret");
  ASSERT_NE(user, nullptr);
  std::optional<Value> config = getVornConfig(*user, &san, nullptr);
  ASSERT_TRUE(config);
  EXPECT_EQ(*config->find("globals")->findString("sharedSecret"), "rooted-secret");
  ErrorSlot error;
  config->findDictionary("globals")->set("sanName", san);
  EXPECT_EQ(saveVornConfig(*root, *config, nullptr, true, &error), 0) << printed(error);
  EXPECT_EQ(destroyVornConfig(*root, &san, &error), 0) << printed(error);
  EXPECT_EQ(culVornConfig(*root, &san, &error), 0) << printed(error);
  EXPECT_FALSE(storedBytes(san));
}

// The server going away half-way: each operation fails with the client's
// error, passed on unchanged, and the same nodes work again once it is back.
TEST_F(DirectoryRecordsSlapdTest, AServerRestartFailsTheStepAndTheNodesRecover) {
  const std::string san = "Restarted", secret = "restarted-secret";
  create(san, secret);
  auto user = openSanUser(san, secret);
  ASSERT_NE(user, nullptr);
  Value config = stored(san);
  ASSERT_TRUE(slapd_->stop());
  ErrorSlot error;
  EXPECT_EQ(saveVornConfig(*admin_, config, &san, true, &error), 1);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain(), kDirectoryErrorDomain);
  EXPECT_EQ(error->code(), -1) << printed(error);
  error.reset();
  EXPECT_FALSE(getVornConfig(*user, &san, &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code(), -1) << printed(error);
  error.reset();
  EXPECT_EQ(destroyVornConfig(*admin_, &san, &error), 1);
  EXPECT_EQ(error->code(), -1) << printed(error);
  std::string startError;
  ASSERT_TRUE(slapd_->restart(&startError)) << startError;

  ASSERT_EQ(saveVornConfig(*admin_, config, &san, true, &error), 0) << printed(error);
  EXPECT_EQ(getVornConfig(*user, &san, &error), config) << printed(error);
  // The user is still only the SAN's user.
  EXPECT_EQ(saveVornConfig(*user, config, &san, true, &error), 1);
  EXPECT_EQ(error->code(), 50) << printed(error);
}

// SANs read and written at once from several threads, each with its own
// node, and two threads sharing one: nothing crosses between them.
TEST_F(DirectoryRecordsSlapdTest, ConcurrentReadersAndWritersStayApart) {
  constexpr int kSans = 3, kRounds = 15;
  for (int i = 0; i < kSans; ++i) create("Parallel " + std::to_string(i), "p-secret");
  auto shared = openSanUser("Parallel 0", "p-secret");
  ASSERT_NE(shared, nullptr);
  std::vector<std::string> failures[kSans + 2];
  std::vector<std::thread> threads;
  for (int i = 0; i < kSans; ++i) {
    threads.emplace_back([&, i] {
      const std::string san = "Parallel " + std::to_string(i);
      ErrorSlot error;
      auto node = sandbox_.env().openDirectoryNode(ldapNode(), &error);
      if (!node || !node->setCredentials(kRecordTypeUsers, slapd_->adminName(),
                                         slapd_->adminPassword(), &error)) {
        failures[i].push_back("open: " + printed(error));
        return;
      }
      for (int round = 0; round < kRounds; ++round) {
        std::optional<Value> config = getVornConfig(*node, &san, &error);
        if (!config) {
          failures[i].push_back("get: " + printed(error));
          continue;
        }
        config->findDictionary("globals")->set("owner", san);
        config->findDictionary("globals")->set("round", Value::integer(round));
        if (saveVornConfig(*node, *config, &san, true, &error) != 0) {
          failures[i].push_back("save: " + printed(error));
        }
      }
    });
  }
  for (int reader = 0; reader < 2; ++reader) {
    threads.emplace_back([&, reader] {
      const std::string san = "Parallel 0";
      for (int round = 0; round < kRounds; ++round) {
        ErrorSlot error;
        std::optional<Value> config = getVornConfig(*shared, &san, &error);
        const std::string* owner = config ? config->find("globals")->findString("owner") : nullptr;
        if (!config) {
          failures[kSans + reader].push_back("shared get: " + printed(error));
        } else if (owner != nullptr && *owner != san) {
          failures[kSans + reader].push_back("read another SAN's record: " + *owner);
        }
      }
    });
  }
  for (auto& t : threads) t.join();
  for (const auto& list : failures) EXPECT_TRUE(list.empty()) << list.front();
  for (int i = 0; i < kSans; ++i) {
    const std::string san = "Parallel " + std::to_string(i);
    const Value config = stored(san);
    EXPECT_EQ(*config.find("globals")->findString("owner"), san);
    EXPECT_EQ(*config.find("globals")->find("round"), Value::integer(kRounds - 1));
  }
}

// A record kolt wrote, read by the SAN's user with the ldapsearch command
// and parsed by Python's plistlib.
TEST_F(DirectoryRecordsSlapdTest, RecordsReadWithLdapsearchParseWithPlistlib) {
  const std::string san = "Tools SAN é", secret = "tools-secret";
  create(san, secret);
  Value config = stored(san);
  Dictionary* globals = config.findDictionary("globals");
  globals->set("sanName", san);
  globals->set("metadataNetwork", "10.0.0.0/24");
  Value controller = Value::dictionary();
  controller.set("hostName", "mdc-1.example.com");
  controller.set("IPAddress", "10.0.0.5");
  globals->find("controllers")->set("6B29FC40-CA47-1067-B31D-00DD010662DA", controller);
  Value volume = Value::dictionary();
  Value volumeConfig = Value::dictionary();
  volumeConfig.set("fsBlockSize", Value::integer(16384));
  volumeConfig.set("journaling", Value::boolean(true));
  volumeConfig.set("label", "Ünïcode <&> \"quoted\"");
  volume.set("config", volumeConfig);
  volume.set("controllers", Array{Value("6B29FC40-CA47-1067-B31D-00DD010662DA")});
  config.findDictionary("volumes")->set("Video", volume);
  ErrorSlot error;
  ASSERT_EQ(saveVornConfig(*admin_, config, nullptr, true, &error), 0) << printed(error);

  std::string ldif;
  ASSERT_EQ(
      slapd_->runTool("ldapsearch",
                      {"-x", "-LLL", "-o", "ldif-wrap=no", "-H", slapd_->ldapUrl(), "-D",
                       Slapd::userDn(ldapSanUserNameForName(san)), "-w", secret, "-b",
                       Slapd::groupDn(ldapSanConfNameForName(san)), "-s", "base", "vornXMLPlist"},
                      "", &ldif),
      0)
      << ldif;
  ASSERT_NE(ldif.find("vornXMLPlist:: "), std::string::npos) << ldif;

  const std::string ldifPath = sandbox_.hostPath("/record.ldif");
  std::ofstream(ldifPath) << ldif;
  const std::string script =
      "import base64, plistlib, sys\n"
      "text = open(sys.argv[1]).read()\n"
      "line = [l for l in text.splitlines() if l.startswith('vornXMLPlist:: ')][0]\n"
      "c = plistlib.loads(base64.b64decode(line.split(':: ', 1)[1]))\n"
      "g = c['globals']\n"
      "v = c['volumes']['Video']\n"
      "ctl = g['controllers']['6B29FC40-CA47-1067-B31D-00DD010662DA']\n"
      "print(g['revision']); print(g['sanName']); print(g['sharedSecret'])\n"
      "print(ctl['IPAddress']); print(v['config']['fsBlockSize'] + 1)\n"
      "print(v['config']['journaling'] is True); print(v['config']['label'])\n"
      "print(v['controllers'][0])\n";
  const std::string scriptPath = sandbox_.hostPath("/read.py");
  std::ofstream(scriptPath) << script;
  FILE* pipe = ::popen(("python3 " + scriptPath + " " + ldifPath + " 2>&1").c_str(), "r");
  ASSERT_NE(pipe, nullptr);
  std::string output;
  char buffer[4096];
  while (std::size_t n = std::fread(buffer, 1, sizeof buffer, pipe)) output.append(buffer, n);
  EXPECT_EQ(::pclose(pipe), 0) << output;
  EXPECT_EQ(output, *config.find("globals")->findString("revision") + "\n" + san + "\n" + secret +
                        "\n10.0.0.5\n16385\nTrue\nÜnïcode <&> \"quoted\"\n"
                        "6B29FC40-CA47-1067-B31D-00DD010662DA\n");
}

}  // namespace
}  // namespace kolt::testing
