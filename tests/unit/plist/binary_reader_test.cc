// The binary reader: every object kind, shared references, and hostile
// lists (cycles, reference bombs, deep nesting, bad offsets) failing cleanly.
#include <gtest/gtest.h>

#include <cmath>

#include "unit/plist/plist_test_support.h"

namespace kolt::plist_test {
namespace {

using B = BplistBuilder;

Value parseOk(std::string_view bytes, const ParseLimits& limits = {}) {
  std::optional<Error> error;
  std::optional<Value> v = parsePropertyList(bytes, &error, limits);
  EXPECT_TRUE(v) << (error ? error->printed() : "");
  return v ? *v : Value::dictionary();
}

// A one-object list.
std::string single(std::string encoded) {
  B b;
  b.add(std::move(encoded));
  return b.finish(0);
}

// A list with a dictionary of every kind, built by hand.
std::string richList() {
  B b;
  std::vector<std::size_t> keys, values;
  auto entry = [&](const char* key, std::string value) {
    keys.push_back(b.add(B::ascii(key)));
    values.push_back(b.add(std::move(value)));
  };
  entry("t", "\x09");
  entry("f", "\x08");
  entry("i1", "\x10\xFF");
  entry("i2", "\x11\xFF\xFE");
  entry("i4", "\x12\xFF\xFF\xFF\xFF");
  entry("i8", "\x13" + B::bigEndian(static_cast<std::uint64_t>(-5), 8));
  entry("i16", "\x14" + B::bigEndian(0, 8) + B::bigEndian(UINT64_MAX, 8));
  entry("i16neg", "\x14" + B::bigEndian(UINT64_MAX, 8) +
                      B::bigEndian(static_cast<std::uint64_t>(INT64_MIN), 8));
  entry("f4", "\x22" + B::bigEndian(0x3FC00000, 4));            // 1.5f
  entry("f8", "\x23" + B::bigEndian(0xBFF0000000000000, 8));    // -1.0
  entry("date", "\x33" + B::bigEndian(0xC1E7BF48E0000000, 8));  // -3187296000
  entry("data", B::marker(4, 3) + std::string("\0\1\0", 3));
  entry("ascii", B::ascii(std::string("a\0b", 3)));
  entry("utf16", B::utf16({0x0063, 0x00E9, 0x65E5, 0xD83D, 0xDE00}));
  entry("long", B::ascii(std::string(20, 'x')));  // extended count
  const std::size_t one = b.add("\x10\x01");
  const std::size_t empty = b.add(B::marker(0xA, 0));
  keys.push_back(b.add(B::ascii("array")));
  values.push_back(b.add(b.array({one, empty, one})));
  const std::size_t top = b.add(b.dict(keys, values));
  return b.finish(top);
}

TEST(BinaryReaderTest, ReadsEveryKind) {
  const Value v = parseOk(richList());
  EXPECT_EQ(*v.find("t"), Value::boolean(true));
  EXPECT_EQ(*v.find("f"), Value::boolean(false));
  EXPECT_EQ(*v.find("i1"), Value::integer(255));
  EXPECT_EQ(*v.find("i2"), Value::integer(65534));
  EXPECT_EQ(*v.find("i4"), Value::integer(4294967295));
  EXPECT_EQ(*v.find("i8"), Value::integer(-5));
  EXPECT_EQ(*v.find("i16"), Value::uinteger(UINT64_MAX));
  EXPECT_TRUE(v.find("i16")->asInteger()->isUnsigned);
  EXPECT_EQ(*v.find("i16neg"), Value::integer(INT64_MIN));
  EXPECT_EQ(*v.find("f4")->asReal(), 1.5);
  EXPECT_EQ(*v.find("f8")->asReal(), -1.0);
  EXPECT_EQ(v.find("date")->asDate()->seconds, -3187296000.0);
  EXPECT_EQ(v.find("data")->asData()->bytes, std::string("\0\1\0", 3));
  EXPECT_EQ(*v.findString("ascii"), std::string("a\0b", 3));
  EXPECT_EQ(*v.findString("utf16"), "c\xC3\xA9\xE6\x97\xA5\xF0\x9F\x98\x80");
  EXPECT_EQ(*v.findString("long"), std::string(20, 'x'));
  ASSERT_EQ(v.findArray("array")->size(), 3u);
  EXPECT_EQ((*v.findArray("array"))[0], Value::integer(1));
  EXPECT_TRUE((*v.findArray("array"))[1].asArray()->empty());
}

TEST(BinaryReaderTest, SharedReferencesExpandByValue) {
  B b;
  const std::size_t leaf = b.add(B::ascii("shared"));
  const std::size_t inner = b.add(b.array({leaf, leaf}));
  const std::size_t k1 = b.add(B::ascii("one"));
  const std::size_t k2 = b.add(B::ascii("two"));
  const std::size_t top = b.add(b.dict({k1, k2, k1}, {inner, inner, leaf}));  // "one" twice
  Value v = parseOk(b.finish(top));
  ASSERT_EQ(v.asDictionary()->size(), 2u);
  EXPECT_EQ(*v.find("one"), Value("shared"));  // the later duplicate wins
  ASSERT_EQ(v.findArray("two")->size(), 2u);
  v.findArray("two")->push_back("changed");
  EXPECT_EQ(v.findArray("two")->size(), 3u);
}

TEST(BinaryReaderTest, WideReferencesAndOffsets) {
  for (int refSize : {1, 2, 3, 4, 8}) {
    for (int offsetSize : {1, 2, 4, 8}) {
      B b(refSize, offsetSize);
      const std::size_t s = b.add(B::ascii("v"));
      const std::size_t top = b.add(b.array({s, s}));
      std::optional<Value> v = parsePropertyList(b.finish(top));
      ASSERT_TRUE(v) << refSize << " " << offsetSize;
      EXPECT_EQ(v->asArray()->size(), 2u);
    }
  }
}

TEST(BinaryReaderTest, RefusesUnsupportedObjects) {
  struct Case {
    std::string object;
    const char* reason;
  };
  const Case cases[] = {
      {"\x80\x01", "UID"},
      {"\x81\x00\x01", "UID"},
      {B::marker(0xC, 0), "sets"},
      {B::marker(0xB, 0), "sets"},
      {std::string(1, '\0'), "null"},
      {"\x0F", "fill objects"},
      {"\x07", "unknown marker"},
      {"\x70", "unknown marker"},
      {"\xF0", "unknown marker"},
      {"\x15\x00\x00", "integer size"},
      {"\x21\x00\x00", "real size"},
      {"\x32\x00\x00\x00\x00", "date size"},
      {"\x33" + B::bigEndian(0x7FF8000000000000, 8), "date not finite"},
      {"\x14" + B::bigEndian(1, 8) + B::bigEndian(0, 8), "beyond 64 bits"},
      {"\x14" + B::bigEndian(UINT64_MAX, 8) + B::bigEndian(0, 8), "beyond 64 bits"},
      {B::ascii("caf\xE9"), "byte above 127"},
      {B::utf16({0x0041, 0xD800}), "unpaired surrogate"},
      {B::utf16({0xDC00, 0x0041}), "unpaired surrogate"},
      {B::utf16({0xD800, 0x0041}), "unpaired surrogate"},
      {"\x5F\x23\x00", "bad count"},  // count not a small integer
      {"\x5F\x10", "truncated count"},
      {"\x5F\x13" + B::bigEndian(UINT64_MAX, 8), "past the object area"},
      {"\x43\x00", "past the object area"},
      {"\x13\x00\x00", "past the object area"},
  };
  for (const Case& c : cases) {
    const std::string reason = parseFailure(single(c.object));
    EXPECT_NE(reason.find(c.reason), std::string::npos) << hex(c.object) << ": " << reason;
    EXPECT_EQ(reason.rfind("binary property list: ", 0), 0u) << reason;
  }
}

TEST(BinaryReaderTest, RefusesBadDictionaries) {
  B b;
  const std::size_t num = b.add("\x10\x01");
  const std::size_t top = b.add(b.dict({num}, {num}));
  EXPECT_NE(parseFailure(b.finish(top)).find("key is not a string"), std::string::npos);

  B b2;
  const std::size_t inner = b2.add(B::marker(0xA, 0));
  const std::size_t top2 = b2.add(b2.dict({inner}, {inner}));
  EXPECT_NE(parseFailure(b2.finish(top2)).find("key is not a string"), std::string::npos);
}

TEST(BinaryReaderTest, RefusesCycles) {
  {  // An array that holds itself.
    B b;
    b.add(b.array({0}));
    EXPECT_NE(parseFailure(b.finish(0)).find("contains itself"), std::string::npos);
  }
  {  // A dictionary whose value is itself.
    B b;
    b.add(b.dict({1}, {0}));
    b.add(B::ascii("k"));
    EXPECT_NE(parseFailure(b.finish(0)).find("contains itself"), std::string::npos);
  }
  {  // Two arrays holding each other, reached after a sound sibling.
    B b;
    const std::size_t leaf = b.add("\x09");
    b.add(b.array({2}));
    b.add(b.array({leaf, 1}));
    const std::size_t top = b.add(b.array({leaf, 1}));
    EXPECT_NE(parseFailure(b.finish(top)).find("contains itself"), std::string::npos);
  }
  {  // A dictionary used as its own key.
    B b;
    b.add(b.dict({0}, {0}));
    EXPECT_FALSE(parseFailure(b.finish(0)).empty());
  }
}

TEST(BinaryReaderTest, ReferenceBombFailsBeforeBuilding) {
  // Fifteen arrays of thirteen references each to the next: under 300 bytes
  // that would expand to 13^15 values.
  B b;
  std::size_t prev = b.add("\x10\x07");
  for (int level = 0; level < 15; ++level) {
    prev = b.add(b.array(std::vector<std::size_t>(13, prev)));
  }
  const std::string bomb = b.finish(prev);
  EXPECT_LT(bomb.size(), 300u);
  EXPECT_NE(parseFailure(bomb).find("shared references expand to more than"), std::string::npos);
  // Strings shared the same way run out of bytes before objects.
  B s;
  std::size_t node = s.add(B::ascii(std::string(1000, 's')));
  for (int level = 0; level < 5; ++level) node = s.add(s.array(std::vector<std::size_t>(13, node)));
  EXPECT_NE(parseFailure(s.finish(node)).find("bytes"), std::string::npos);
  // The same shape within the budget is expanded.
  B small;
  std::size_t n = small.add("\x10\x07");
  for (int level = 0; level < 3; ++level) n = small.add(small.array({n, n}));
  ParseLimits limits;
  limits.maxObjects = 15;
  EXPECT_EQ(parseFailure(small.finish(n), limits), "");
  limits.maxObjects = 14;
  EXPECT_NE(parseFailure(small.finish(n), limits), "");
}

TEST(BinaryReaderTest, DeepNestingFailsAtTheLimit) {
  constexpr std::size_t kLevels = 100000;
  B b(4, 4);
  for (std::size_t i = 0; i + 1 < kLevels; ++i) b.add(b.array({i + 1}));
  b.add(B::marker(0xA, 0));
  EXPECT_NE(parseFailure(b.finish(0)).find("nested deeper than 512"), std::string::npos);

  // A deep chain measured first through a short path, then reached again
  // through a long one, is still too deep.
  B m(2, 2);
  const std::size_t chainLength = 400;
  for (std::size_t i = 0; i + 1 < chainLength; ++i) m.add(m.array({i + 1}));
  m.add(B::marker(0xA, 0));
  const std::size_t longStart = m.add(m.array({m.add(m.array({0}))}));
  std::size_t prefix = longStart;
  for (int i = 0; i < 150; ++i) prefix = m.add(m.array({prefix}));
  const std::size_t top = m.add(m.array({0, prefix}));
  EXPECT_NE(parseFailure(m.finish(top)).find("nested deeper"), std::string::npos);
  ParseLimits roomy;
  roomy.maxDepth = 1000;
  EXPECT_EQ(parseFailure(m.finish(top), roomy), "");
}

TEST(BinaryReaderTest, RefusesBadTrailersAndOffsets) {
  const std::string good = single(B::ascii("x"));
  ASSERT_EQ(parseFailure(good), "");
  const std::size_t t = good.size() - 32;
  auto patched = [&](std::size_t at, std::string bytes) {
    std::string s = good;
    s.replace(at, bytes.size(), bytes);
    return s;
  };
  struct Case {
    std::string list;
    const char* reason;
  };
  const Case cases[] = {
      {patched(t + 6, std::string(1, '\0')), "offset size"},
      {patched(t + 6, "\x09"), "offset size"},
      {patched(t + 7, std::string(1, '\0')), "reference size"},
      {patched(t + 8, B::bigEndian(0, 8)), "no objects"},
      {patched(t + 8, B::bigEndian(1000, 8)), "past its end"},
      {patched(t + 8, B::bigEndian(UINT64_MAX, 8)), "past its end"},
      {patched(t + 16, B::bigEndian(1, 8)), "top object"},
      {patched(t + 24, B::bigEndian(UINT64_MAX, 8)), "offset table"},
      {patched(t + 24, B::bigEndian(3, 8)), "offset table"},
      {patched(t + 24, B::bigEndian(good.size(), 8)), "offset table"},
      {patched(t - 2, B::bigEndian(0xFFFF, 2)), "offset out of range"},
      {patched(t - 2, B::bigEndian(2, 2)), "offset out of range"},
      {patched(t - 2, B::bigEndian(t, 2)), "offset out of range"},
      {"bplist00", "too short"},
  };
  for (const Case& c : cases) {
    const std::string reason = parseFailure(c.list);
    EXPECT_NE(reason.find(c.reason), std::string::npos) << c.reason << ": " << reason;
  }
  // A reference past the object count.
  B b;
  b.add(b.array({7}));
  EXPECT_NE(parseFailure(b.finish(0)).find("reference out of range"), std::string::npos);
  // A string whose bytes run into the offset table.
  EXPECT_NE(parseFailure(single("\x55"
                                "ab"))
                .find("past the object area"),
            std::string::npos);
}

TEST(BinaryReaderTest, EveryTruncationAndCorruptionFailsCleanly) {
  const std::string list = richList();
  ASSERT_EQ(parseFailure(list), "");
  for (std::size_t n = 0; n < list.size(); ++n) {
    const std::string reason = parseFailure(std::string_view(list).substr(0, n));
    ASSERT_FALSE(reason.empty()) << n;
    ASSERT_NE(reason[0], '(') << n << ": " << reason;
  }
  // Overwrite each byte with a few values: parse or fail, never crash.
  for (std::size_t i = 0; i < list.size(); ++i) {
    for (unsigned char v : {0x00, 0x01, 0x0F, 0x7F, 0x80, 0xFF}) {
      std::string bad = list;
      bad[i] = static_cast<char>(v);
      std::optional<Error> error;
      std::optional<Value> parsed = parsePropertyList(bad, &error);
      ASSERT_TRUE(parsed || (error && error->description())) << i;
    }
  }
}

}  // namespace
}  // namespace kolt::plist_test
