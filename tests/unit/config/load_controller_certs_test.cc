// loadControllerCerts: which node it opens, the custom call, the restart of
// the directory-service daemon and its log lines.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include "fixtures/fault_env.h"
#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "kolt/controller_helpers.h"
#include "kolt/directory.h"

namespace kolt {
namespace {

using testing::FaultEnv;
using testing::LogCapture;
using testing::Sandbox;

class RecordingNode : public DirectoryNode {
 public:
  RecordingNode(std::string name, std::vector<int>* calls, bool fail)
      : name_(std::move(name)), calls_(calls), fail_(fail) {}
  const std::string& nodeName() const override { return name_; }
  bool setCredentials(std::string_view, const std::string&, const std::string&,
                      ErrorSlot*) override {
    return false;
  }
  std::optional<std::vector<std::unique_ptr<DirectoryRecord>>> queryRecords(RecordType,
                                                                            const std::string&,
                                                                            Attribute, std::size_t,
                                                                            ErrorSlot*) override {
    return std::nullopt;
  }
  std::unique_ptr<DirectoryRecord> createRecord(
      RecordType, const std::string&, const std::map<Attribute, std::vector<std::string>>&,
      ErrorSlot*) override {
    return nullptr;
  }
  bool customCall(int code, ErrorSlot* error) override {
    calls_->push_back(code);
    if (fail_) setError(error, Error(std::string(kDirectoryErrorDomain), -1, "no server"));
    return !fail_;
  }

 private:
  std::string name_;
  std::vector<int>* calls_;
  bool fail_;
};

// Opens recording nodes (or refuses to) and records signals to jobs.
class DirectoryFakeEnv : public FaultEnv {
 public:
  using FaultEnv::FaultEnv;
  std::unique_ptr<DirectoryNode> openDirectoryNode(const std::string& nodeName,
                                                   ErrorSlot* error) override {
    openedNodes.push_back(nodeName);
    if (refuseOpen) {
      setError(error, Error(std::string(kDirectoryErrorDomain), 49, "refused"));
      return nullptr;
    }
    return std::make_unique<RecordingNode>(nodeName, &customCalls, failCustomCall);
  }
  std::vector<std::string> openedNodes;
  std::vector<int> customCalls;
  bool refuseOpen = false;
  bool failCustomCall = false;
};

class LoadControllerCertsTest : public ::testing::Test {
 protected:
  LoadControllerCertsTest() : env_(&sandbox_.env()), scoped_(&env_) { env_.fakeSleeps(); }
  Sandbox sandbox_;
  DirectoryFakeEnv env_;
  ScopedEnv scoped_;
  LogCapture logs_;
};

TEST_F(LoadControllerCertsTest, TakesTheHostFromAnLdapUrlOrUsesTheTextAsHost) {
  loadControllerCerts("ldaps://10.1.2.3:636/base");
  loadControllerCerts("ldap://ctl.example");
  loadControllerCerts("ctl2.example:389");
  EXPECT_EQ(env_.openedNodes,
            (std::vector<std::string>{"/LDAPv3/ldap://10.1.2.3:636", "/LDAPv3/ldap://ctl.example",
                                      "/LDAPv3/ldap://ctl2.example:389"}));
  EXPECT_EQ(env_.customCalls, (std::vector<int>{98000, 98000, 98000}));
  EXPECT_TRUE(logs_.contains("loadControllerCerts called on 10.1.2.3:636"));
  EXPECT_FALSE(logs_.contains("ClientAddCACerts returned"));
}

TEST_F(LoadControllerCertsTest, AShortLdapUrlReturnsAtOnceWithoutALine) {
  loadControllerCerts("ldap:");
  loadControllerCerts("ldaps:/x");
  EXPECT_TRUE(env_.openedNodes.empty());
  EXPECT_TRUE(logs_.texts().empty());
  EXPECT_TRUE(env_.sleeps().empty());
}

TEST_F(LoadControllerCertsTest, FailuresAreLoggedAndAClosedNodeGetsNoCall) {
  env_.refuseOpen = true;
  loadControllerCerts("ldap://10.0.0.1");
  EXPECT_TRUE(env_.customCalls.empty());
  EXPECT_TRUE(logs_.contains("ClientAddCACerts returned "));
  EXPECT_TRUE(logs_.contains("refused"));

  env_.refuseOpen = false;
  env_.failCustomCall = true;
  loadControllerCerts("ldap://10.0.0.1");
  EXPECT_EQ(env_.customCalls, std::vector<int>{98000});
  EXPECT_TRUE(logs_.contains("no server"));
}

TEST_F(LoadControllerCertsTest, AnLdapsServerThatRefusesStartTlsIsAskedOverTls) {
  env_.failCustomCall = true;
  loadControllerCerts("ldaps://10.1.2.3:636/base");
  EXPECT_EQ(env_.openedNodes, (std::vector<std::string>{"/LDAPv3/ldap://10.1.2.3:636",
                                                        "/LDAPv3/ldaps://10.1.2.3:636"}));
  EXPECT_EQ(env_.customCalls, (std::vector<int>{98000, 98000}));
  EXPECT_TRUE(logs_.contains("ClientAddCACerts returned "));
}

TEST_F(LoadControllerCertsTest, WithoutTheDaemonItSaysSoAndDoesNotWait) {
  loadControllerCerts("ldap://10.0.0.1");
  EXPECT_TRUE(
      logs_.contains("Unable to kill opendirectoryd. If Vorn profile load fails, try again"));
  EXPECT_TRUE(env_.sleeps().empty());
}

TEST_F(LoadControllerCertsTest, StopsTheDaemonThroughTheRegistryAndWaitsThreeSeconds) {
  const pid_t daemon = ::fork();
  ASSERT_GE(daemon, 0);
  if (daemon == 0) {
    ::pause();
    ::_exit(0);
  }
  sandbox_.writeFile("/var/run/com.orvat.opendirectoryd.pid", std::to_string(daemon) + "\n");

  loadControllerCerts("ldap://10.0.0.1");

  int status = 0;
  ASSERT_EQ(::waitpid(daemon, &status, 0), daemon);
  EXPECT_TRUE(WIFSIGNALED(status));
  EXPECT_EQ(WTERMSIG(status), SIGTERM);
  EXPECT_EQ(env_.sleeps(), std::vector<double>{3});
  EXPECT_FALSE(logs_.contains("Unable to kill opendirectoryd"));
}

}  // namespace
}  // namespace kolt
