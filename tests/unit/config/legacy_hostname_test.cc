// getLegacyHostname: the system's host name, never a failure.
#include <gtest/gtest.h>

#include "fixtures/sandbox.h"
#include "kolt/controller_helpers.h"
#include "platform/env_wrapper.h"

namespace kolt {
namespace {

class NoHostNameEnv : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  int hostName(std::string*) override { return EIO; }
};

TEST(LegacyHostname, IsTheSystemsHostNameOrLocalhost) {
  testing::Sandbox sandbox;
  sandbox.setHostName("ctl-1.example");
  EXPECT_EQ(getLegacyHostname(), "ctl-1.example");
  NoHostNameEnv failing(&sandbox.env());
  ScopedEnv scoped(&failing);
  EXPECT_EQ(getLegacyHostname(), "localhost");
}

}  // namespace
}  // namespace kolt
