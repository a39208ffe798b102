// The table of mounts.
#include "common/mounts.h"

#include <gtest/gtest.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <utility>
#include <vector>

namespace platform {
namespace {

constexpr char kTable[] =
    "26 1 254:1 / / rw,relatime shared:1 - ext4 /dev/root rw,errors=remount-ro\n"
    "40 26 8:17 / /mnt/VV/Gr\303\274\303\237e\\040aus\\040K\303\266ln\\134 rw,noatime shared:7 master:3 - "
    "ext4 "
    "/dev/sdb1 ro,stripe=32\n"
    "41 26 0:44 /sub /mnt/VV/Photos rw,nosuid - tmpfs a\\040name rw,size=20480k,nosuid\n"
    "42 26 8:33 / /mnt/VV/Photos ro - xfs /dev/sdc1 rw,logbufs=8\n";

TEST(Mounts, AreReadWithTheirDeviceAndOptions) {
  const std::vector<Mount> mounts = mounts_of(kTable);
  ASSERT_EQ(mounts.size(), 4U);
  EXPECT_EQ(mounts[0].point, "/");
  EXPECT_EQ(mounts[0].device, makedev(254, 1));
  EXPECT_EQ(mounts[0].options, "rw,relatime,errors=remount-ro");
  EXPECT_EQ(mounts[1].point, "/mnt/VV/Gr\303\274\303\237e aus K\303\266ln\\");
  EXPECT_EQ(mounts[1].options, "ro,noatime,stripe=32");
  EXPECT_EQ(mounts[2].options, "rw,nosuid,size=20480k");
}

TEST(Mounts, AreReadAsTheKernelsOfAllReleasesWriteThem) {
  int read = 0;
  for (const auto& release : std::filesystem::directory_iterator(SAMPLES "/kernel")) {
    for (const auto& [name, writable] :
         {std::pair("mountinfo.out", true), {"mountinfo-read-only.out", false}}) {
      std::ifstream file(release.path() / name);
      const std::string text(std::istreambuf_iterator<char>(file), {});
      const std::vector<Mount> mounts = mounts_of(text);
      const auto lines = std::count(text.begin(), text.end(), '\n');
      EXPECT_EQ(mounts.size(), static_cast<size_t>(lines)) << release;
      const Mount* volume = mount_on(mounts, "/mnt/VV/Gr\303\274\303\237e aus \\K\303\266ln");
      ASSERT_NE(volume, nullptr) << release;
      EXPECT_EQ(major(volume->device), 8U) << release;
      EXPECT_EQ(volume->options.compare(0, 3, writable ? "rw," : "ro,"), 0) << volume->options;
      read++;
    }
  }
  EXPECT_GE(read, 4);
}

TEST(Mounts, TheLastOneOnAPlaceCounts) {
  const std::vector<Mount> mounts = mounts_of(kTable);
  ASSERT_NE(mount_on(mounts, "/mnt/VV/Photos"), nullptr);
  EXPECT_EQ(mount_on(mounts, "/mnt/VV/Photos")->options, "ro,logbufs=8");
  EXPECT_EQ(mount_on(mounts, "/mnt/VV"), nullptr);
}

TEST(Mounts, ALineThatIsNoneIsLeftOut) {
  for (const char* text : {"", "\n", "a", " - ", "1 2 3 4 5 6 7 8 9", "1 2 x:1 / /a rw - t d rw",
                           "1 2 8:1 / - t d rw", "1 2 8:1"}) {
    EXPECT_TRUE(mounts_of(text).empty()) << text;
  }
  EXPECT_EQ(mounts_of("1 2 8:1 / /a\\0 rw - t d").front().point, "/a\\0");
}

}  // namespace
}  // namespace platform
