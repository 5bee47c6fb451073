// Reading the globals of a stored configuration without parsing the rest,
// and what the check does with what it reads.
#include "config/fetched_configuration.h"

#include <gtest/gtest.h>

#include "fixtures/log_capture.h"
#include "kolt/change_check.h"
#include "unit/sync/change_check_support.h"

namespace kolt::testing {
namespace {

std::string globalsOfXml(std::string_view xml) {
  const auto range = findGlobalsInXml(xml);
  return range ? std::string(xml.substr(range->first, range->second - range->first)) : "(none)";
}

TEST(FindGlobalsInXmlTest, FindsTheTopLevelGlobalsDictionaryOnly) {
  const std::string head = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">";
  // Where it is, and where it stops.
  EXPECT_EQ(globalsOfXml(head + "<dict><key>globals</key><dict><key>revision</key><string>R"
                                "</string></dict><key>volumes</key><dict>unparsed &bad;"),
            "<dict><key>revision</key><string>R</string></dict>");
  EXPECT_EQ(globalsOfXml("\xEF\xBB\xBF" + head + "<dict><key>globals</key><dict/></dict></plist>"),
            "<dict/>");
  EXPECT_EQ(globalsOfXml(head + "<dict><key>volumes</key><dict><key>globals</key><dict>"
                                "<key>x</key><true/></dict></dict><key>globals</key><dict>"
                                "<key>y</key><false/></dict></dict></plist>"),
            "<dict><key>y</key><false/></dict>")
      << "a volume's own \"globals\" is not the configuration's";
  // Where it is not.
  for (const std::string& xml : {
           head + "<dict><key>volumes</key><dict/></dict></plist>",
           head + "<dict><key>globals</key><string>x</string></dict></plist>",
           head + "<array><dict><key>globals</key><dict/></dict></array></plist>",
           head + "<dict><key>other</key><string>globals</string><key>x</key><dict/></dict>",
           std::string("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><plist><dict>"
                       "<key>globals</key><dict/></dict></plist>"),
           std::string("bplist00\xd1\x01\x02"),
           std::string(),
       }) {
    EXPECT_EQ(globalsOfXml(xml), "(none)") << xml;
  }
}

class FetchedConfigurationTest : public ::testing::Test {
 protected:
  FetchedConfigurationTest()
      : directory_(MemoryDirectory::create()),
        machine_(directory_, kMemberUUID),
        scoped_(&machine_.env()) {
    user_ = ldapSanUserNameForName(kSanName);
    directory_->addUser(user_, kSecret);
    EXPECT_TRUE(
        saveConfigPlist(memberDocument(stringArray({"ldap://10.0.0.1"}), "CLIENT", kRevision1)));
    machine_.sandbox().writeFile(vornFile(".auth_secret"), kSecret, 0600);
  }
  void store(const std::string& xml) {
    directory_->addGroup(ldapSanConfNameForName(kSanName), std::nullopt, xml, {user_});
  }
  std::shared_ptr<MemoryDirectory> directory_;
  MemoryMachine machine_;
  ScopedEnv scoped_;
  std::string user_;
  std::uint32_t mask_ = 0;
};

TEST_F(FetchedConfigurationTest, AnUnchangedRevisionReadsNoFurtherThanTheGlobals) {
  // Globals first, as kolt writes them, then text that is no property list.
  store(std::string("<?xml version=\"1.0\" encoding=\"UTF-8\"?><plist version=\"1.0\"><dict>") +
        "<key>globals</key><dict><key>revision</key><string>" + kRevision1 +
        "</string><key>sanName</key><string>" + kSanName +
        "</string><key>sharedSecret</key><string>" + kSecret +
        "</string></dict><key>volumes</key><dict><key>v</key><oops>");
  LogCapture logs;
  EXPECT_EQ(checkSanConfigChange(&mask_, nullptr), 0);
  EXPECT_EQ(mask_, 0u);
  EXPECT_TRUE(logs.contains("Got config "));
  EXPECT_FALSE(logs.contains(kSecret));
}

TEST_F(FetchedConfigurationTest, AnyOtherRevisionParsesTheWholeConfiguration) {
  // The same text at another revision cannot be applied.
  store(std::string("<?xml version=\"1.0\" encoding=\"UTF-8\"?><plist version=\"1.0\"><dict>") +
        "<key>globals</key><dict><key>revision</key><string>" + kRevision2 +
        "</string></dict><key>volumes</key><dict><key>v</key><oops>");
  const FileSnapshot before = snapshotFiles(machine_.sandbox().root());
  EXPECT_EQ(checkSanConfigChange(&mask_, nullptr), 22);
  EXPECT_TRUE(differences(before, snapshotFiles(machine_.sandbox().root())).empty());
}

TEST_F(FetchedConfigurationTest, GlobalsAfterTheVolumesStillGateTheCheck) {
  Value config = publishedConfig(stringArray({"ldap://10.0.0.1"}), kRevision1);
  std::string xml = *writeXmlPropertyList(config);
  // Move the globals behind the volumes.
  const auto range = findGlobalsInXml(xml);
  ASSERT_TRUE(range);
  const std::string globals = xml.substr(range->first, range->second - range->first);
  const std::size_t keyStart = xml.rfind("<key>globals</key>", range->first);
  xml.erase(keyStart, range->second - keyStart);
  const std::size_t end = xml.rfind("</dict>");
  xml.insert(end, "<key>globals</key>" + globals);
  ASSERT_EQ(*parsePropertyList(xml), config);
  store(xml);
  EXPECT_EQ(checkSanConfigChange(&mask_, nullptr), 0);
  EXPECT_EQ(mask_, 0u);
}

}  // namespace
}  // namespace kolt::testing
