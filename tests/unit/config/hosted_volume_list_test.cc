// Reading fsmlist: the first field of each line.
#include <gtest/gtest.h>

#include "config/hosted_volume_list.h"
#include "fixtures/sandbox.h"
#include "kolt/controller_helpers.h"

namespace kolt {
namespace {

Array strings(std::initializer_list<const char*> items) {
  Array a;
  for (const char* s : items) a.emplace_back(s);
  return a;
}

TEST(HostedVolumeListText, TakesTheFirstFieldOfEachLine) {
  EXPECT_EQ(parseHostedVolumeList("vol1 . 0\n\n  vol2 . 0\nvol3"), strings({"vol1", "vol3"}));
  EXPECT_EQ(parseHostedVolumeList("a . 0\na . 0\nb\tx\n"), strings({"a", "a", "b"}));
  EXPECT_TRUE(parseHostedVolumeList("").empty());
  EXPECT_TRUE(parseHostedVolumeList("\n\n").empty());
}

TEST(HostedVolumeListText, SplitsAtUnicodeSpacesButNotAtLineBreaksOtherThanLineFeed) {
  // No-break space and ideographic space separate fields.
  EXPECT_EQ(parseHostedVolumeList("c\xC2\xA0"
                                  "d\ne\xE3\x80\x80"
                                  "f . 0\n"),
            strings({"c", "e"}));
  // A carriage return is part of the field: the file is written with "\n".
  EXPECT_EQ(parseHostedVolumeList("vol1\r\n"), strings({"vol1\r"}));
  // A line starting with a no-break space adds nothing.
  EXPECT_TRUE(parseHostedVolumeList("\xC2\xA0vol\n").empty());
}

TEST(HostedVolumeListText, TextThatIsNotUtf8ReadsAsNoVolumes) {
  EXPECT_TRUE(parseHostedVolumeList("vol1 . 0\n\xC0\xAF . 0\n").empty());
}

TEST(HostedVolumeList, ReadsFsmlistAndTreatsAnUnreadableOneAsEmpty) {
  testing::Sandbox sandbox;
  EXPECT_TRUE(getHostedVolumeList().empty());
  sandbox.writeFile(kFsmlistPath, "vol1 . 0\n\n  vol2 . 0\nvol3");
  EXPECT_EQ(getHostedVolumeList(), strings({"vol1", "vol3"}));
  sandbox.removeFile(kFsmlistPath);
  sandbox.makeDirectory(kFsmlistPath);  // a directory cannot be read as text
  EXPECT_TRUE(getHostedVolumeList().empty());
}

}  // namespace
}  // namespace kolt
