// The controller's metadata address, found among fake interface addresses.
#include "sync/metadata_address.h"

#include <gtest/gtest.h>

#include "fixtures/log_capture.h"
#include "unit/sync/build_world.h"

namespace kolt {
namespace {

using testing::FaultEnv;
using namespace testing::build_world;
using testing::Sandbox;
using testing::StderrCapture;

class MetadataAddressTest : public ::testing::Test {
 protected:
  MetadataAddressTest() : faults_(&sandbox_.env()) {}

  std::optional<std::string> find(const std::string& network,
                                  std::vector<InterfaceAddress> interfaces) {
    faults_.fakeInterfaceAddresses(std::move(interfaces));
    StderrCapture err;
    std::optional<std::string> found = metadataAddressForNetwork(faults_, network);
    stderr_ = err.finish();
    return found;
  }

  Sandbox sandbox_;
  FaultEnv faults_;
  std::string stderr_;
};

TEST_F(MetadataAddressTest, FirstNonLoopbackIPv4AddressInsideTheNetwork) {
  EXPECT_EQ(find("10.1.0.0/16",
                 {ipv4("lo0", 10, 1, 9, 9), ipv4("lo", 10, 1, 9, 8), ipv4("en0", 192, 168, 1, 2),
                  ipv4("en1", 10, 1, 2, 3), ipv4("en2", 10, 1, 7, 7)}),
            "10.1.2.3");
  EXPECT_EQ(stderr_, "Found metadata IP '10.1.2.3'\n");
}

TEST_F(MetadataAddressTest, IPv6AndOtherFamiliesNeverMatch) {
  // An IPv4-mapped IPv6 address of the network is no IPv4 address.
  InterfaceAddress mapped = ipv6("en0", {0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0xff, 0xff, 10, 1, 2, 3});
  InterfaceAddress linkLocal = ipv6("en0", {0xfe, 0x80, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 10, 1, 2, 4});
  InterfaceAddress packet{"en0", AF_PACKET, std::string("\x0a\x01\x02\x05", 4)};
  InterfaceAddress nameless = ipv4("", 10, 1, 2, 6);
  InterfaceAddress addressless{"en3", AF_INET, ""};
  EXPECT_EQ(find("10.1.0.0/16", {mapped, linkLocal, packet, nameless, addressless}), std::nullopt);
  EXPECT_EQ(find("10.1.0.0/16", {linkLocal, ipv4("en1", 10, 1, 200, 1)}), "10.1.200.1");
}

TEST_F(MetadataAddressTest, PrefixLengths) {
  const std::vector<InterfaceAddress> en = {ipv4("en0", 10, 1, 2, 3), ipv4("en1", 10, 2, 0, 1)};
  EXPECT_EQ(find("10.1.2.3/32", en), "10.1.2.3");
  EXPECT_EQ(find("10.1.2.4/32", en), std::nullopt);
  EXPECT_EQ(find("10.2.0.0/16", en), "10.2.0.1");
  EXPECT_EQ(find("10.0.0.0/8", en), "10.1.2.3");
  EXPECT_EQ(find("10.1.2.0/31", en), std::nullopt);
  // Above 32 counts as 32.
  EXPECT_EQ(find("10.1.2.3/40", en), "10.1.2.3");
  EXPECT_EQ(find("10.1.2.0/99999999999", en), std::nullopt);
  // The prefix is the number the text begins with.
  EXPECT_EQ(find("10.2.0.0/16 bits", en), "10.2.0.1");
  // The last "/" counts.
  EXPECT_EQ(find("x/y/10.1.0.0/16", en), std::nullopt);
}

TEST_F(MetadataAddressTest, NoAddressWithoutASlashOrWithPrefixZero) {
  const std::vector<InterfaceAddress> en = {ipv4("en0", 10, 1, 2, 3)};
  for (const char* network :
       {"10.1.0.0", "10.1.0.0/0", "10.1.0.0/", "10.1.0.0/abc", "10.1.0.0/-8", ""}) {
    SCOPED_TRACE(network);
    EXPECT_EQ(find(network, en), std::nullopt);
  }
}

TEST_F(MetadataAddressTest, NetworkInTheShortFormsOfInetAddr) {
  const std::vector<InterfaceAddress> en = {ipv4("en0", 10, 1, 2, 3)};
  EXPECT_EQ(find("10.1/16", en), std::nullopt);  // 10.0.0.1: network 10.0
  EXPECT_EQ(find("0x0a.1.0.0/16", en), "10.1.2.3");
  EXPECT_EQ(find("012.1.0.0/16", en), "10.1.2.3");  // octal 012 is 10
  EXPECT_EQ(find("not-an-address/16", en), std::nullopt);
}

TEST_F(MetadataAddressTest, InterfacesThatCannotBeListed) {
  class NoInterfaces : public EnvWrapper {
   public:
    using EnvWrapper::EnvWrapper;
    int interfaceAddresses(std::vector<InterfaceAddress>*) override { return ENOMEM; }
  } env(&sandbox_.env());
  EXPECT_EQ(metadataAddressForNetwork(env, "10.1.0.0/16"), std::nullopt);
}

}  // namespace
}  // namespace kolt
