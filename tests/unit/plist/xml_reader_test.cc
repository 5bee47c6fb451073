// The XML reader: what it accepts, what it refuses, and that hostile
// documents fail cleanly with a reason.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "unit/plist/plist_test_support.h"

namespace kolt::plist_test {
namespace {

std::string wrap(std::string_view body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n" +
         std::string(body) + "\n</plist>\n";
}

Value parseOk(std::string_view xml) {
  std::optional<Error> error;
  std::optional<Value> v = parsePropertyList(xml, &error);
  EXPECT_TRUE(v) << xml << "\n" << (error ? error->printed() : "");
  return v ? *v : Value::dictionary();
}

Value parseBody(std::string_view body) {
  return parseOk(wrap(body));
}

TEST(XmlReaderTest, ReadsEveryKind) {
  const Value v = parseBody(
      "<dict><key>s</key><string> keeps  spaces </string>"
      "<key>i</key><integer>-42</integer><key>r</key><real>2.5</real>"
      "<key>t</key><true/><key>f</key><false/>"
      "<key>d</key><date>2024-02-29T12:34:56Z</date>"
      "<key>b</key><data>AAEC</data><key>a</key><array><string/><dict/></array></dict>");
  EXPECT_EQ(*v.findString("s"), " keeps  spaces ");
  EXPECT_EQ(*v.find("i"), Value::integer(-42));
  EXPECT_EQ(*v.find("r")->asReal(), 2.5);
  EXPECT_TRUE(*v.find("t")->asBoolean());
  EXPECT_FALSE(*v.find("f")->asBoolean());
  EXPECT_EQ(v.find("d")->asDate()->seconds, 730902896.0);
  EXPECT_EQ(v.find("b")->asData()->bytes, std::string("\0\1\2", 3));
  ASSERT_EQ(v.findArray("a")->size(), 2u);
  EXPECT_EQ(*(*v.findArray("a"))[0].asString(), "");
}

TEST(XmlReaderTest, IntegersKeepSignAndFullRange) {
  struct Case {
    const char* text;
    std::int64_t bits;
    bool isUnsigned;
  };
  const Case cases[] = {
      {"-9223372036854775808", INT64_MIN, false},
      {"9223372036854775807", INT64_MAX, false},
      {"9223372036854775808", INT64_MIN, true},
      {"18446744073709551615", -1, true},
      {"-1", -1, false},
      {"+17", 17, false},
      {"-0", 0, false},
      {" \n\t12 \n", 12, false},
      {"0x7f", 127, false},
      {"0XFFFFFFFFFFFFFFFF", -1, true},
      {"-0x10", -16, false},
      {"007", 7, false},
  };
  for (const Case& c : cases) {
    const Value v = parseBody(std::string("<integer>") + c.text + "</integer>");
    ASSERT_TRUE(v.isInteger()) << c.text;
    EXPECT_EQ(v.asInteger()->bits, c.bits) << c.text;
    EXPECT_EQ(v.asInteger()->isUnsigned, c.isUnsigned) << c.text;
  }
}

TEST(XmlReaderTest, RealsInTheFormsWritersUse) {
  struct Case {
    const char* text;
    double value;
  };
  const double inf = std::numeric_limits<double>::infinity();
  const Case cases[] = {
      {"1", 1.0},          {"-2.5", -2.5},  {"1e10", 1e10},
      {"1.5E-3", 1.5e-3},  {"+3.25", 3.25}, {".5", 0.5},
      {"0.1", 0.1},        {"inf", inf},    {"+infinity", inf},
      {"-infinity", -inf}, {"-inf", -inf},  {"1e999", inf},
      {"-1e999", -inf},    {"1e-999", 0.0}, {"4.9406564584124654e-324", 4.9406564584124654e-324},
      {" 7 ", 7.0},
  };
  for (const Case& c : cases) {
    const Value v = parseBody(std::string("<real>") + c.text + "</real>");
    ASSERT_TRUE(v.isReal()) << c.text;
    EXPECT_EQ(*v.asReal(), c.value) << c.text;
  }
  EXPECT_TRUE(std::isnan(*parseBody("<real>nan</real>").asReal()));
  EXPECT_TRUE(std::isnan(*parseBody("<real>NaN</real>").asReal()));
  EXPECT_TRUE(std::signbit(*parseBody("<real>-0.0</real>").asReal()));
}

TEST(XmlReaderTest, DatesAcrossTheCalendar) {
  EXPECT_EQ(parseBody("<date>2001-01-01T00:00:00Z</date>").asDate()->seconds, 0.0);
  EXPECT_EQ(parseBody("<date>1900-01-01T00:00:00Z</date>").asDate()->seconds, -3187296000.0);
  EXPECT_EQ(parseBody("<date>2100-03-01T00:00:00Z</date>").asDate()->seconds, 3129235200.0);
  EXPECT_EQ(parseBody("<date>1970-01-01T00:00:00Z</date>").asDate()->seconds, -978307200.0);
  EXPECT_EQ(parseBody("<date>\n 2001-01-01T00:00:01Z\n</date>").asDate()->seconds, 1.0);
}

TEST(XmlReaderTest, DataIgnoresWhitespaceAndPadding) {
  EXPECT_EQ(parseBody("<data>\n\tSGVs\n\tbG8=\n</data>").asData()->bytes, "Hello");
  EXPECT_EQ(parseBody("<data>SGVsbG8</data>").asData()->bytes, "Hello");
  EXPECT_EQ(parseBody("<data>SGk=</data>").asData()->bytes, "Hi");
  EXPECT_EQ(parseBody("<data>SA==</data>").asData()->bytes, "H");
  EXPECT_EQ(parseBody("<data></data>").asData()->bytes, "");
  EXPECT_EQ(parseBody("<data/>").asData()->bytes, "");
}

TEST(XmlReaderTest, TextFeatures) {
  // Entities, character references, CDATA and comments are ordinary XML.
  EXPECT_EQ(*parseBody("<string>&lt;&amp;&gt;&quot;&apos;&#13;&#x41;</string>").asString(),
            "<&>\"'\rA");
  EXPECT_EQ(*parseBody("<string><![CDATA[<raw> & ]]>x</string>").asString(), "<raw> & x");
  EXPECT_EQ(*parseBody("<!-- note --><string>a<!-- inside -->b</string>").asString(), "ab");
  // A raw CR LF is read as LF, as XML requires.
  EXPECT_EQ(*parseBody("<string>a\r\nb\rc</string>").asString(), "a\nb\nc");
  EXPECT_EQ(*parseBody("<string>caf\xC3\xA9 \xF0\x9F\x98\x80</string>").asString(),
            "caf\xC3\xA9 \xF0\x9F\x98\x80");
}

TEST(XmlReaderTest, AcceptsPrologueVariants) {
  const std::string body = "<plist version=\"1.0\"><string>x</string></plist>";
  const std::string doctype =
      "<!DOCTYPE plist PUBLIC \"-//Example//DTD PLIST 1.0//EN\" "
      "\"http://example.com/PropertyList-1.0.dtd\">\n";
  for (const std::string& doc : std::vector<std::string>{
           body,
           "<?xml version=\"1.0\"?>" + body,
           "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n" + doctype + body,
           "\xEF\xBB\xBF<?xml version=\"1.0\" encoding=\"UTF-8\"?>" + body,
           "\n\n  \t<?xml version=\"1.0\" encoding=\"UTF-8\"?>" + body,
           "<!DOCTYPE plist [ <!ELEMENT plist ANY> ]>" + body,
           "<plist><string>x</string></plist>",
       }) {
    EXPECT_EQ(parseOk(doc), Value("x")) << doc;
  }
}

TEST(XmlReaderTest, LaterDuplicateKeyReplacesEarlier) {
  const Value v = parseBody(
      "<dict><key>b</key><integer>1</integer><key>a</key><integer>2</integer>"
      "<key>b</key><integer>3</integer></dict>");
  ASSERT_EQ(v.asDictionary()->size(), 2u);
  EXPECT_EQ(*v.find("b"), Value::integer(3));
  EXPECT_EQ(v.asDictionary()->begin()->first, "a");  // kept sorted
}

TEST(XmlReaderTest, RefusesContentOfTheWrongKind) {
  const char* bodies[] = {
      "<integer>12abc</integer>",
      "<integer></integer>",
      "<integer>1.0</integer>",
      "<integer>- 1</integer>",
      "<integer>--1</integer>",
      "<integer>0x</integer>",
      "<integer>0x-1</integer>",
      "<integer>18446744073709551616</integer>",
      "<integer>-9223372036854775809</integer>",
      "<integer>99999999999999999999999</integer>",
      "<real>1.5x</real>",
      "<real></real>",
      "<real>0x10</real>",
      "<real>1e</real>",
      "<real>one</real>",
      "<date>yesterday</date>",
      "<date>2024-02-30T00:00:00Z</date>",
      "<date>2023-02-29T00:00:00Z</date>",
      "<date>2024-01-01T24:00:00Z</date>",
      "<date>2024-01-01</date>",
      "<date>2024-01-01T00:00:00</date>",
      "<date>2024-01-01T00:00:00+01:00</date>",
      "<date></date>",
      "<date>999999999999-01-01T00:00:00Z</date>",
      "<date>-999999999999-01-01T00:00:00Z</date>",
      "<data>@@@@</data>",
      "<data>SGVsbG8=x</data>",
      "<data>S</data>",
      "<data>SG=Vs</data>",
      "<data>=</data>",
      "<true>yes</true>",
      "<false>0</false>",
  };
  for (const char* body : bodies) {
    const std::string reason = parseFailure(wrap(body));
    EXPECT_FALSE(reason.empty()) << body;
    EXPECT_NE(reason.find("line "), std::string::npos) << reason;
  }
  EXPECT_NE(parseFailure(wrap("<integer>12abc</integer>")).find("<integer>"), std::string::npos);
  EXPECT_NE(parseFailure(wrap("<date>yesterday</date>")).find("<date>"), std::string::npos);
}

TEST(XmlReaderTest, RefusesMisplacedStructure) {
  const char* docs[] = {
      "",
      "   \n",
      "<plist version=\"1.0\"></plist>",
      "<plist version=\"1.0\">   </plist>",
      "<dict/>",
      "<plist><string>a</string><string>b</string></plist>",
      "<plist><key>a</key></plist>",
      "<plist><array><key>a</key></array></plist>",
      "<plist><dict><string>a</string></dict></plist>",
      "<plist><dict><key>a</key></dict></plist>",
      "<plist><dict><key>a</key><key>b</key><string/></dict></plist>",
      "<plist><dict>text<key>a</key><string/></dict></plist>",
      "<plist>text<string/></plist>",
      "<plist><array>x</array></plist>",
      "<plist><string>a<b/></string></plist>",
      "<plist><key>a<key>b</key></key></plist>",
      "<plist><unknown/></plist>",
      "<plist><plist/></plist>",
      "<plist><dict><key>a</key><plist/></dict></plist>",
      "<plist><string>unterminated</plist>",
      "<plist><string>a</string>",
      "<plist><string>a</string></plist><plist/>",
      "<plist><string>a</string></plist>junk",
      "<plist><string>a & b</string></plist>",
  };
  for (const char* doc : docs) {
    const std::string reason = parseFailure(doc);
    EXPECT_FALSE(reason.empty()) << doc;
  }
  const std::string reason =
      parseFailure("<plist>\n<dict>\n<key>a</key>\n<key>b</key>\n</dict></plist>");
  EXPECT_NE(reason.find("line 4"), std::string::npos) << reason;
  EXPECT_NE(reason.find("<key> without a value"), std::string::npos) << reason;
}

TEST(XmlReaderTest, RefusesInvalidCharacters) {
  const char* docs[] = {
      "<plist><string>\xC3\x28</string></plist>",      // bad continuation
      "<plist><string>\xC0\xAF</string></plist>",      // overlong
      "<plist><string>\xED\xA0\x80</string></plist>",  // surrogate
      "<plist><string>\xFF</string></plist>",          // not UTF-8 at all
      "<plist><string>a\x01z</string></plist>",        // C0 control
      "<plist><string>&#1;</string></plist>",          // referenced control
      "<plist><string>&#xFFFE;</string></plist>",      // not a character
      "<plist><key>\x7F\xC3</key></plist>",            // truncated sequence
  };
  for (const char* doc : docs) EXPECT_FALSE(parseFailure(doc).empty()) << doc;
  const std::string withNul("<plist><string>a\0b</string></plist>", 35);
  EXPECT_FALSE(parseFailure(withNul).empty());
}

TEST(XmlReaderTest, RefusesEntityDeclarationsAndProcessingTricks) {
  const std::string laughs =
      "<?xml version=\"1.0\"?>\n<!DOCTYPE plist [\n"
      " <!ENTITY lol \"lol\">\n"
      " <!ENTITY lol1 \"&lol;&lol;&lol;&lol;&lol;&lol;&lol;&lol;&lol;&lol;\">\n"
      " <!ENTITY lol2 \"&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;\">\n"
      " <!ENTITY lol3 \"&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;\">\n"
      " <!ENTITY lol4 \"&lol3;&lol3;&lol3;&lol3;&lol3;&lol3;&lol3;&lol3;&lol3;&lol3;\">\n"
      " <!ENTITY lol5 \"&lol4;&lol4;&lol4;&lol4;&lol4;&lol4;&lol4;&lol4;&lol4;&lol4;\">\n"
      " <!ENTITY lol6 \"&lol5;&lol5;&lol5;&lol5;&lol5;&lol5;&lol5;&lol5;&lol5;&lol5;\">\n"
      " <!ENTITY lol7 \"&lol6;&lol6;&lol6;&lol6;&lol6;&lol6;&lol6;&lol6;&lol6;&lol6;\">\n"
      " <!ENTITY lol8 \"&lol7;&lol7;&lol7;&lol7;&lol7;&lol7;&lol7;&lol7;&lol7;&lol7;\">\n"
      " <!ENTITY lol9 \"&lol8;&lol8;&lol8;&lol8;&lol8;&lol8;&lol8;&lol8;&lol8;&lol8;\">\n"
      "]>\n<plist><string>&lol9;</string></plist>";
  EXPECT_NE(parseFailure(laughs).find("entity declarations are not accepted"), std::string::npos);

  const char* docs[] = {
      "<!DOCTYPE plist [<!ENTITY secret SYSTEM \"file:///etc/passwd\">]>"
      "<plist><string>&secret;</string></plist>",
      "<!DOCTYPE plist [<!ENTITY % p SYSTEM \"http://example.com/x.dtd\"> %p;]>"
      "<plist><string>x</string></plist>",
      "<!DOCTYPE plist [<!ENTITY e \"x\">]><plist><string>y</string></plist>",
      "<!DOCTYPE plist [<!ENTITY u SYSTEM \"x\" NDATA gif>]><plist><string>y</string></plist>",
      // With an external subset expat would skip an unknown entity.
      "<!DOCTYPE plist SYSTEM \"http://example.com/p.dtd\"><plist><string>&u;</string></plist>",
      "<plist><string>&undefined;</string></plist>",
      "<plist><?evil stuff?><string>x</string></plist>",
      "<?xml version=\"1.0\"?><?xml-stylesheet href=\"x\"?><plist><string>x</string></plist>",
  };
  for (const char* doc : docs) EXPECT_FALSE(parseFailure(doc).empty()) << doc;
}

TEST(XmlReaderTest, DeepNestingFailsAtTheLimit) {
  constexpr int kLevels = 100000;
  std::string deep = "<plist>";
  for (int i = 0; i < kLevels; ++i) deep += "<array>";
  for (int i = 0; i < kLevels; ++i) deep += "</array>";
  deep += "</plist>";
  EXPECT_NE(parseFailure(deep).find("nested deeper than 512"), std::string::npos);

  std::string dicts = "<plist>";
  for (int i = 0; i < kLevels; ++i) dicts += "<dict><key>k</key>";
  EXPECT_NE(parseFailure(dicts).find("nested deeper"), std::string::npos);

  // Exactly at the limit works.
  ParseLimits limits;
  limits.maxDepth = 3;
  EXPECT_EQ(parseFailure("<plist><array><array><array/></array></array></plist>", limits), "");
  EXPECT_NE(
      parseFailure("<plist><array><array><array><array/></array></array></array></plist>", limits),
      "");
}

TEST(XmlReaderTest, ObjectAndByteBudgets) {
  std::string many = "<plist><array>";
  for (int i = 0; i < 100; ++i) many += "<true/>";
  many += "</array></plist>";
  ParseLimits limits;
  limits.maxObjects = 50;
  EXPECT_NE(parseFailure(many, limits).find("more than 50 objects"), std::string::npos);
  limits.maxObjects = 101;
  EXPECT_EQ(parseFailure(many, limits), "");

  limits = {};
  limits.maxBytes = 10;
  EXPECT_NE(
      parseFailure(wrap("<string>" + std::string(11, 'x') + "</string>"), limits).find("bytes"),
      std::string::npos);
  EXPECT_EQ(parseFailure(wrap("<string>" + std::string(10, 'x') + "</string>"), limits), "");
}

TEST(XmlReaderTest, EveryTruncationFailsCleanly) {
  const std::string doc = *writeXmlPropertyList(sampleDocument());
  const std::size_t closing = doc.rfind("</plist>") + std::strlen("</plist>");
  for (std::size_t n = 0; n < doc.size(); ++n) {
    std::optional<Error> error;
    std::optional<Value> v = parsePropertyList(std::string_view(doc).substr(0, n), &error);
    if (n < closing) {
      ASSERT_FALSE(v) << "prefix of " << n << " bytes parsed";
      ASSERT_TRUE(error && error->code() == kPosixEINVAL && error->description()) << n;
    } else {
      ASSERT_TRUE(v) << n;
    }
  }
}

}  // namespace
}  // namespace kolt::plist_test
