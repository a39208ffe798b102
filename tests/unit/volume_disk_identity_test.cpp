// Whose disk a name is, by sysfs.
#include "volume/disk_identity.h"

#include <filesystem>
#include <fstream>

#include "volume_fixture.h"

using namespace remvol;

namespace {

constexpr char kDevices[] = "/sys/block/devices";  // anywhere below the folder that is the test's own

class DiskIdentity : public VolumeTest {
 protected:
  DiskIdentity() {
    copy_text(entry.target_name, "iqn.t1");
    entry.lun = 3;
  }

  // What the `device` link of sdb leads to.
  static void lead_to(const std::string& device) {
    const std::string path = std::string(kDevices) + "/" + device;
    std::filesystem::create_directories(path);
    std::filesystem::create_directories("/sys/block/sdb");
    std::filesystem::remove("/sys/block/sdb/device");
    std::filesystem::create_directory_symlink(path, "/sys/block/sdb/device");
  }

  static void name_session(int number, const std::string& target) {
    const std::string session = "session" + std::to_string(number);
    const std::string folder = std::string(kDevices) + "/host2/" + session + "/iscsi_session/" + session;
    std::filesystem::create_directories(folder);
    std::ofstream(folder + "/targetname") << target;
  }
};

}  // namespace

TEST_F(DiskIdentity, TheTargetAndTheLunMakeItOurs) {
  name_session(7, "iqn.t1\n");
  lead_to("host2/session7/target2:0:0/2:0:0:3");
  for (const char* node : {"sdb", "/dev/sdb", "sdb1", "/dev/sdb1", "/dev/sdb12"}) {
    EXPECT_EQ(disk_owner(&entry, node), kDiskOurs) << node;
    EXPECT_EQ(is_session_disk(node, "iqn.t1"), SessionDisk::kYes) << node;
    EXPECT_EQ(is_session_disk(node, nullptr), SessionDisk::kYes) << node;
  }
}

TEST_F(DiskIdentity, AnotherTargetOrLunMakesItForeign) {
  for (const char* name : {"iqn.t2\n", "iqn.t\n", "iqn.t11\n"}) {
    name_session(7, name);
    lead_to("host2/session7/target2:0:0/2:0:0:3");
    EXPECT_EQ(disk_owner(&entry, "/dev/sdb1"), kDiskForeign) << name;
    EXPECT_EQ(is_session_disk("/dev/sdb1", "iqn.t1"), SessionDisk::kNo) << name;
  }
  name_session(7, "iqn.t1\n");
  for (const char* lun : {"0", "33", "4294967299"}) {
    lead_to(std::string("host2/session7/target2:0:0/2:0:0:") + lun);
    EXPECT_EQ(disk_owner(&entry, "/dev/sdb1"), kDiskForeign) << lun;
  }
}

TEST_F(DiskIdentity, ADiskOfTheMachineIsForeign) {
  for (const char* device :
       {"ata1/host0/target0:0:0/0:0:0:3", "virtio2", "session/0:0:0:3", "sessions7/0:0:0:3"}) {
    lead_to(device);
    EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskForeign) << device;
    EXPECT_EQ(is_session_disk("sdb", nullptr), SessionDisk::kNo) << device;
  }
}

// The listing and the tree have the number with the bits of its addressing method, too.
TEST_F(DiskIdentity, ALargeLunIsComparedAsTheKernelShowsIt) {
  entry.lun = 16640;
  name_session(7, "iqn.t1\n");
  lead_to("host2/session7/target2:0:0/2:0:0:16640");
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskOurs);
  lead_to("host2/session7/target2:0:0/2:0:0:256");
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskForeign);
}

TEST_F(DiskIdentity, WhatCannotBeLookedAtIsForeign) {
  name_session(7, "iqn.t1\n");
  lead_to("host2/session7/target2:0:0/2:0:0:3");
  const std::string name = std::string(kDevices) + "/host2/session7/iscsi_session/session7/targetname";
  std::filesystem::remove(name);
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskUnknown);
  EXPECT_EQ(is_session_disk("sdb", "iqn.t1"), SessionDisk::kNo);
  std::filesystem::create_directory(name);  // opens, and cannot be read
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskForeign);
  EXPECT_EQ(is_session_disk("sdb", "iqn.t1"), SessionDisk::kUnseen);
  std::filesystem::remove("/sys/block/sdb/device");
  std::filesystem::create_symlink("device", "/sys/block/sdb/device");
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskForeign);
  EXPECT_EQ(is_session_disk("sdb", nullptr), SessionDisk::kUnseen);
}

TEST_F(DiskIdentity, NoDiskHasSuchANode) {
  for (const std::string& node :
       {std::string("/dev/"), std::string("sdz"), "/dev/" + std::string(300, 'x')}) {
    EXPECT_EQ(disk_owner(&entry, node.c_str()), kDiskUnknown) << node;
  }
}

TEST_F(DiskIdentity, OneThatWasOursAndIsGoneIsForeign) {
  name_session(7, "iqn.t1\n");
  lead_to("host2/session7/target2:0:0/2:0:0:3");
  EXPECT_FALSE(is_foreign_disk(&entry, "/dev/sdb"));
  std::filesystem::remove_all("/sys/block/sdb");
  EXPECT_TRUE(is_foreign_disk(&entry, "/dev/sdb1"));
  EXPECT_FALSE(is_foreign_disk(&entry, "/dev/sdc1")) << "another one was never seen";
  entry.lun = 4;
  EXPECT_FALSE(is_foreign_disk(&entry, "/dev/sdb1")) << "nor as that of another LUN";
  entry.lun = 3;
  copy_text(entry.target_name, "iqn.t2");
  EXPECT_FALSE(is_foreign_disk(&entry, "/dev/sdb1")) << "nor as that of another target";
}

TEST_F(DiskIdentity, ADiskIsThereWhosesoeverItIs) {
  debug_level = 2;
  EXPECT_EQ(fakes::output_of([] { EXPECT_FALSE(has_disk("/dev/sdb1")); }), "");
  lead_to("virtio2");
  EXPECT_TRUE(has_disk("/dev/sdb1"));
}

TEST_F(DiskIdentity, WhereSysfsTellsNothingItIsUnknown) {
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskUnknown) << "no such disk";
  EXPECT_EQ(disk_owner(&entry, ""), kDiskUnknown);
  EXPECT_EQ(disk_owner(&entry, "/dev/"), kDiskUnknown);
  std::filesystem::create_directories("/sys/block/loop0");
  EXPECT_EQ(disk_owner(&entry, "/dev/loop0p1"), kDiskUnknown) << "no link";
  lead_to("host2/session7/target2:0:0/2:0:0:3");
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskUnknown) << "a session without a name";
  name_session(7, "\n");
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskUnknown) << "an empty name";
  name_session(7, "iqn.t1\n");
  lead_to("host2/session7/target2:0:0/odd");
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskUnknown) << "no LUN";
  lead_to("host2/session7/target2:0:0/2:0:0:4");
  entry.target_name[0] = '\0';
  EXPECT_EQ(disk_owner(&entry, "sdb"), kDiskUnknown) << "no target to compare with";
}

TEST_F(DiskIdentity, AForeignDiskIsTold) {
  lead_to("virtio2");
  const std::string log = fakes::output_of([this] { EXPECT_TRUE(is_foreign_disk(&entry, "/dev/sdb1")); });
  EXPECT_TRUE(has(log, "/dev/sdb1 is not the disk of LUN 3 of iqn.t1, it is left alone"));
  const std::string silent = fakes::output_of([this] { EXPECT_FALSE(is_foreign_disk(&entry, "/dev/sdc1")); });
  EXPECT_EQ(silent, "");
}
