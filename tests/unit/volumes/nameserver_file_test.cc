// The name-server file on disk: exact bytes, round trips, failed writes.
#include <gtest/gtest.h>

#include "fixtures/fault_env.h"
#include "fixtures/sandbox.h"
#include "volumes/nameservers.h"

namespace kolt {
namespace {

using testing::FaultEnv;
using testing::FaultOp;
using testing::Sandbox;

Value entry(const char* addr, const char* uuid) {
  Dictionary d;
  d.set("addr", addr);
  d.set("uuid", uuid);
  return Value(std::move(d));
}

TEST(NameServerFile, TwoAddressesMakeEighteenBytesAndReadBack) {
  Sandbox sandbox;
  const Array list{Value("10.0.0.1"), Value("10.0.0.2")};
  ASSERT_TRUE(write_fsnameservers(list));
  EXPECT_EQ(sandbox.readFile(kFsnameserversPath), "10.0.0.1\n10.0.0.2\n");
  EXPECT_EQ(sandbox.fileMode(kFsnameserversPath), 0644u);
  EXPECT_EQ(read_fsnameservers(nullptr), list);
}

TEST(NameServerFile, EntriesWithControllersReadBackThroughTheMap) {
  Sandbox sandbox;
  const Array list{entry("10.0.0.1", "UUID-A"), entry("10.0.0.2", "UUID-B")};
  ASSERT_TRUE(write_fsnameservers(list));
  EXPECT_EQ(sandbox.readFile(kFsnameserversPath), "10.0.0.1\n10.0.0.2\n");  // no UUIDs
  Dictionary map;
  map.set("10.0.0.1", "UUID-A");
  map.set("10.0.0.2", "UUID-B");
  EXPECT_EQ(read_fsnameservers(&map), list);
  EXPECT_EQ(read_fsnameservers(nullptr), fsnameservers_without_uuids(list));
}

TEST(NameServerFile, EmptyListMakesAnEmptyFile) {
  Sandbox sandbox;
  EXPECT_TRUE(read_fsnameservers(nullptr).empty());  // no file yet
  sandbox.writeFile(kFsnameserversPath, "10.0.0.1\n");
  ASSERT_TRUE(write_fsnameservers({}));
  EXPECT_EQ(sandbox.readFile(kFsnameserversPath), "");
  EXPECT_TRUE(read_fsnameservers(nullptr).empty());
}

TEST(NameServerFile, AFailedWriteReportsFalseAndKeepsTheOldFile) {
  Sandbox sandbox;
  sandbox.writeFile(kFsnameserversPath, "10.0.0.1\n");
  FaultEnv faults(&sandbox.env());
  ScopedEnv scoped(&faults);
  faults.failNth(FaultOp::kRename, 1, ENOSPC);
  EXPECT_FALSE(write_fsnameservers({Value("10.0.0.9")}));
  EXPECT_EQ(sandbox.readFile(kFsnameserversPath), "10.0.0.1\n");
  EXPECT_EQ(sandbox.listNames("/Library/Preferences/Vorn"),
            std::vector<std::string>{"fsnameservers"});
}

}  // namespace
}  // namespace kolt
