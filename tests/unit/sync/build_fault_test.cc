// A directory that fails at any one of the build's operations: the build
// reports that failure, and neither the local document nor the alias file is
// touched. Each scenario is run once to count its directory calls, then once
// per call with that call failing.
#include <gtest/gtest.h>

#include <functional>
#include <map>

#include "unit/sync/build_world.h"

namespace kolt {
namespace {

using namespace testing::build_world;

constexpr int kBusy = 51;  // LDAP "busy"

struct Scenario {
  const char* name;
  std::function<void(BuildWorld&)> prepare;
  std::string node = testing::build_world::kLocalNode;
  bool withAdminCredentials = false;
  // The existing record stays as it was unless the failing call came after
  // its new value was stored (synchronize, on a directory that stores at once).
  bool recordKept = false;
};

// A record that a first build of this controller published.
void publishFirst(BuildWorld& w) {
  ASSERT_EQ(w.build(), 0);
  Value d = w.local();
  d.set("ownerName", "changed since");
  w.writeLocal(d);
}

std::vector<Scenario> scenarios() {
  return {
      {"first build derives its address and creates the records",
       [](BuildWorld& w) {
         Value d = w.local();
         d.erase("vornAddr");
         d.set("metadataNetwork", "10.1.0.0/16");
         w.writeLocal(d);
       }},
      {"a later build republishes", publishFirst, testing::build_world::kLocalNode, false, true},
      {"an initializing controller replaces a dead record",
       [](BuildWorld& w) {
         Value dead = newVornConfig();
         Value& g = *dead.find("globals");
         g.set("sanName", kSanName);
         g.set("sanUUID", kSanUUID);
         g.set("sanState", "dead");
         g.set("primaryZombie", kOtherUUID);
         w.seedRecord(dead);
       }},
      {"a remote node with credentials", publishFirst, "ldap://127.0.0.1", true, true},
  };
}

int runBuild(BuildWorld& w, const Scenario& s, ErrorSlot* error) {
  std::string admin = w.directory->adminName(), password = w.directory->adminPassword();
  return buildSanConfig(&s.node, s.withAdminCredentials ? &admin : nullptr,
                        s.withAdminCredentials ? &password : nullptr, error);
}

constexpr DirectoryOperation kOperations[] = {
    DirectoryOperation::kOpenNode,    DirectoryOperation::kSetCredentials,
    DirectoryOperation::kQuery,       DirectoryOperation::kCreateRecord,
    DirectoryOperation::kReadValues,  DirectoryOperation::kSetValues,
    DirectoryOperation::kSynchronize, DirectoryOperation::kChangePassword,
    DirectoryOperation::kAddMember,   DirectoryOperation::kDeleteRecord};

TEST(BuildDirectoryFaultTest, FailureAtEachDirectoryCallLeavesTheLocalDocumentAndAliasFile) {
  for (const Scenario& scenario : scenarios()) {
    SCOPED_TRACE(scenario.name);
    // Count the scenario's calls of each kind.
    std::map<DirectoryOperation, std::size_t> counts;
    {
      BuildWorld w;
      scenario.prepare(w);
      std::map<DirectoryOperation, std::size_t> before;
      for (DirectoryOperation op : kOperations) before[op] = w.directory->callCount(op);
      ASSERT_EQ(runBuild(w, scenario, nullptr), 0);
      for (DirectoryOperation op : kOperations)
        counts[op] = w.directory->callCount(op) - before[op];
    }
    std::size_t injected = 0;
    for (DirectoryOperation op : kOperations) {
      for (std::size_t nth = 1; nth <= counts[op]; ++nth) {
        SCOPED_TRACE("operation " + std::to_string(static_cast<int>(op)) + " call " +
                     std::to_string(nth));
        BuildWorld w;
        scenario.prepare(w);
        w.sandbox.writeFile(kVornDir + "uuid", std::string(kOtherUUID) + "\n");
        const auto local = w.localBytes();
        const auto record = w.publishedBytes();
        w.directory->failOperation(op, nth,
                                   Error(std::string(kDirectoryErrorDomain), kBusy, "busy"));

        ErrorSlot error;
        EXPECT_EQ(runBuild(w, scenario, &error), kBusy);
        ASSERT_TRUE(error);
        EXPECT_EQ(error->code(), kBusy);
        EXPECT_EQ(w.localBytes(), local);
        EXPECT_TRUE(w.sandbox.exists(kVornDir + "uuid"));
        if (scenario.recordKept && op != DirectoryOperation::kSynchronize) {
          EXPECT_EQ(w.publishedBytes(), record);
        }
        ++injected;
      }
    }
    EXPECT_GE(injected, 4u);
  }
}

}  // namespace
}  // namespace kolt
