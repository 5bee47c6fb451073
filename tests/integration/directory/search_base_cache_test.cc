// The Env's search-base cache against real servers: a node of a known server
// opens without reading the root DSE, but still connects; a cached base that
// the server no longer has is read anew once, whatever the operation that
// finds it out; ldapi and ldaps nodes keep their special ways.
#include <gtest/gtest.h>

#include <stdlib.h>

#include <atomic>
#include <filesystem>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "fixtures/slapd.h"
#include "kolt/directory.h"
#include "kolt/env.h"
#include "platform/directory/node_address.h"
#include "platform/directory/trust_store.h"

namespace kolt::testing {
namespace {

namespace fs = std::filesystem;

constexpr const char* kLdapiNode = "/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi";

std::string printed(const ErrorSlot& e) {
  return e ? e->printed() : "(no error)";
}

// A sandbox root whose /var/run/ldapi is the socket of the servers started
// in it; each test makes its own Envs (and so its own caches) over it.
class CacheTest : public ::testing::Test {
 protected:
  void SetUp() override {
    char tmpl[] = "/tmp/kolt-sandbox-XXXXXX";
    ASSERT_NE(::mkdtemp(tmpl), nullptr);
    root_ = tmpl;
  }
  void TearDown() override {
    servers_.clear();
    std::error_code ignored;
    fs::remove_all(root_, ignored);
  }

  // Starts a server with `suffix` on `like`'s ports and socket (or fresh
  // ones), holding the SAN "S" whose configuration is `xml`.
  Slapd* startServer(const std::string& suffix, const std::string& xml,
                     const Slapd* like = nullptr) {
    SlapdOptions options;
    options.ldapiSocketPath = root_ + "/var/run/ldapi";
    options.baseDn = suffix;
    if (like) {
      options.ldapPort = like->ldapPort();
      options.ldapsPort = like->ldapsPort();
    }
    std::string error;
    auto server = Slapd::start(options, &error);
    EXPECT_NE(server, nullptr) << error;
    if (!server) return nullptr;
    EXPECT_TRUE(server->addUser("auth.S", "secret-S", &error)) << error;
    EXPECT_TRUE(server->addGroup("conf.S", xml, {"auth.S"}, &error)) << error;
    servers_.push_back(std::move(server));
    return servers_.back().get();
  }

  std::unique_ptr<Env> newEnv() { return newPosixEnv(root_); }

  void trust(const Slapd& server) {
    fs::create_directories(root_ + std::string(kTrustStoreDirectory));
    fs::copy_file(server.caCertificatePath(), root_ + std::string(kTrustStoreDirectory) + "/ca.pem",
                  fs::copy_options::overwrite_existing);
  }
  void distrust() { fs::remove_all(root_ + std::string(kTrustStoreDirectory)); }

  static std::string ldapNode(const Slapd& s) { return "/LDAPv3/" + s.ldapUrl(); }
  static std::string ldapKey(const Slapd& s) { return serverKey(*parseNodeName(ldapNode(s))); }
  static std::string ldapsKey(const Slapd& s) {
    return serverKey(*parseNodeName("/LDAPv3/" + s.ldapsUrl()));
  }
  static std::string ldapiKey(Env& env) {
    return "ldapi://" + percentEncodePath(env.hostPath("/var/run/ldapi"));
  }

  // The configuration of "conf.<san>" as the node reads it; "<absent>" when
  // the query finds no record, "<error: ...>" when it fails.
  static std::string readConfig(DirectoryNode& node, const std::string& san = "S") {
    ErrorSlot error;
    auto found =
        node.queryRecords(RecordType::kGroups, "conf." + san, Attribute::kXMLPlist, 1, &error);
    if (!found) return "<error: " + printed(error) + ">";
    if (found->empty()) return "<absent>";
    auto values = (*found)[0]->valuesForAttribute(Attribute::kXMLPlist, &error);
    if (!values || values->size() != 1) return "<error: " + printed(error) + ">";
    return std::string((*values)[0]);
  }

  // Opens `nodeName` in `env` as the SAN's user.
  static std::unique_ptr<DirectoryNode> openAsSan(Env& env, const std::string& nodeName,
                                                  ErrorSlot* error,
                                                  const std::string& secret = "secret-S") {
    auto node = env.openDirectoryNode(nodeName, error);
    if (!node || !node->setCredentials(kRecordTypeUsers, "auth.S", secret, error)) return nullptr;
    return node;
  }

  std::string root_;
  std::vector<std::unique_ptr<Slapd>> servers_;
};

TEST_F(CacheTest, ANodeOfAKnownServerTakesItsBaseFromTheCache) {
  Slapd* server = startServer("dc=vorn,dc=test", "<main/>");
  ASSERT_NE(server, nullptr);
  auto env = newEnv();
  ErrorSlot error;
  // The first opening reads the root DSE and remembers what it found.
  auto first = openAsSan(*env, ldapNode(*server), &error);
  ASSERT_NE(first, nullptr) << printed(error);
  auto entry = env->searchBaseCache().find(ldapKey(*server));
  ASSERT_TRUE(entry.has_value());
  EXPECT_EQ(entry->base, "dc=vorn,dc=test");
  EXPECT_EQ(entry->namingContexts, std::vector<std::string>{"dc=vorn,dc=test"});
  auto superuser = env->openDirectoryNode(kLdapiNode, &error);
  ASSERT_NE(superuser, nullptr) << printed(error);
  ASSERT_TRUE(env->searchBaseCache().find(ldapiKey(*env)).has_value());

  // A decoy subtree with its own containers and a SAN of the same name: a
  // node that reads the root DSE never looks there, one that takes the
  // cache's word does.
  ASSERT_EQ(server->modify("dn: ou=decoy,dc=vorn,dc=test\nobjectClass: organizationalUnit\n"
                           "ou: decoy\n\n"
                           "dn: cn=users,ou=decoy,dc=vorn,dc=test\nobjectClass: "
                           "organizationalRole\ncn: users\n\n"
                           "dn: cn=groups,ou=decoy,dc=vorn,dc=test\nobjectClass: "
                           "organizationalRole\ncn: groups\n\n"
                           "dn: cn=conf.S,cn=groups,ou=decoy,dc=vorn,dc=test\nobjectClass: "
                           "vornGroup\ncn: conf.S\nvornXMLPlist: <decoy/>\n"),
            0);
  const std::string decoy = "ou=decoy,dc=vorn,dc=test";
  env->searchBaseCache().store(ldapiKey(*env), {{decoy}, decoy});
  auto cached = env->openDirectoryNode(kLdapiNode, &error);
  ASSERT_NE(cached, nullptr) << printed(error);
  EXPECT_EQ(readConfig(*cached), "<decoy/>");
  // Another Env knows nothing and reads the root DSE.
  auto fresh = newEnv();
  auto uncached = fresh->openDirectoryNode(kLdapiNode, &error);
  ASSERT_NE(uncached, nullptr) << printed(error);
  EXPECT_EQ(readConfig(*uncached), "<main/>");
  // The nodes opened before keep their base.
  EXPECT_EQ(readConfig(*first), "<main/>");
  EXPECT_EQ(readConfig(*superuser), "<main/>");
}

TEST_F(CacheTest, AServerSetUpAnewWithAnotherSuffixIsFoundAgain) {
  Slapd* before = startServer("dc=vorn,dc=test", "<before/>");
  ASSERT_NE(before, nullptr);
  auto env = newEnv();
  trust(*before);
  ErrorSlot error;
  for (const std::string& node : {ldapNode(*before), "/LDAPv3/" + before->ldapsUrl()}) {
    auto member = openAsSan(*env, node, &error);
    ASSERT_NE(member, nullptr) << node << printed(error);
    EXPECT_EQ(readConfig(*member), "<before/>");
  }
  auto superuser = env->openDirectoryNode(kLdapiNode, &error);
  ASSERT_NE(superuser, nullptr) << printed(error);
  SearchBaseCache& cache = env->searchBaseCache();
  const auto staleLdap = cache.find(ldapKey(*before));
  const auto staleLdaps = cache.find(ldapsKey(*before));
  const auto staleLdapi = cache.find(ldapiKey(*env));
  ASSERT_TRUE(staleLdap && staleLdaps && staleLdapi);

  // The same address, socket and SAN, served under another suffix.
  ASSERT_TRUE(before->stop());
  Slapd* after = startServer("dc=other,dc=test", "<after/>", before);
  ASSERT_NE(after, nullptr);
  ASSERT_EQ(after->ldapUrl(), before->ldapUrl());
  trust(*after);
  const std::vector<std::string> fresh{"dc=other,dc=test"};
  auto stale = [&](const std::string& key, const SearchBaseCache::Entry& entry) {
    cache.store(key, entry);
  };
  auto contexts = [&](const std::string& key) {
    auto entry = cache.find(key);
    return entry ? entry->namingContexts : std::vector<std::string>{"<not cached>"};
  };

  // The SAN's user is not under the cached base: its bind fails there, and
  // is tried once more under the server's current base (ldap, ldaps).
  for (const std::string& node : {ldapNode(*after), "/LDAPv3/" + after->ldapsUrl()}) {
    auto member = openAsSan(*env, node, &error);
    ASSERT_NE(member, nullptr) << node << printed(error);
    EXPECT_EQ(readConfig(*member), "<after/>") << node;
  }
  EXPECT_EQ(contexts(ldapKey(*after)), fresh);
  EXPECT_EQ(contexts(ldapsKey(*after)), fresh);

  // The superuser's search finds no container under the cached base (32),
  // and is tried once more.
  {
    auto node = env->openDirectoryNode(kLdapiNode, &error);
    ASSERT_NE(node, nullptr) << printed(error);
    EXPECT_EQ(readConfig(*node), "<after/>");
    EXPECT_EQ(contexts(ldapiKey(*env)), fresh);
  }
  // So is its creation of a record (32 from the add).
  {
    stale(ldapiKey(*env), *staleLdapi);
    auto node = env->openDirectoryNode(kLdapiNode, &error);
    ASSERT_NE(node, nullptr) << printed(error);
    ASSERT_NE(node->createRecord(RecordType::kGroups, "conf.New", {}, &error), nullptr)
        << printed(error);
    std::string out;
    EXPECT_EQ(
        after->search({"-b", "cn=conf.New,cn=groups,dc=other,dc=test", "-s", "base", "1.1"}, &out),
        0)
        << out;
  }
  // A record that the current base does not hold either: one more search,
  // then the empty answer.
  {
    stale(ldapiKey(*env), *staleLdapi);
    auto node = env->openDirectoryNode(kLdapiNode, &error);
    ASSERT_NE(node, nullptr) << printed(error);
    EXPECT_EQ(readConfig(*node, "Nowhere"), "<absent>");
    EXPECT_EQ(readConfig(*node, "S"), "<after/>");
  }
  // A wrong password under a stale base is still a wrong password; the
  // base is found anew all the same.
  {
    stale(ldapKey(*after), *staleLdap);
    EXPECT_EQ(openAsSan(*env, ldapNode(*after), &error, "wrong"), nullptr);
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->code(), 49) << printed(error);
    EXPECT_EQ(error->printed().find("wrong"), std::string::npos);
    EXPECT_EQ(contexts(ldapKey(*after)), fresh);
    error.reset();
  }
  // A wrong password under the right base leaves the cache as it was.
  EXPECT_EQ(openAsSan(*env, ldapNode(*after), &error, "wrong"), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), 49) << printed(error);
  EXPECT_EQ(contexts(ldapKey(*after)), fresh);
  error.reset();
  // Nodes opened before the server changed connect again after its restart
  // and find the new base on their own.
  EXPECT_EQ(readConfig(*superuser), "<after/>");

  // A known server that is gone still fails the opening: the connection is
  // made all the same.
  ASSERT_TRUE(after->stop());
  for (const std::string& node :
       {ldapNode(*after), "/LDAPv3/" + after->ldapsUrl(), std::string(kLdapiNode)}) {
    ErrorSlot gone;
    EXPECT_EQ(env->openDirectoryNode(node, &gone), nullptr) << node;
    ASSERT_TRUE(gone.has_value()) << node;
    EXPECT_EQ(gone->code(), -1) << node << printed(gone);
  }
}

TEST_F(CacheTest, AnUntrustedLdapsServerStillOpensForTheCustomCallOnly) {
  Slapd* server = startServer("dc=vorn,dc=test", "<tls/>");
  ASSERT_NE(server, nullptr);
  auto env = newEnv();
  const std::string ldaps = "/LDAPv3/" + server->ldapsUrl();
  trust(*server);
  ErrorSlot error;
  ASSERT_NE(openAsSan(*env, ldaps, &error), nullptr) << printed(error);
  ASSERT_TRUE(env->searchBaseCache().find(ldapsKey(*server)).has_value());

  // With the base known but the certificate no longer trusted, the node
  // opens (the handshake is made), but nothing is read or sent.
  distrust();
  auto node = env->openDirectoryNode(ldaps, &error);
  ASSERT_NE(node, nullptr) << printed(error);
  EXPECT_FALSE(node->setCredentials(kRecordTypeUsers, "auth.S", "secret-S", &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_LT(error->code(), 0) << printed(error);
  EXPECT_EQ(readConfig(*node).rfind("<error: ", 0), 0u);
  // The custom call trusts it; then the same node works.
  error.reset();
  ASSERT_TRUE(node->customCall(kCustomCallClientAddCACerts, &error)) << printed(error);
  EXPECT_TRUE(node->setCredentials(kRecordTypeUsers, "auth.S", "secret-S", &error))
      << printed(error);
  EXPECT_EQ(readConfig(*node), "<tls/>");
}

TEST_F(CacheTest, NodesOpenedTogetherShareTheCache) {
  Slapd* server = startServer("dc=vorn,dc=test", "<shared/>");
  ASSERT_NE(server, nullptr);
  auto env = newEnv();
  const std::string stale = "dc=gone,dc=test";
  // Half the threads start from a stale entry that they drop and refill
  // while the others read through it.
  env->searchBaseCache().store(ldapKey(*server), {{stale}, stale});
  std::atomic<int> good{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < 10; ++i) {
        ErrorSlot error;
        auto node = t % 2 == 0 ? openAsSan(*env, ldapNode(*server), &error)
                               : env->openDirectoryNode(kLdapiNode, &error);
        if (node && readConfig(*node) == "<shared/>") ++good;
        if (t == 0 && i % 3 == 0) env->searchBaseCache().store(ldapKey(*server), {{stale}, stale});
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(good.load(), 40);
}

}  // namespace
}  // namespace kolt::testing
