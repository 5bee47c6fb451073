// loadControllerCerts against a real directory server: a TLS connection that
// verifies the server fails before the call and succeeds after it.
#include <gtest/gtest.h>

#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "fixtures/shared_slapd_test.h"
#include "fixtures/slapd.h"
#include "kolt/controller_helpers.h"
#include "kolt/directory.h"

namespace kolt::testing {
namespace {

class LoadControllerCertsLdapTest : public SharedSlapdTest {
 protected:

  // Binds as the administrator over ldaps, verifying the server.
  static bool verifiedBind(ErrorSlot* error) {
    auto node = currentEnv().openDirectoryNode("/LDAPv3/" + server_->ldapsUrl(), error);
    return node && node->setCredentials(kRecordTypeUsers, server_->adminName(),
                                        server_->adminPassword(), error);
  }
};

TEST_F(LoadControllerCertsLdapTest, TrustsTheServerNamedByAnyFormOfItsUrl) {
  // The configuration names controllers as ldap:// or ldaps:// URLs with a
  // search base, or as host:port.
  const std::string hostPort = server_->ldapUrl().substr(std::string("ldap://").size());
  for (const std::string& url :
       {server_->ldapUrl(), server_->ldapsUrl() + "/dc=vorn,dc=test", hostPort}) {
    Sandbox sandbox;
    LogCapture logs;
    ErrorSlot error;
    EXPECT_FALSE(verifiedBind(&error)) << url;

    loadControllerCerts(url);

    EXPECT_FALSE(logs.contains("ClientAddCACerts returned")) << url;
    error.reset();
    EXPECT_TRUE(verifiedBind(&error)) << url << ": " << (error ? error->printed() : "");
    // No directory-service daemon runs in the sandbox: said, and no wait.
    EXPECT_TRUE(
        logs.contains("Unable to kill opendirectoryd. If Vorn profile load fails, try again"));
  }
}

TEST_F(LoadControllerCertsLdapTest, AnUnreachableServerIsOnlyLogged) {
  Sandbox sandbox;
  LogCapture logs;
  loadControllerCerts("ldap://127.0.0.1:" + std::to_string(freeLoopbackPort()));
  EXPECT_TRUE(logs.contains("ClientAddCACerts returned "));
  ErrorSlot error;
  EXPECT_FALSE(verifiedBind(&error));
}

}  // namespace
}  // namespace kolt::testing
