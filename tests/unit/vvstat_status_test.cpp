// What is read from a listing of the configuration tree.
#include "vvstat/status.h"

#include <gtest/gtest.h>

namespace vvstat {
namespace {

// `lines` are without what stands before all paths.
Status status_of(std::initializer_list<const char*> lines) {
  std::string listing;
  for (const char* line : lines) listing.append("/iscsi/initiator/").append(line).append("\n");
  return read_status(platform::TreeListing(listing));
}

TEST(Status, OfATarget) {
  const Status status =
      status_of({"ver=1", "id:1/target=iqn.t", "id:1/ip=[fe80::1]", "id:1/port=3260", "id:1/chap_pwd=secret",
                 "id:1/conn_set=1", "id:1/conn_state=3", "id:1/status=Reconnecting"});
  ASSERT_EQ(status.targets.size(), 1U);
  const Target& target = status.targets[0];
  EXPECT_EQ(target.name, "iqn.t");
  EXPECT_EQ(target.address, "[fe80::1]");
  EXPECT_EQ(target.port, 3260);
  EXPECT_TRUE(target.wanted);
  EXPECT_EQ(target.connect_state, 3);
  EXPECT_EQ(target.status, "Reconnecting");
  EXPECT_TRUE(target.volumes.empty());
}

TEST(Status, OfAVolume) {
  const Status status = status_of(
      {"id:1/target=iqn.t", "id:1/lun/count=1", "id:1/lun/id:1/lun=7", "id:1/lun/id:1/share=a\\x0Ab=c",
       "id:1/lun/id:1/status=Running", "id:1/lun/id:1/enable=1", "id:1/lun/id:1/vol_access_right=0",
       "id:1/lun/id:1/format_state=1", "id:1/lun/id:1/format_progress=137", "id:1/lun/id:1/volume_state=4",
       "id:1/lun/id:1/fs_type=ext4", "id:1/lun/id:1/dev=sdb", "id:1/lun/id:1/mnt_dev=/dev/sdb1",
       "id:1/lun/id:1/mnt=/mnt/VV/a"});
  ASSERT_EQ(status.targets.size(), 1U);
  ASSERT_EQ(status.targets[0].volumes.size(), 1U);
  const Volume& volume = status.targets[0].volumes[0];
  EXPECT_EQ(volume.lun, 7);
  EXPECT_EQ(volume.share, "a\nb=c");
  EXPECT_EQ(volume.status, "Running");
  EXPECT_TRUE(volume.enabled);
  EXPECT_TRUE(volume.read_only);
  EXPECT_EQ(volume.format_state, 1);
  EXPECT_EQ(volume.progress, 100);
  EXPECT_EQ(volume.volume_state, 4);
  EXPECT_EQ(volume.file_system, "ext4");
  EXPECT_EQ(volume.device, "sdb");
  EXPECT_EQ(volume.mount_point, "/mnt/VV/a");
}

TEST(Status, WhatIsMissingOrEmptyIsUnknown) {
  const Status status = status_of(
      {"id:1/target=iqn.t", "id:1/conn_state=", "id:1/lun/id:1/lun=1", "id:1/lun/id:1/vol_access_right="});
  const Target& target = status.targets.at(0);
  EXPECT_EQ(target.connect_state, -1);
  EXPECT_FALSE(target.wanted);
  const Volume& volume = target.volumes.at(0);
  EXPECT_EQ(volume.format_state, -1);
  EXPECT_EQ(volume.volume_state, -1);
  EXPECT_FALSE(volume.read_only);
  EXPECT_FALSE(volume.enabled);
}

// Values stand in the order in which they were made, not in that of their slots.
TEST(Status, SlotsAreUsedUpToTheFirstFreeOne) {
  const Status status =
      status_of({"id:2/target=iqn.b", "id:1/lun/id:2/lun=5", "id:1/lun/id:4/lun=8", "id:1/lun/id:1/lun=0",
                 "id:1/lun/id:3/lun=", "id:4/target=iqn.d", "id:1/target=iqn.a"});
  ASSERT_EQ(status.targets.size(), 2U);
  EXPECT_EQ(status.targets[0].name, "iqn.a");
  EXPECT_EQ(status.targets[1].name, "iqn.b");
  ASSERT_EQ(status.targets[0].volumes.size(), 2U);
  EXPECT_EQ(status.targets[0].volumes[0].lun, 0);
  EXPECT_EQ(status.targets[0].volumes[1].lun, 5);
}

TEST(Status, WhatIsNoSlotIsLeftOut) {
  const Status status = status_of({"id:0/target=a", "id:9/target=a", "id:/target=a",
                                   "id:99999999999999999999/target=a", "id:1=a", "id:1/target:2=a",
                                   "id:1/x/target=a", "id:1x/target=a", "id:1/target", "/id:1/target=a"});
  EXPECT_TRUE(status.reachable);
  EXPECT_TRUE(status.targets.empty());
}

}  // namespace
}  // namespace vvstat
