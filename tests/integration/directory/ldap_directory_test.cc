// What only the LDAP client has: TLS and kolt's trust store, the custom call
// that fills it, records as plain LDAP tools see them, the server's own
// password operation, replication, and the fixture's
// promise to stop its server when the test process dies.
#include <netdb.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <thread>

#include "fixtures/shared_slapd_test.h"
#include "fixtures/slapd.h"
#include "kolt/directory.h"
#include "kolt/env.h"
#include "platform/directory/ldap_escape.h"
#include "platform/directory/trust_store.h"

namespace kolt::testing {
namespace {

namespace fs = std::filesystem;

std::string printed(const ErrorSlot& e) {
  return e ? e->printed() : "(no error)";
}

// A sandbox root with its own PosixEnv; removed at the end.
class Sandbox {
 public:
  Sandbox() {
    char tmpl[] = "/tmp/kolt-sandbox-XXXXXX";
    root_ = ::mkdtemp(tmpl);
    env_ = newPosixEnv(root_);
  }
  ~Sandbox() {
    std::error_code ignored;
    fs::remove_all(root_, ignored);
  }
  Env& env() { return *env_; }
  const std::string& root() const { return root_; }
  void trust(const std::string& caPath) {
    fs::create_directories(root_ + std::string(kTrustStoreDirectory));
    fs::copy_file(caPath, root_ + std::string(kTrustStoreDirectory) + "/ca.pem");
  }
  std::size_t trustedFiles() const {
    std::size_t n = 0;
    std::error_code ec;
    for (auto it = fs::directory_iterator(root_ + std::string(kTrustStoreDirectory), ec);
         !ec && it != fs::directory_iterator(); ++it) {
      ++n;
    }
    return n;
  }

 private:
  std::string root_;
  std::unique_ptr<Env> env_;
};

class LdapDirectoryTest : public SharedSlapdTest {
 protected:

  Slapd& server() { return *server_; }

  // Opens `nodeName` in `sandbox` and binds as the administrator.
  std::unique_ptr<DirectoryNode> adminNode(Sandbox& sandbox, const std::string& nodeName,
                                           ErrorSlot* error, Slapd* of = nullptr) {
    Slapd& s = of ? *of : server();
    auto node = sandbox.env().openDirectoryNode(nodeName, error);
    if (!node) return nullptr;
    if (!node->setCredentials(kRecordTypeUsers, s.adminName(), s.adminPassword(), error)) {
      return nullptr;
    }
    return node;
  }
};

TEST_F(LdapDirectoryTest, LdapsVerifiesTheServerAgainstKoltsTrustStore) {
  Sandbox sandbox;
  ErrorSlot error;
  EXPECT_EQ(adminNode(sandbox, "/LDAPv3/" + server().ldapsUrl(), &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->domain(), kDirectoryErrorDomain);
  EXPECT_LT(error->code(), 0) << printed(error);
  EXPECT_EQ(error->printed().find(server().adminPassword()), std::string::npos);
  // The untrusted node opens, but reads nothing from the server.
  auto untrusted = sandbox.env().openDirectoryNode("/LDAPv3/" + server().ldapsUrl(), &error);
  ASSERT_NE(untrusted, nullptr) << printed(error);
  error.reset();
  EXPECT_FALSE(untrusted->queryRecords(RecordType::kGroups, "x", Attribute::kXMLPlist, 1, &error));
  ASSERT_TRUE(error.has_value());
  EXPECT_LT(error->code(), 0) << printed(error);

  sandbox.trust(server().caCertificatePath());
  error.reset();
  EXPECT_NE(adminNode(sandbox, "/LDAPv3/" + server().ldapsUrl(), &error), nullptr)
      << printed(error);
}

TEST_F(LdapDirectoryTest, CustomCallTrustsTheServersCertificates) {
  const std::string ldaps = "/LDAPv3/" + server().ldapsUrl();
  // Over TLS directly on an ldaps:// node, or StartTLS on an ldap:// one;
  // both open before the server is trusted.
  for (const std::string& url : {server().ldapsUrl(), server().ldapUrl()}) {
    Sandbox sandbox;
    ErrorSlot error;
    auto node = sandbox.env().openDirectoryNode("/LDAPv3/" + url, &error);
    ASSERT_NE(node, nullptr) << url << printed(error);
    EXPECT_EQ(adminNode(sandbox, ldaps, &error), nullptr);
    ASSERT_TRUE(error.has_value());
    EXPECT_LT(error->code(), 0) << printed(error);
    error.reset();
    ASSERT_TRUE(node->customCall(kCustomCallClientAddCACerts, &error)) << url << printed(error);
    EXPECT_EQ(sandbox.trustedFiles(), 1u) << url;  // the CA, not the server's own certificate
    EXPECT_NE(adminNode(sandbox, ldaps, &error), nullptr) << url << printed(error);
    // The node opened untrusted works now.
    EXPECT_TRUE(node->setCredentials(kRecordTypeUsers, server().adminName(),
                                     server().adminPassword(), &error))
        << url << printed(error);
    // Doing it again changes nothing.
    EXPECT_TRUE(node->customCall(kCustomCallClientAddCACerts, &error));
    EXPECT_EQ(sandbox.trustedFiles(), 1u);
  }
}

TEST_F(LdapDirectoryTest, AnUnreachableServerTrustsNothing) {
  Sandbox sandbox;
  for (const std::string scheme : {"ldap", "ldaps"}) {
    ErrorSlot error;
    EXPECT_EQ(
        sandbox.env().openDirectoryNode(
            "/LDAPv3/" + scheme + "://127.0.0.1:" + std::to_string(freeLoopbackPort()), &error),
        nullptr);
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->code(), -1) << printed(error);
  }
  EXPECT_EQ(sandbox.trustedFiles(), 0u);
}

TEST_F(LdapDirectoryTest, StartTlsProtectsBindsToAnotherHostName) {
  // The machine's own name is no loopback name to the rule, so an ldap://
  // node naming it must upgrade before it binds.
  char host[256] = {0};
  ::gethostname(host, sizeof host - 1);
  addrinfo* list = nullptr;
  addrinfo hints{};
  hints.ai_family = AF_INET;
  if (::getaddrinfo(host, nullptr, &hints, &list) != 0) GTEST_SKIP() << "host name unresolved";
  const bool loopback =
      (ntohl(reinterpret_cast<sockaddr_in*>(list->ai_addr)->sin_addr.s_addr) >> 8) == 0x7f0000;
  ::freeaddrinfo(list);
  if (!loopback) GTEST_SKIP() << "the host name does not lead to 127.0.0.1";
  const std::string node =
      "/LDAPv3/ldap://" + std::string(host) + ":" + std::to_string(server().ldapPort());

  Sandbox untrusting;
  ErrorSlot error;
  EXPECT_EQ(adminNode(untrusting, node, &error), nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_NE(error->description()->find("StartTLS"), std::string::npos) << printed(error);

  Sandbox trusting;
  trusting.trust(server().caCertificatePath());
  error.reset();
  auto admin = adminNode(trusting, node, &error);
  ASSERT_NE(admin, nullptr) << printed(error);
  EXPECT_TRUE(admin->queryRecords(RecordType::kUsers, server().adminName(), Attribute::kFullName, 1,
                                  &error));
}

TEST_F(LdapDirectoryTest, RecordsAreReadableWithPlainLdapTools) {
  Sandbox sandbox;
  ErrorSlot error;
  auto admin = adminNode(sandbox, "/LDAPv3/" + server().ldapUrl(), &error);
  ASSERT_NE(admin, nullptr) << printed(error);
  const std::string group = "com.orvat.vorn.conf.Tools,+=";
  const std::string user = "com.orvat.vorn.auth.Tools,+=";
  auto u = admin->createRecord(RecordType::kUsers, user, {{Attribute::kFullName, {"Tools user"}}},
                               &error);
  auto g = admin->createRecord(
      RecordType::kGroups, group,
      {{Attribute::kXMLPlist, {"<plist>tools</plist>"}}, {Attribute::kFullName, {"Tools"}}},
      &error);
  ASSERT_TRUE(u && g) << printed(error);
  ASSERT_TRUE(g->addMemberRecord(*u, &error)) << printed(error);

  std::string out;
  ASSERT_EQ(server().search({"-b", Slapd::groupDn(group), "-s", "base", "objectClass",
                             "vornXMLPlist", "displayName", "member"},
                            &out),
            0)
      << out;
  EXPECT_NE(out.find("objectClass: vornGroup"), std::string::npos) << out;
  // Octet strings come as base64: "<plist>tools</plist>".
  EXPECT_NE(out.find("vornXMLPlist:: PHBsaXN0PnRvb2xzPC9wbGlzdD4="), std::string::npos) << out;
  EXPECT_NE(out.find("displayName: Tools"), std::string::npos) << out;
  const std::size_t member = out.find("member: ");
  ASSERT_NE(member, std::string::npos) << out;
  const std::string memberDn = out.substr(member + 8, out.find('\n', member) - member - 8);
  EXPECT_TRUE(sameDn(memberDn, Slapd::userDn(user))) << memberDn;

  ASSERT_EQ(server().search({"-b", Slapd::userDn(user), "-s", "base", "cn", "sn", "uid"}, &out), 0)
      << out;
  EXPECT_NE(out.find("cn: Tools user"), std::string::npos) << out;
  EXPECT_NE(out.find("sn: " + user), std::string::npos) << out;
}

TEST_F(LdapDirectoryTest, ASansUserCannotChangeItsOwnPasswordWithTheServersOperation) {
  ASSERT_TRUE(server().addUser("own-password", "old-secret"));
  std::string out;
  EXPECT_NE(server().runTool("ldappasswd",
                             {"-x", "-H", server().ldapUrl(), "-D", Slapd::userDn("own-password"),
                              "-w", "old-secret", "-s", "new-secret"},
                             "", &out),
            0)
      << out;
  Sandbox sandbox;
  ErrorSlot error;
  auto node = sandbox.env().openDirectoryNode("/LDAPv3/" + server().ldapUrl(), &error);
  EXPECT_TRUE(node->setCredentials(kRecordTypeUsers, "own-password", "old-secret", &error))
      << printed(error);
}

TEST_F(LdapDirectoryTest, LdapiSocketPathsLiveBelowTheRootAndStayShort) {
  Sandbox sandbox;
  ErrorSlot error;
  EXPECT_EQ(sandbox.env().openDirectoryNode(
                "/LDAPv3/ldapi://" + std::string(120, 'x').insert(0, "%2F"), &error),
            nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), -9);
  // The sandbox has no socket at /var/run/ldapi: the machine's is not used.
  error.reset();
  EXPECT_EQ(sandbox.env().openDirectoryNode("/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi", &error),
            nullptr);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code(), -1);
}

TEST_F(LdapDirectoryTest, AnLdapiNodeOutlivesAServerRestart) {
  // A request written to a Unix socket whose server is gone raises SIGPIPE,
  // which would end the caller's process: the node must notice and connect
  // again, also when it is destroyed while the server is down.
  std::unique_ptr<Slapd> own = Slapd::start();
  ASSERT_NE(own, nullptr);
  std::unique_ptr<Env> env = newPosixEnv("/");  // the socket's host path as it is
  ErrorSlot error;
  const std::string nodeName = "/LDAPv3/" + own->ldapiUrl();
  auto node = env->openDirectoryNode(nodeName, &error);
  ASSERT_NE(node, nullptr) << printed(error);
  auto doomed = env->openDirectoryNode(nodeName, &error);
  ASSERT_NE(doomed, nullptr) << printed(error);
  ASSERT_TRUE(own->restart());
  auto found =
      node->queryRecords(RecordType::kUsers, own->adminName(), Attribute::kFullName, 1, &error);
  ASSERT_TRUE(found) << printed(error);
  EXPECT_EQ(found->size(), 1u);
  ASSERT_TRUE(own->stop());
  doomed.reset();
  EXPECT_FALSE(
      node->queryRecords(RecordType::kUsers, own->adminName(), Attribute::kFullName, 1, &error));
}

TEST_F(LdapDirectoryTest, APairOfServersReplicatesEachWay) {
  std::unique_ptr<Slapd> a, b;
  std::string startError;
  ASSERT_TRUE(Slapd::startReplicatingPair(&a, &b, &startError)) << startError;
  Sandbox sandbox;
  ErrorSlot error;
  auto onA = adminNode(sandbox, "/LDAPv3/" + a->ldapUrl(), &error, a.get());
  auto onB = adminNode(sandbox, "/LDAPv3/" + b->ldapUrl(), &error, b.get());
  ASSERT_TRUE(onA && onB) << printed(error);

  auto eventually = [](DirectoryNode& node, const std::string& name, const std::string& value) {
    for (int i = 0; i < 250; ++i) {
      auto found = node.queryRecords(RecordType::kGroups, name, Attribute::kXMLPlist, 1, nullptr);
      if (found && found->size() == 1) {
        auto values = (*found)[0]->valuesForAttribute(Attribute::kXMLPlist, nullptr);
        if (values && values->size() == 1 && (*values)[0] == value) return true;
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return false;
  };
  ASSERT_TRUE(onA->createRecord(RecordType::kGroups, "replicated",
                                {{Attribute::kXMLPlist, {"<from-a/>"}}}, &error));
  EXPECT_TRUE(eventually(*onB, "replicated", "<from-a/>"));

  // With A down, B takes writes; A catches up when it is back.
  ASSERT_TRUE(a->stop());
  auto onBRecord =
      onB->queryRecords(RecordType::kGroups, "replicated", Attribute::kXMLPlist, 1, &error);
  ASSERT_TRUE(onBRecord && onBRecord->size() == 1) << printed(error);
  ASSERT_TRUE((*onBRecord)[0]->setValues(Attribute::kXMLPlist, {"<from-b/>"}, &error));
  ASSERT_TRUE(a->restart(&startError)) << startError;
  EXPECT_TRUE(eventually(*onA, "replicated", "<from-b/>"));
}

TEST_F(LdapDirectoryTest, TheServerStopsWhenItsTestProcessDies) {
  int fds[2];
  ASSERT_EQ(::pipe(fds), 0);
  const pid_t child = ::fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    ::close(fds[0]);
    auto server = Slapd::start();
    const pid_t pid = server ? server->pid() : -1;
    (void)!::write(fds[1], &pid, sizeof pid);
    ::_exit(0);  // a crash: no destructor, no stop()
  }
  ::close(fds[1]);
  pid_t serverPid = -1;
  ASSERT_EQ(::read(fds[0], &serverPid, sizeof serverPid), static_cast<ssize_t>(sizeof serverPid));
  ::close(fds[0]);
  ::waitpid(child, nullptr, 0);
  ASSERT_GT(serverPid, 0);
  bool gone = false;
  for (int i = 0; i < 500 && !gone; ++i) {
    gone = ::kill(serverPid, 0) != 0;
    if (!gone) std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }
  EXPECT_TRUE(gone) << "slapd " << serverPid << " outlived its test process";
}

}  // namespace
}  // namespace kolt::testing
