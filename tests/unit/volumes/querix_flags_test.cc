// The search service's flags and the hash that tells two lists apart.
#include "volumes/querix_flags.h"

#include <gtest/gtest.h>

namespace kolt {
namespace {

TEST(QuerixFlags, EnabledAndListGiveTheBits) {
  std::uint64_t hash = 99;
  EXPECT_EQ(querixServerFlagsForConfig(nullptr, &hash), 0);
  EXPECT_EQ(hash, 0u);

  Value config;
  hash = 99;
  EXPECT_EQ(querixServerFlagsForConfig(&config, &hash), 0);
  EXPECT_EQ(hash, 0u);
  config.set("enableQuerixServer", Value::boolean(false));
  config.set("querixServerVolumeList", Value(Array{Value("v")}));
  EXPECT_EQ(querixServerFlagsForConfig(&config, &hash), 0);
  EXPECT_EQ(hash, 0u);

  config.set("enableQuerixServer", Value::boolean(true));
  config.erase("querixServerVolumeList");
  hash = 99;
  EXPECT_EQ(querixServerFlagsForConfig(&config, &hash), 1);
  EXPECT_EQ(hash, 0u);

  config.set("querixServerVolumeList", Value(Array{Value("v1"), Value("v2")}));
  EXPECT_EQ(querixServerFlagsForConfig(&config, &hash), 3);
  EXPECT_NE(hash, 0u);
}

TEST(QuerixFlags, EqualListsHashEquallyAndDifferentListsDiffer) {
  const Value a(Array{Value("v1"), Value::integer(1), Value::date(100)});
  const Value sameNumber(Array{Value("v1"), Value::real(1.0), Value::date(100)});
  ASSERT_EQ(a, sameNumber);
  EXPECT_EQ(hashValue(a), hashValue(sameNumber));
  EXPECT_EQ(hashValue(Value::integer(-5)), hashValue(Value::real(-5.0)));
  ASSERT_EQ(Value::uinteger(1ULL << 63), Value::real(9223372036854775808.0));
  EXPECT_EQ(hashValue(Value::uinteger(1ULL << 63)), hashValue(Value::real(9223372036854775808.0)));
  EXPECT_NE(hashValue(a),
            hashValue(Value(Array{Value("v2"), Value::integer(1), Value::date(100)})));
  EXPECT_NE(hashValue(Value(Array{Value("ab")})), hashValue(Value(Array{Value("a"), Value("b")})));
}

}  // namespace
}  // namespace kolt
