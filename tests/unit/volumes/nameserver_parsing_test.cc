// The name-server file's text: what reads as an address, what is skipped,
// and what the writer produces.
#include <gtest/gtest.h>

#include "volumes/inet_address.h"
#include "volumes/nameservers.h"

namespace kolt {
namespace {

Array strings(std::initializer_list<const char*> items) {
  Array a;
  for (const char* s : items) a.emplace_back(s);
  return a;
}

Value entry(const char* addr, const char* uuid) {
  Dictionary d;
  d.set("addr", addr);
  if (uuid) d.set("uuid", uuid);
  return Value(std::move(d));
}

TEST(InetAddressText, ReadsTheClassicNotations) {
  struct Case {
    const char* text;
    const char* dotted;  // null: not an address
  } cases[] = {
      {"10.0.0.1", "10.0.0.1"},
      {"010.0.0.1 controller", "8.0.0.1"},
      {"0x0a.0.0.2", "10.0.0.2"},
      {"0XA.0.0.3\tx", "10.0.0.3"},
      {"1.2.3", "1.2.0.3"},
      {"1.2", "1.0.0.2"},
      {"167772161", "10.0.0.1"},
      {"255.255.255.255", "255.255.255.255"},
      {"10.0.0.1\r", "10.0.0.1"},
      {"1.2.3.256", nullptr},
      {"256.1.1.1", nullptr},
      {"1.2.3.4.5", nullptr},
      {"08.1.1.1", nullptr},
      {"0x.1.1.1", nullptr},
      {"4294967296", nullptr},
      {"99999999999999999999999", nullptr},
      {" 1.2.3.4", nullptr},
      {"1..2.3", nullptr},
      {"1.2.3.4x", nullptr},
      {"# comment", nullptr},
      {"", nullptr},
  };
  for (const Case& c : cases) {
    const auto address = parseInetAddress(c.text);
    if (c.dotted == nullptr) {
      EXPECT_FALSE(address.has_value()) << c.text;
    } else {
      ASSERT_TRUE(address.has_value()) << c.text;
      EXPECT_EQ(formatInetAddress(*address), c.dotted) << c.text;
    }
  }
}

TEST(NameServerText, ReadsLinesInOrderInDottedForm) {
  EXPECT_EQ(parseFsnameservers("10.0.0.1\n10.0.0.2\n", nullptr), strings({"10.0.0.1", "10.0.0.2"}));
  // CR LF line ends, octal and hexadecimal forms, duplicates kept.
  EXPECT_EQ(parseFsnameservers("10.0.0.1\r\n010.0.0.1 old\r\n0x0a.0.0.1\r\n", nullptr),
            strings({"10.0.0.1", "8.0.0.1", "10.0.0.1"}));
  // A last line without a line feed still counts.
  EXPECT_EQ(parseFsnameservers("10.0.0.1\n10.0.0.2", nullptr), strings({"10.0.0.1", "10.0.0.2"}));
}

TEST(NameServerText, SkipsShortLinesAndLinesThatAreNoAddress) {
  // 1.2.3 (5 characters) is a valid short form but too short a line;
  // 1.2.3.4 (7) is read. A 6-character line is skipped.
  EXPECT_EQ(parseFsnameservers("1.2.3\n1.2.3.4\n10.0.1\n", nullptr), strings({"1.2.3.4"}));
  // Lines that are not addresses are skipped, never read as 255.255.255.255.
  EXPECT_EQ(parseFsnameservers("# controllers\nnot an address\n10.0.0.9\n", nullptr),
            strings({"10.0.0.9"}));
  // Length counts characters, not bytes: "1.2 éé" is six characters.
  EXPECT_EQ(parseFsnameservers("1.2 \xC3\xA9\xC3\xA9\n1.2 \xC3\xA9\xC3\xA9\xC3\xA9\n", nullptr),
            strings({"1.0.0.2"}));
  EXPECT_TRUE(parseFsnameservers("", nullptr).empty());
  EXPECT_TRUE(parseFsnameservers("\n\n\n", nullptr).empty());
  EXPECT_TRUE(parseFsnameservers("10.0.0.1\n\xFF\xFE\n", nullptr).empty());  // not UTF-8
}

TEST(NameServerText, WithAMapLabelsEachAddressWithItsController) {
  Dictionary map;
  map.set("10.0.0.1", "UUID-A");
  map.set("8.0.0.1", "UUID-B");
  const Array list = parseFsnameservers("10.0.0.1\n010.0.0.1\n10.0.0.7\n", &map);
  Array expected;
  expected.push_back(entry("10.0.0.1", "UUID-A"));
  expected.push_back(entry("8.0.0.1", "UUID-B"));
  expected.push_back(entry("10.0.0.7", nullptr));  // no controller: "addr" only
  EXPECT_EQ(list, expected);
}

TEST(NameServerText, WriterAndAddressOnlyFormAgreeWithTheReader) {
  Array list;
  list.push_back(entry("10.0.0.1", "UUID-A"));
  list.push_back(Value("10.0.0.2"));
  list.push_back(Value::integer(7));            // neither form
  list.push_back(Value(Dictionary()));          // no "addr"
  list.push_back(Value("10.0.0.3\n10.0.0.4"));  // would split into two lines
  EXPECT_EQ(formatFsnameservers(list), "10.0.0.1\n10.0.0.2\n");
  const Array plain = fsnameservers_without_uuids(list);
  EXPECT_EQ(plain, strings({"10.0.0.1", "10.0.0.2", "10.0.0.3\n10.0.0.4"}));
  EXPECT_EQ(parseFsnameservers(formatFsnameservers(list), nullptr),
            strings({"10.0.0.1", "10.0.0.2"}));
}

}  // namespace
}  // namespace kolt
