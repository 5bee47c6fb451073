// Which volume names may become file names, fsmlist lines and arguments.
#include "volumes/volume_names.h"

#include <gtest/gtest.h>

namespace kolt {
namespace {

TEST(VolumeNames, AcceptsOrdinaryNames) {
  for (const char* name : {"vol1", "Media-2024_a", "x", "Proj\xC3\xA9kt", "a.b", "v..cfgp"}) {
    EXPECT_TRUE(isUsableVolumeName(name)) << name;
  }
}

TEST(VolumeNames, RejectsNamesThatLeaveTheDirectoryOrBreakALine) {
  const std::string withNul("a\0b", 3);
  for (const std::string& name :
       {std::string(""), std::string("."), std::string(".."), std::string("../etc/passwd"),
        std::string("a/b"), std::string(".hidden"), std::string("a b"), std::string("a\tb"),
        std::string("a\nb"), std::string("a\rb"), std::string("a\x7f"), withNul,
        std::string("a\xC2\xA0"
                    "b"),
        std::string("a\xC2\x85"
                    "b"),
        std::string("a\xE2\x80\xA8"
                    "b"),
        std::string("a\xE3\x80\x80"
                    "b"),
        std::string("bad\xFF")}) {
    EXPECT_FALSE(isUsableVolumeName(name)) << printableVolumeName(name);
  }
}

}  // namespace
}  // namespace kolt
