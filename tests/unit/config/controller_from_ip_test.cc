// vorn_controller_from_ip: lookup, IPv4-mapped addresses, strlcpy semantics
// and errno.
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "kolt/controller_helpers.h"
#include "kolt/local_config.h"

namespace kolt {
namespace {

using testing::LogCapture;
using testing::Sandbox;

class ControllerFromIpTest : public ::testing::Test {
 protected:
  void SetUp() override {
    Value document;
    document.set("role", "CLIENT");
    document.set("sharedSecret", "do-not-log-me");
    Dictionary map;
    map.set("10.0.0.5", "controller-one.example");
    map.set("::ffff:abcd::1", "mapped-looking");
    map.set("fe80::1", "link-local");
    document.set("controllerIPMap", Value(map));
    ASSERT_TRUE(saveConfigPlist(document));
  }

  // Looks `address` up into a buffer prefilled with 'Z'.
  int lookup(const char* address, std::string* result, std::uint32_t size = 64) {
    char buffer[64];
    std::memset(buffer, 'Z', sizeof buffer);
    errno = 12345;
    const int rc = vorn_controller_from_ip(address, buffer, size);
    errno_ = errno;
    *result = std::string(buffer, strnlen(buffer, sizeof buffer));
    return rc;
  }

  Sandbox sandbox_;
  int errno_ = 0;
};

TEST_F(ControllerFromIpTest, FindsControllersIncludingIPv4MappedAddresses) {
  std::string name;
  EXPECT_EQ(lookup("10.0.0.5", &name), 0);
  EXPECT_EQ(errno_, 0);
  EXPECT_EQ(name, "controller-one.example");
  EXPECT_EQ(lookup("::ffff:10.0.0.5", &name), 0);
  EXPECT_EQ(name, "controller-one.example");
  // Not of the mapped form: looked up as written.
  EXPECT_EQ(lookup("::ffff:abcd::1", &name), 0);
  EXPECT_EQ(name, "mapped-looking");
  EXPECT_EQ(lookup("fe80::1", &name), 0);
  EXPECT_EQ(name, "link-local");
}

TEST_F(ControllerFromIpTest, AnUnknownAddressLeavesTheBufferAlone) {
  std::string name;
  EXPECT_EQ(lookup("10.9.9.9", &name), 0);
  EXPECT_EQ(errno_, 0);
  EXPECT_EQ(name, std::string(64, 'Z'));
}

TEST_F(ControllerFromIpTest, CutsLongNamesAndAlwaysTerminates) {
  char buffer[8];
  std::memset(buffer, 'Z', sizeof buffer);
  EXPECT_EQ(vorn_controller_from_ip("10.0.0.5", buffer, 5), 0);
  EXPECT_STREQ(buffer, "cont");
  EXPECT_EQ(buffer[5], 'Z');  // nothing written past the given size
  std::memset(buffer, 'Z', sizeof buffer);
  EXPECT_EQ(vorn_controller_from_ip("10.0.0.5", buffer, 1), 0);
  EXPECT_EQ(buffer[0], '\0');
  std::memset(buffer, 'Z', sizeof buffer);
  EXPECT_EQ(vorn_controller_from_ip("10.0.0.5", buffer, 0), 0);
  EXPECT_EQ(buffer[0], 'Z');
}

TEST_F(ControllerFromIpTest, NoDocumentIsResultOneWithENOENT) {
  sandbox_.removeFile(kConfigPlistPath);
  std::string name;
  EXPECT_EQ(lookup("10.0.0.5", &name), 1);
  EXPECT_EQ(errno_, 2);
  EXPECT_EQ(name, std::string(64, 'Z'));
}

TEST_F(ControllerFromIpTest, LogsTheDocumentWithoutItsSecret) {
  LogCapture logs;
  std::string name;
  lookup("10.0.0.5", &name);
  EXPECT_TRUE(logs.contains("vorn_controller_from_ip: got numeric 10.0.0.5 and config "));
  EXPECT_TRUE(logs.contains("controller-one.example"));
  EXPECT_FALSE(logs.contains("do-not-log-me"));
}

}  // namespace
}  // namespace kolt
