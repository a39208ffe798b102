// Device numbers from sysfs, and device nodes.
#include "volume/device.h"

#include <dirent.h>
#include <dlfcn.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "volume_fixture.h"

using namespace remvol;

namespace {

std::string unopenable;  // a folder that cannot be opened

}  // namespace

// In front of the C library's.
extern "C" DIR* opendir(const char* path) {
  if (path == unopenable) return nullptr;
  return reinterpret_cast<DIR* (*)(const char*)>(dlsym(RTLD_NEXT, "opendir"))(path);
}

namespace {

class Device : public VolumeTest {
 protected:
  Device() {
    cover("/dev");
    debug_level = 2;
  }
  ~Device() override { uncover("/dev"); }

  static void write(const std::string& path, const std::string& text) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path) << text;
  }

  static std::string id_of(const char* name, int result = 0) {
    DeviceId id{};
    EXPECT_EQ(_get_dev_id(&id, name), result);
    return std::string(id.name) + " " + std::to_string(id.major) + ":" + std::to_string(id.minor);
  }
};

std::string parent_of(const char* name) {
  char parent[256];
  return get_parent_disk(parent, name) ? parent : "none";
}

}  // namespace

TEST_F(Device, APartitionIsSplitAtTheFirstDigitFromTheThirdCharacter) {
  EXPECT_EQ(parent_of("sda"), "none");
  EXPECT_EQ(parent_of("sda1"), "sda");
  EXPECT_EQ(parent_of("sdaa12"), "sdaa");
  EXPECT_EQ(parent_of("md127"), "md");
  EXPECT_EQ(parent_of("sd1"), "sd");
  EXPECT_EQ(parent_of("1a"), "none");
  EXPECT_EQ(parent_of("12b"), "none");
  EXPECT_EQ(parent_of("12b3"), "12b");
  EXPECT_EQ(parent_of("a"), "none");
  EXPECT_EQ(parent_of(""), "none");
}

TEST_F(Device, NumbersOfADiskAndOfAPartition) {
  write("/sys/block/sdb/dev", "8:16\n");
  write("/sys/block/sdb/sdb1/dev", "259:4294967295\n");
  EXPECT_EQ(id_of("sdb"), "sdb 8:16");
  const std::string log = fakes::output_of([] { EXPECT_EQ(id_of("sdb1"), "sdb1 259:4294967295"); });
  EXPECT_TRUE(has(log, "get parent dev = sdb"));
}

TEST_F(Device, ALongNameIsCut) {
  write("/sys/block/averylongdevicename/dev", "1:2\n");
  EXPECT_EQ(id_of("averylongdevicename"), "averylongdevice 1:2");
}

TEST_F(Device, WhatSysfsDoesNotTellFails) {
  id_of(nullptr, -1);
  id_of("", -1);
  id_of("sdz", -1);
  write("/sys/block/sdb/dev", "816\n");
  id_of("sdb", -1);
  write("/sys/block/sdc/dev", "");
  id_of("sdc", -1);
  std::filesystem::create_directories("/sys/block/sdd/dev");
  id_of("sdd", -1);
}

TEST_F(Device, ANumberBeyondAllBoundsIsSaid) {
  write("/sys/block/sdb/dev", "99999999999999999999:1\n");
  const std::string log = fakes::output_of([] { id_of("sdb", -1); });
  EXPECT_TRUE(has(log, "strtol failed, error = 34 (Numerical result out of range)"));
}

TEST_F(Device, ANodeIsMade) {
  write("/sys/block/sdb/dev", "8:16\n");
  const std::string log = fakes::output_of([] { EXPECT_EQ(_create_device_node("sdb"), 0); });
  EXPECT_EQ(fakes::calls(), Texts{"mknod /dev/sdb 60666 8:16"});
  EXPECT_TRUE(has(log, "creating dev node : sdb"));
}

TEST_F(Device, ANodeOfAPartitionIsMade) {
  write("/sys/block/sdb/sdb1/dev", "8:17\n");
  EXPECT_EQ(_create_device_node("sdb1"), 0);
  EXPECT_EQ(fakes::calls(), Texts{"mknod /dev/sdb1 60666 8:17"});
}

TEST_F(Device, AFileInPlaceOfTheNodeIsRemoved) {
  write("/sys/block/sdb/dev", "8:16\n");
  write("/dev/sdb", "not a node");
  EXPECT_EQ(_create_device_node("sdb"), 0);
  EXPECT_FALSE(std::filesystem::exists("/dev/sdb"));
  EXPECT_EQ(fakes::calls(), Texts{"mknod /dev/sdb 60666 8:16"});
}

TEST_F(Device, AFailingMknodIsSaidAndNoError) {
  write("/sys/block/sdb/dev", "8:16\n");
  fakes::on("mknod").returns(-1).error(ENOSPC);
  const std::string log = fakes::output_of([] { EXPECT_EQ(_create_device_node("sdb"), 0); });
  EXPECT_TRUE(has(log, "mknod failed with errno = 28 (No space left on device)"));
}

TEST_F(Device, BadNamesFail) {
  const std::string log = fakes::output_of([] {
    EXPECT_EQ(_create_device_node(nullptr), -1);
    EXPECT_EQ(_create_device_node(""), -1);
    EXPECT_EQ(_create_device_node("sdb"), -1);
    EXPECT_EQ(_create_device_node("sdb1"), -1);
    write("/sys/block/sdc/size", "1\n");
    EXPECT_EQ(_create_device_node("sdc"), -1);
  });
  EXPECT_TRUE(has(log, "dev_ostel_n is null"));
  EXPECT_TRUE(has(log, "dev_ostel_n is empty"));
  EXPECT_TRUE(has(log, "path /sys/block/sdb is not existing"));
  EXPECT_TRUE(has(log, "path /sys/block/sdb/sdb1 is not existing"));
  EXPECT_TRUE(has(log, "fail to get device id for sdc"));
  EXPECT_TRUE(fakes::calls().empty());
}

// The question whether an entry is a folder is asked by its bare name, in the working folder.
TEST_F(Device, PartitionsAreLeftToTheKernelUnlessTheWorkingFolderHasTheirNames) {
  write("/sys/block/sdb/dev", "8:16\n");
  write("/sys/block/sdb/sdb1/dev", "8:17\n");
  write("/sys/block/sdb/queue/x", "");
  const std::filesystem::path before = std::filesystem::current_path();
  EXPECT_EQ(_create_device_node("sdb"), 0);
  EXPECT_EQ(fakes::calls(), Texts{"mknod /dev/sdb 60666 8:16"});

  std::filesystem::create_directories("/dev/here/sdb1");
  std::filesystem::current_path("/dev/here");
  const std::string log = fakes::output_of([] { EXPECT_EQ(_create_device_node("sdb"), 0); });
  std::filesystem::current_path(before);
  EXPECT_TRUE(has(log, "create sub node : sdb1"));
  EXPECT_EQ(fakes::calls().back(), "mknod /dev/sdb1 60666 8:17");
}

TEST_F(Device, AnAnswerThatFailsLeavesTheOneBeforeInForce) {
  write("/sys/block/sdb/dev", "8:16\n");
  write("/sys/block/sdb/sdb1/size", "1\n");
  write("/sys/block/sdb/sdb2/size", "1\n");
  std::filesystem::create_directories("/dev/here/sdb1");
  std::filesystem::create_directories("/dev/here/sdb2");
  const std::filesystem::path before = std::filesystem::current_path();
  std::filesystem::current_path("/dev/here");
  std::string log = fakes::output_of([] { EXPECT_EQ(_create_device_node("sdb"), 0); });
  std::filesystem::current_path(before);
  EXPECT_TRUE(has(log, "fail to make device node : sdb1"));
  EXPECT_TRUE(has(log, "fail to make device node : sdb2"));
}

TEST_F(Device, ADiskWhoseFolderCannotBeOpenedStillHasItsNode) {
  write("/sys/block/sdb/dev", "8:16\n");
  unopenable = "/sys/block/sdb";
  const std::string log = fakes::output_of([] { EXPECT_EQ(_create_device_node("sdb"), 0); });
  unopenable.clear();
  EXPECT_TRUE(has(log, "can not open directory : /sys/block/sdb"));
  EXPECT_EQ(fakes::calls(), Texts{"mknod /dev/sdb 60666 8:16"});
}
