// Value semantics, the platform's equality rules and the printed form.
#include <gtest/gtest.h>

#include <cmath>

#include "unit/plist/plist_test_support.h"

namespace kolt::plist_test {
namespace {

TEST(ValueTest, NumbersCompareByNumericValue) {
  EXPECT_EQ(Value::integer(1), Value::real(1.0));
  EXPECT_EQ(Value::real(1.0), Value::integer(1));
  EXPECT_NE(Value::integer(1), Value::real(1.5));
  EXPECT_EQ(Value::integer(0), Value::real(-0.0));
  EXPECT_EQ(Value::uinteger(UINT64_MAX), Value::uinteger(UINT64_MAX));
  EXPECT_NE(Value::uinteger(UINT64_MAX), Value::integer(-1));  // same bits, other number
  EXPECT_EQ(Value::uinteger(5), Value::integer(5));
  EXPECT_EQ(Value::integer(INT64_MIN), Value::real(-9223372036854775808.0));
  EXPECT_NE(Value::integer(INT64_MAX), Value::real(9223372036854775808.0));
  EXPECT_EQ(Value::uinteger(9223372036854775808ull), Value::real(9223372036854775808.0));
  EXPECT_NE(Value::integer(1), Value::real(NAN));
  EXPECT_NE(Value::integer(1), Value::real(INFINITY));
  EXPECT_EQ(Value::real(NAN), Value::real(NAN));  // so documents with NaN compare equal
}

TEST(ValueTest, BooleansNeverEqualNumbers) {
  EXPECT_NE(Value::boolean(true), Value::integer(1));
  EXPECT_NE(Value::integer(0), Value::boolean(false));
  EXPECT_NE(Value::boolean(true), Value::real(1.0));
  EXPECT_EQ(Value::boolean(true), Value::boolean(true));
  EXPECT_NE(Value::boolean(true), Value::boolean(false));
}

TEST(ValueTest, OtherKindsCompareExactly) {
  EXPECT_EQ(Value::date(1.5), Value::date(1.5));
  EXPECT_NE(Value::date(1.0), Value::date(1.000001));
  EXPECT_NE(Value::date(0), Value::integer(0));
  EXPECT_NE(Value("1"), Value::integer(1));
  EXPECT_NE(Value("e\xCC\x81"), Value("\xC3\xA9"));  // no normalisation
  EXPECT_NE(Value::data("a"), Value("a"));
  EXPECT_EQ(Value::data(std::string("\0a", 2)), Value::data(std::string("\0a", 2)));
  EXPECT_NE(Value::dictionary(), Value::array());

  Value a = Value::dictionary();
  a.set("n", Value::integer(2));
  Value b = Value::dictionary();
  b.set("n", Value::real(2.0));
  EXPECT_EQ(a, b);  // numeric equality holds inside containers
  b.set("extra", "x");
  EXPECT_NE(a, b);
}

TEST(ValueTest, CopiesAreIndependent) {
  Value doc = sampleDocument();
  Value copy = doc;
  copy.findArray("nested")->push_back(Value("more"));
  copy.set("string", "changed");
  EXPECT_EQ(*doc.findString("string"), "plain");
  EXPECT_EQ(doc.findArray("nested")->size(), 2u);
  EXPECT_NE(doc, copy);
}

TEST(ValueTest, DictionaryKeepsByteOrderAndLastDuplicate) {
  std::vector<Dictionary::Entry> entries;
  entries.emplace_back("b", Value::integer(1));
  entries.emplace_back("\xC3\xA9", Value::integer(2));
  entries.emplace_back("B", Value::integer(3));
  entries.emplace_back("b", Value::integer(4));
  entries.emplace_back("a", Value::integer(5));
  const Dictionary d = Dictionary::fromEntries(std::move(entries));
  std::vector<std::string> keys;
  for (const auto& [k, v] : d) keys.push_back(k);
  EXPECT_EQ(keys, (std::vector<std::string>{"B", "a", "b", "\xC3\xA9"}));
  EXPECT_EQ(*d.find("b"), Value::integer(4));
}

TEST(ValueTest, PrintedFormIsStable) {
  Value doc = Value::dictionary();
  doc.set("name", "My SAN");
  doc.set("count", Value::integer(-3));
  doc.set("ratio", Value::real(0.25));
  doc.set("on", Value::boolean(true));
  doc.set("when", Value::date(0));
  doc.set("blob", Value::data("\x01\x02"));
  Value list = Value::array();
  list.asArray()->push_back("a b");
  list.asArray()->push_back("plain");
  doc.set("list", list);
  EXPECT_EQ(doc.description(),
            "{\n"
            "    blob = {length = 2, bytes = 0x0102};\n"
            "    count = -3;\n"
            "    list = (\n"
            "        \"a b\",\n"
            "        plain\n"
            "    );\n"
            "    name = \"My SAN\";\n"
            "    on = true;\n"
            "    ratio = 0.25;\n"
            "    when = 2001-01-01 00:00:00 +0000;\n"
            "}");
  EXPECT_EQ(Value("top level string").description(), "top level string");
  EXPECT_EQ(Value::uinteger(UINT64_MAX).description(), "18446744073709551615");
  // Parsing the same document twice prints the same text.
  const std::string xml = *writeXmlPropertyList(sampleDocument());
  EXPECT_EQ(parsePropertyList(xml)->description(), parsePropertyList(xml)->description());
}

}  // namespace
}  // namespace kolt::plist_test
