// The fixture of the change-check unit tests: one member machine on its own
// in-memory directory, whose servers are kUrl1 and kUrl2. The member's Env
// is current while a test runs.
#ifndef KOLT_TESTS_UNIT_SYNC_MEMORY_MEMBER_TEST_H
#define KOLT_TESTS_UNIT_SYNC_MEMORY_MEMBER_TEST_H

#include <gtest/gtest.h>

#include <cstdint>
#include <memory>
#include <string>

#include "unit/sync/change_check_support.h"

namespace kolt::testing {

inline constexpr const char* kUrl1 = "ldap://10.0.0.1";
inline constexpr const char* kUrl2 = "ldap://10.0.0.2";

class MemoryMemberTest : public ::testing::Test {
 protected:
  MemoryMemberTest()
      : directory_(MemoryDirectory::create()),
        machine_(directory_, kMemberUUID),
        scoped_(&machine_.env()) {}

  // Publishes `config` as the SAN's record, as the administrator.
  void publishConfig(const Value& config) {
    auto node = directory_->openNode("/LDAPv3/" + std::string(kUrl1), nullptr);
    ASSERT_TRUE(node->setCredentials(kRecordTypeUsers, directory_->adminName(),
                                     directory_->adminPassword(), nullptr));
    std::string why;
    ASSERT_TRUE(publish(*node, config, &why)) << why;
  }
  ProcessRecorder& recorder() { return machine_.processes(); }

  std::shared_ptr<MemoryDirectory> directory_;
  MemoryMachine machine_;
  ScopedEnv scoped_;
  std::uint32_t mask_ = 0;
};

}  // namespace kolt::testing

#endif  // KOLT_TESTS_UNIT_SYNC_MEMORY_MEMBER_TEST_H
