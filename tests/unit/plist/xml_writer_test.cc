// The XML writer: its exact layout, its escapes, what it refuses, and that
// everything it writes reads back equal.
#include <gtest/gtest.h>

#include <cmath>

#include "unit/plist/plist_test_support.h"

namespace kolt::plist_test {
namespace {

std::string write(const Value& v) {
  std::optional<Error> error;
  std::optional<std::string> xml = writeXmlPropertyList(v, &error);
  EXPECT_TRUE(xml) << (error ? error->printed() : "");
  return xml.value_or("");
}

std::string writeFailure(const Value& v) {
  std::optional<Error> error;
  std::optional<std::string> xml = writeXmlPropertyList(v, &error);
  if (xml) return "";
  if (!error || error->code() != kPosixEINVAL) return "(wrong error)";
  return error->description().value_or("(no description)");
}

TEST(XmlWriterTest, ExactLayout) {
  Value doc = Value::dictionary();
  doc.set("zeta", "last");
  doc.set("alpha", Value::integer(1));
  Value list = Value::array();
  list.asArray()->push_back(Value::boolean(true));
  list.asArray()->push_back(Value::real(0.5));
  list.asArray()->push_back(Value::array());
  list.asArray()->push_back(Value::dictionary());
  list.asArray()->push_back(Value::date(0));
  list.asArray()->push_back(Value::data("abc"));
  doc.set("middle", list);
  EXPECT_EQ(write(doc),
            "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
            "<plist version=\"1.0\">\n"
            "<dict>\n"
            "\t<key>alpha</key>\n"
            "\t<integer>1</integer>\n"
            "\t<key>middle</key>\n"
            "\t<array>\n"
            "\t\t<true/>\n"
            "\t\t<real>0.5</real>\n"
            "\t\t<array/>\n"
            "\t\t<dict/>\n"
            "\t\t<date>2001-01-01T00:00:00Z</date>\n"
            "\t\t<data>\n"
            "\t\tYWJj\n"
            "\t\t</data>\n"
            "\t</array>\n"
            "\t<key>zeta</key>\n"
            "\t<string>last</string>\n"
            "</dict>\n"
            "</plist>\n");
  EXPECT_EQ(write(Value("top")),
            "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n"
            "<string>top</string>\n</plist>\n");
}

TEST(XmlWriterTest, NumbersAndDatesInTheirTextForms) {
  struct Case {
    Value value;
    const char* text;
  };
  const Case cases[] = {
      {Value::integer(INT64_MIN), "<integer>-9223372036854775808</integer>"},
      {Value::uinteger(UINT64_MAX), "<integer>18446744073709551615</integer>"},
      {Value::real(-0.0), "<real>-0</real>"},
      {Value::real(0.1), "<real>0.1</real>"},
      {Value::real(1e300), "<real>1e+300</real>"},
      {Value::real(std::nan("")), "<real>nan</real>"},
      {Value::real(INFINITY), "<real>+infinity</real>"},
      {Value::real(-INFINITY), "<real>-infinity</real>"},
      {Value::date(-3187296000.0), "<date>1900-01-01T00:00:00Z</date>"},
      {Value::date(0.999), "<date>2001-01-01T00:00:00Z</date>"},  // whole seconds
      {Value::date(-0.5), "<date>2000-12-31T23:59:59Z</date>"},   // floored
      {Value::boolean(false), "<false/>"},
  };
  for (const Case& c : cases) {
    EXPECT_NE(write(c.value).find(std::string("\n") + c.text + "\n"), std::string::npos)
        << c.text << "\n"
        << write(c.value);
  }
}

TEST(XmlWriterTest, DataLinesAreIndentedAndWrapped) {
  Value doc = Value::dictionary();
  doc.set("d", Value::data(std::string(100, '\0')));
  const std::string xml = write(doc);
  const std::string line76(76, 'A');
  // 57 bytes a line; the last 43 bytes end in one padded quantum.
  const std::string last = std::string(58, 'A') + "==";
  EXPECT_NE(xml.find("\t<data>\n\t" + line76 + "\n\t" + last + "\n\t</data>\n"), std::string::npos)
      << xml;
  doc.set("d", Value::data(""));
  EXPECT_NE(write(doc).find("\t<data>\n\t</data>\n"), std::string::npos);
}

TEST(XmlWriterTest, EscapesMarkupAndCarriageReturns) {
  Value doc = Value::dictionary();
  doc.set("a&b<c>\r", "x & y < z > w \r\n \"quoted\" 'single'\t\xC3\xA9");
  const std::string xml = write(doc);
  EXPECT_NE(xml.find("<key>a&amp;b&lt;c&gt;&#13;</key>"), std::string::npos) << xml;
  EXPECT_NE(
      xml.find("<string>x &amp; y &lt; z &gt; w &#13;\n \"quoted\" 'single'\t\xC3\xA9</string>"),
      std::string::npos)
      << xml;
  std::optional<Value> back = parsePropertyList(xml);
  ASSERT_TRUE(back);
  EXPECT_EQ(*back, doc);
  // Markup after long plain runs, at every alignment.
  for (std::size_t lead = 0; lead < 17; ++lead) {
    const std::string text = std::string(lead, 'x') + "<&>\r" + std::string(lead, 'y') + "&";
    const std::string out = write(Value(text));
    EXPECT_NE(out.find("<string>" + std::string(lead, 'x') + "&lt;&amp;&gt;&#13;" +
                       std::string(lead, 'y') + "&amp;</string>"),
              std::string::npos)
        << out;
    EXPECT_EQ(*parsePropertyList(out)->asString(), text);
  }
}

TEST(XmlWriterTest, RefusesWhatXmlCannotCarry) {
  const std::string bad[] = {
      std::string("nul\0byte", 8),
      "bell\x07",
      "escape\x1B[0m",
      "\xEF\xBF\xBE",          // U+FFFE
      "\xEF\xBF\xBF",          // U+FFFF
      "\xC3",                  // truncated sequence
      "\xC3\x28",              // bad continuation
      "\x80",                  // stray continuation
      "\xC0\xAF",              // overlong
      "\xE0\x80\xAF",          // overlong
      "\xED\xA0\x80",          // surrogate
      "\xF4\x90\x80\x80",      // above U+10FFFF
      "\xF8\x88\x80\x80\x80",  // five bytes
  };
  // Each alone, and after and between runs of plain text (the writer
  // skips plain text a word at a time).
  std::vector<std::string> cases;
  for (const std::string& s : bad) {
    cases.push_back(s);
    cases.push_back(std::string(13, 'p') + s);
    cases.push_back(std::string(16, 'p') + s + std::string(9, 'q'));
  }
  for (const std::string& s : cases) {
    const std::string asString = writeFailure(Value(s));
    EXPECT_NE(asString.find("a string"), std::string::npos) << hex(s) << ": " << asString;
    Value dict = Value::dictionary();
    dict.set(s, "fine");
    const std::string asKey = writeFailure(dict);
    EXPECT_NE(asKey.find("a key"), std::string::npos) << hex(s) << ": " << asKey;
    // Deep inside a document the whole write fails too.
    Value outer = Value::array();
    outer.asArray()->push_back(Value("ok"));
    outer.asArray()->push_back(dict);
    EXPECT_NE(writeFailure(outer), "");
  }
  EXPECT_NE(writeFailure(Value("\x01")).find("U+0001"), std::string::npos);
  EXPECT_NE(writeFailure(Value::date(NAN)).find("date"), std::string::npos);
  EXPECT_NE(writeFailure(Value::date(INFINITY)).find("date"), std::string::npos);
  EXPECT_NE(writeFailure(Value::date(1e300)).find("date"), std::string::npos);
  EXPECT_NE(writeFailure(Value::date(-8.0e18)).find("date"), std::string::npos);
}

TEST(XmlWriterTest, AcceptsTheWholeCharacterRange) {
  // Tab, LF, DEL, C1 controls, the last BMP characters before U+FFFE, and
  // the top of the code space are all characters XML 1.0 carries.
  const std::string s =
      "\t\n\x7F\xC2\x80\xC2\x9F\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBD\xF0\x90\x80\x80\xF4\x8F\xBF"
      "\xBF";
  std::optional<Value> back = parsePropertyList(write(Value(s)));
  ASSERT_TRUE(back);
  EXPECT_EQ(*back->asString(), s);
}

TEST(XmlWriterTest, SampleRoundTripsExactly) {
  const Value doc = sampleDocument();
  const std::string xml = write(doc);
  std::optional<Value> back = parsePropertyList(xml);
  ASSERT_TRUE(back);
  EXPECT_EQ(dump(*back), dump(doc));  // bit for bit, -0.0 and NaN included
  EXPECT_EQ(*back, doc);
  EXPECT_EQ(write(*back), xml);  // stable
}

TEST(XmlWriterTest, DatesRoundTripAtWholeSeconds) {
  // 1900, 2100, year 1 BC and both ends of the range the writer accepts.
  for (double s : {-3187296000.0, 3124137599.0, 0.0, -1.0, 1e10, -63200000000.0, 123456789.75,
                   7.99e18, -7.99e18}) {
    std::optional<Value> back = parsePropertyList(write(Value::date(s)));
    ASSERT_TRUE(back) << s;
    EXPECT_EQ(back->asDate()->seconds, std::floor(s)) << s;
  }
}

}  // namespace
}  // namespace kolt::plist_test
