// The error object: domains, fixed texts, user information, printed form.
#include <gtest/gtest.h>

#include <cerrno>

#include "kolt/constants.h"
#include "kolt/error.h"

namespace kolt {
namespace {

TEST(Error, TheNoConfigurationErrorHoldsExactlyOneDescriptionEntry) {
  const Error error = Error::vorn(kVornNoConfiguration);
  EXPECT_EQ(error.domain(), CFVornErrorDomain);
  EXPECT_EQ(error.domain(), "com.orvat.vorn.ErrorDomain");
  EXPECT_EQ(error.code(), 501);
  const Dictionary info = error.userInfo();
  ASSERT_EQ(info.size(), 1u);
  ASSERT_NE(info.find("NSLocalizedDescription"), nullptr);
  EXPECT_EQ(*info.find("NSLocalizedDescription"), Value("No existing configuration"));
}

TEST(Error, EachOwnCodeCarriesItsFixedText) {
  const std::pair<int, const char*> expected[] = {
      {500, "San has been deleted"}, {501, "No existing configuration"},
      {502, "San name mismatch"},    {503, "San UUID mismatch"},
      {504, "San name missing"},     {505, "San server missing"},
  };
  for (const auto& [code, text] : expected) {
    EXPECT_EQ(Error::vorn(code).description(), std::optional<std::string>(text)) << code;
  }
  // 506 carries the parser's own words.
  EXPECT_EQ(Error::vorn(506, "unexpected end of input").description(), "unexpected end of input");
}

TEST(Error, AFaultErrorHasAnEmptyUserInfo) {
  const Error error = Error::posix(kPosixEFAULT);
  EXPECT_EQ(error.domain(), kPosixErrorDomain);
  EXPECT_EQ(error.code(), 14);
  EXPECT_FALSE(error.description().has_value());
  EXPECT_TRUE(error.userInfo().empty());
}

TEST(Error, PrintedFormNamesDomainCodeAndDescription) {
  EXPECT_EQ(Error::vorn(502).printed(),
            "Error Domain=com.orvat.vorn.ErrorDomain Code=502 \"San name mismatch\"");
  EXPECT_EQ(Error::posix(14).printed(), "Error Domain=NSPOSIXErrorDomain Code=14");
  EXPECT_EQ(Error(std::string(kDirectoryErrorDomain), -1, "Can't contact LDAP server").status(),
            -1);
  // The text a string-form caller receives is never empty.
  EXPECT_EQ(Error::vorn(505).textForCaller(), "San server missing");
  EXPECT_NE(Error::posix(14).textForCaller().find("14"), std::string::npos);
}

TEST(Error, LinuxErrnoValuesBecomeThePlatformsNumbers) {
  EXPECT_EQ(Error::fromErrno(ENOENT).code(), 2);
  EXPECT_EQ(Error::fromErrno(EACCES).code(), 13);
  EXPECT_EQ(Error::fromErrno(EINVAL, "Invalid address parameters").code(), 22);
  EXPECT_EQ(Error::fromErrno(ENOTSUP).code(), 45);
  EXPECT_EQ(Error::fromErrno(EHOSTUNREACH).code(), 65);
  EXPECT_EQ(Error::fromErrno(EAGAIN).code(), 35);
  EXPECT_EQ(Error::fromErrno(ETIMEDOUT).code(), 60);
  EXPECT_EQ(Error::fromErrno(EINVAL, "Invalid address parameters").description(),
            "Invalid address parameters");
}

TEST(Error, SetErrorWritesOnlyWhenGivenASlot) {
  setError(nullptr, Error::vorn(500));  // no place: nothing happens
  ErrorSlot slot;
  setError(&slot, Error::vorn(500));
  ASSERT_TRUE(slot.has_value());
  EXPECT_EQ(slot->code(), 500);
}

}  // namespace
}  // namespace kolt
