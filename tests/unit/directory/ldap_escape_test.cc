#include "platform/directory/ldap_escape.h"

#include <gtest/gtest.h>

#include <vector>

namespace kolt {
namespace {

TEST(LdapEscapeTest, DnValuesEscapeEverySpecialCharacter) {
  EXPECT_EQ(escapeDnValue("plain.name-1"), "plain.name-1");
  EXPECT_EQ(escapeDnValue("a,cn=groups"), "a\\,cn\\=groups");
  EXPECT_EQ(escapeDnValue("a+cn=b"), "a\\+cn\\=b");
  EXPECT_EQ(escapeDnValue("q\"<>;\\"), "q\\\"\\<\\>\\;\\\\");
  EXPECT_EQ(escapeDnValue(" lead"), "\\ lead");
  EXPECT_EQ(escapeDnValue("trail "), "trail\\ ");
  EXPECT_EQ(escapeDnValue("#x#"), "\\#x#");
  EXPECT_EQ(escapeDnValue(" "), "\\ ");
  EXPECT_EQ(escapeDnValue(std::string("n\0l\n", 4)), "n\\00l\\0A");
  EXPECT_EQ(escapeDnValue("é*()"), "é*()");  // UTF-8 and filter characters stay
}

TEST(LdapEscapeTest, EscapedValuesParseBackToOneValue) {
  const std::vector<std::string> values = {"a,cn=users,dc=x",
                                           "a+uid=b",
                                           " both ",
                                           "#hash",
                                           "back\\slash",
                                           "x\"y",
                                           "nön ASCII 日本",
                                           std::string("nul\0byte", 8),
                                           "=",
                                           ";",
                                           "<>"};
  for (const std::string& value : values) {
    const std::string dn = "cn=" + escapeDnValue(value) + ",cn=groups,dc=example,dc=com";
    EXPECT_EQ(firstRdnValue(dn), value) << dn;
  }
}

TEST(LdapEscapeTest, FilterValuesEscapeWildcardsAndParentheses) {
  EXPECT_EQ(escapeFilterValue("My*"), "My\\2A");
  EXPECT_EQ(escapeFilterValue("a)(cn=*"), "a\\29\\28cn=\\2A");
  EXPECT_EQ(escapeFilterValue("back\\slash"), "back\\5Cslash");
  EXPECT_EQ(escapeFilterValue(std::string("a\0b", 3)), "a\\00b");
  EXPECT_EQ(escapeFilterValue("é"), "\\C3\\A9");
  EXPECT_EQ(escapeFilterValue("plain name"), "plain name");
}

TEST(LdapEscapeTest, DnsAreComparedParsedNotAsStrings) {
  EXPECT_TRUE(sameDn("uid=a\\2Cb,cn=users,dc=x", "UID=a\\,b, cn=users,DC=x"));
  EXPECT_TRUE(sameDn("cn=\\#x,dc=y", "cn=\\23x,dc=y"));
  EXPECT_FALSE(sameDn("uid=a,cn=users,dc=x", "uid=a,cn=groups,dc=x"));
  EXPECT_FALSE(sameDn("uid=a+cn=b,dc=x", "uid=a\\+cn\\=b,dc=x"));
  EXPECT_FALSE(sameDn("not a dn", "not a dn"));
  EXPECT_FALSE(firstRdnValue("uid=a+cn=b,dc=x"));
}

}  // namespace
}  // namespace kolt
