// The Env's search-base cache on its own: it stays small whatever servers a
// caller names, and threads see whole entries only.
#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "kolt/env.h"

namespace kolt {
namespace {

TEST(SearchBaseCacheTest, StaysSmallWhateverServersAreNamed) {
  SearchBaseCache cache;
  const std::size_t many = SearchBaseCache::kMaxServers * 3;
  for (std::size_t i = 0; i < many; ++i) {
    const std::string key = "ldap://host" + std::to_string(i) + ":389";
    cache.store(key, {{"dc=s" + std::to_string(i)}, "dc=s" + std::to_string(i)});
    // The entry just stored is always there.
    auto entry = cache.find(key);
    ASSERT_TRUE(entry.has_value()) << key;
    EXPECT_EQ(entry->base, "dc=s" + std::to_string(i));
  }
  std::size_t kept = 0;
  for (std::size_t i = 0; i < many; ++i) {
    kept += cache.find("ldap://host" + std::to_string(i) + ":389").has_value();
  }
  EXPECT_EQ(kept, SearchBaseCache::kMaxServers);
  // Storing a known server again replaces its entry and forgets no other.
  cache.store("ldap://host" + std::to_string(many - 1) + ":389", {{"dc=new"}, "dc=new"});
  kept = 0;
  for (std::size_t i = 0; i < many; ++i) {
    kept += cache.find("ldap://host" + std::to_string(i) + ":389").has_value();
  }
  EXPECT_EQ(kept, SearchBaseCache::kMaxServers);
  cache.forget("ldap://host" + std::to_string(many - 1) + ":389");
  EXPECT_FALSE(cache.find("ldap://host" + std::to_string(many - 1) + ":389").has_value());
}

TEST(SearchBaseCacheTest, ThreadsSeeWholeEntries) {
  SearchBaseCache cache;
  std::atomic<bool> torn{false};
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < 20000; ++i) {
        const std::string key = "ldap://h" + std::to_string(i % 3) + ":389";
        const std::string base = "dc=t" + std::to_string(t) + "i" + std::to_string(i);
        switch ((i + t) % 3) {
          case 0:
            cache.store(key, {{base, "dc=other"}, base});
            break;
          case 1:
            cache.forget(key);
            break;
          default:
            // An entry's base is always the first of its contexts.
            if (auto entry = cache.find(key)) {
              if (entry->namingContexts.size() != 2 || entry->namingContexts[0] != entry->base) {
                torn = true;
              }
            }
        }
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_FALSE(torn.load());
}

}  // namespace
}  // namespace kolt
