// Documents written by Python's plistlib read back equal through our
// readers, and documents we write read back equal through plistlib.
#include <gtest/gtest.h>

#include "unit/plist/plist_test_support.h"

namespace kolt::plist_test {
namespace {

class PlistlibInteropTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!havePython()) GTEST_SKIP() << "python3 is not installed";
  }
  ScratchDir dir_;
};

std::optional<Value> parseFile(const std::filesystem::path& p) {
  std::optional<Error> error;
  std::optional<Value> v = parsePropertyList(readFile(p), &error);
  EXPECT_TRUE(v) << p << ": " << (error ? error->printed() : "");
  return v;
}

TEST_F(PlistlibInteropTest, PlistlibXmlAndBinaryReadBackEqual) {
  ASSERT_EQ(runOracle({"sample", dir_.path().string()}), 0);
  const std::string expected = readFile(dir_ / "sample.dump");
  ASSERT_FALSE(expected.empty());
  std::optional<Value> fromXml = parseFile(dir_ / "sample.xml");
  std::optional<Value> fromBinary = parseFile(dir_ / "sample.binary");
  ASSERT_TRUE(fromXml && fromBinary);
  EXPECT_EQ(dump(*fromXml), expected);
  EXPECT_EQ(dump(*fromBinary), expected);
  EXPECT_EQ(*fromXml, *fromBinary);
}

TEST_F(PlistlibInteropTest, OurXmlReadsBackEqualThroughPlistlib) {
  const Value doc = sampleDocument();
  std::optional<std::string> xml = writeXmlPropertyList(doc);
  ASSERT_TRUE(xml);
  writeFile(dir_ / "ours.xml", *xml);
  ASSERT_EQ(runOracle({"dump", (dir_ / "ours.xml").string(), (dir_ / "ours.dump").string()}), 0);
  // XML carries whole seconds; the sample's dates are whole already.
  EXPECT_EQ(readFile(dir_ / "ours.dump"), dump(doc));
}

TEST_F(PlistlibInteropTest, PlistlibBinaryOfOurXmlReadsBackEqual) {
  const Value doc = sampleDocument();
  writeFile(dir_ / "ours.xml", *writeXmlPropertyList(doc));
  ASSERT_EQ(runOracle({"convert", "binary", (dir_ / "ours.xml").string(),
                       (dir_ / "theirs.binary").string()}),
            0);
  ASSERT_EQ(
      runOracle({"convert", "xml", (dir_ / "ours.xml").string(), (dir_ / "theirs.xml").string()}),
      0);
  std::optional<Value> fromBinary = parseFile(dir_ / "theirs.binary");
  ASSERT_TRUE(fromBinary);
  EXPECT_EQ(dump(*fromBinary), dump(doc));
  EXPECT_EQ(*fromBinary, doc);
  // plistlib's XML writer turns CR into LF, so compare all but those keys.
  std::optional<Value> fromXml = parseFile(dir_ / "theirs.xml");
  ASSERT_TRUE(fromXml);
  Value withoutCr = doc;
  withoutCr.erase("carriage\rreturn");
  fromXml->erase("carriage\nreturn");
  EXPECT_EQ(*fromXml, withoutCr);
}

}  // namespace
}  // namespace kolt::plist_test
