// The one partition of a disk: made, grown, left alone.
#include "volume/partition.h"

#include <filesystem>
#include <fstream>

#include "volume/disk_use.h"
#include "volume/mount_result.h"
#include "volume_fixture.h"

using namespace remvol;

namespace {

class Partition : public VolumeTest {
 protected:
  Partition() {
    debug_level = 2;
    fakes::otherwise("sys_get_disk_space", "/dev/sdb").returns(1'000'000'000);
    fakes::otherwise("sys_get_partition_size", "sdb1").returns(998'000'000);
    fakes::otherwise("access", "/dev/sdb").returns(0);
    // sysfs of this machine does not know sdb: its node step is seen by the message.
    fakes::otherwise("access", "/sys/block/sdb").returns(-1);
  }

  void partitions(const char* names, int count) {
    fakes::on("sys_get_partition_list", "/dev/sdb").text(names).returns(count).times(1);
  }

  int prepare() {
    force = 0;
    list[0] = 'x';
    int result = 0;
    log = fakes::output_of([&] { result = prepare_partitions(&entry, list, &force); });
    return result;
  }

  bool node_step_ran() const { return static_cast<bool>(has(log, "creating dev node : sdb")); }

  std::string log;
  int force = 0;
  PartitionList list{};
};

}  // namespace

TEST_F(Partition, ExpansionStartsBeyondTheMargin) {
  fakes::on("sys_get_partition_list", "/dev/sdx").text("sdx1").returns(1);
  fakes::on("sys_get_disk_space", "/dev/sdx").returns(1'100'000'000);
  fakes::on("sys_get_partition_size", "sdx1").returns(1'000'000'000).times(1);
  fakes::on("sys_get_partition_size", "sdx1").returns(999'999'999);
  EXPECT_EQ(check_1part_disk_need_to_expand("/dev/sdx"), 0);
  const std::string said =
      fakes::output_of([] { EXPECT_EQ(check_1part_disk_need_to_expand("/dev/sdx"), 1); });
  EXPECT_TRUE(has(said, "disk_size = 1100000000, part_size = 999999999"));
}

TEST_F(Partition, ExpansionComparesIn64Bits) {
  partitions("sdb1", 1);
  fakes::on("sys_get_disk_space", "/dev/sdb").returns(16LL << 40);
  fakes::on("sys_get_partition_size", "sdb1").returns((16LL << 40) - 100'000'000);
  EXPECT_EQ(check_1part_disk_need_to_expand("/dev/sdb"), 0);
  fakes::on("sys_get_disk_space", "/dev/sdc").returns(20LL << 40);  // in 32 bits both sizes are 0
  fakes::on("sys_get_partition_list", "/dev/sdc").text("sdc1").returns(1);
  fakes::on("sys_get_partition_size", "sdc1").returns(16LL << 40);
  EXPECT_EQ(check_1part_disk_need_to_expand("/dev/sdc"), 1);
}

TEST_F(Partition, ExpansionNeedsExactlyOnePartition) {
  for (const int count : {-1, 0, 2, 3}) {
    partitions("sdb1,sdb2", count);
    const std::string said =
        fakes::output_of([] { EXPECT_EQ(check_1part_disk_need_to_expand("/dev/sdb"), 0); });
    EXPECT_TRUE(has(said, "more than 1 partition or no part, skip!")) << count;
  }
  const std::string said = fakes::output_of([] {
    EXPECT_EQ(check_1part_disk_need_to_expand(nullptr), -1);
    EXPECT_EQ(check_1part_disk_need_to_expand(""), -1);
  });
  EXPECT_TRUE(has(said, "dev string error!"));
}

TEST_F(Partition, ADiskOfAMebibyteIsOffline) {
  for (const long long size : {1048576LL, 0LL, -1LL}) {
    fakes::on("sys_get_disk_space", "/dev/sdb").returns(size).times(1);
    EXPECT_EQ(prepare(), kMountTooSmall);
    EXPECT_TRUE(has(log, "get disk_size = " + std::to_string(size)));
    EXPECT_TRUE(has(log, "The disk size < 1MB, it might be a fake one. treat this disk as offline"));
  }
  EXPECT_TRUE(fakes::writes().empty());
  fakes::on("sys_get_disk_space", "/dev/sdb").returns(1048577);
  partitions("sdb1,sdb2", 2);
  EXPECT_EQ(prepare(), 0);
}

TEST_F(Partition, AnEmptyDiskGetsAPartitionThatMustBeFormatted) {
  partitions("", 0);
  partitions("sdb1", 1);
  fakes::on("sys_create_1_partition", "/dev/sdb").does([] { EXPECT_EQ(stored("volume_state"), "1"); });
  EXPECT_EQ(prepare(), 0);
  EXPECT_STREQ(list, "sdb1");
  EXPECT_EQ(force, 1);
  EXPECT_EQ(written("volume_state"), (Texts{"1", "0"}));
  EXPECT_TRUE(node_step_ran());
  EXPECT_TRUE(has(log, "No partitions found on /dev/sdb, try to create partition..."));
  EXPECT_TRUE(has(log, "Creating partition on /dev/sdb"));
}

TEST_F(Partition, ARefusedPartitionFailsTheVolume) {
  partitions("", 0);
  fakes::on("sys_create_1_partition", "/dev/sdb").returns(-1);
  EXPECT_EQ(prepare(), kMountNoPartition);
  EXPECT_EQ(written("volume_state"), (Texts{"1", "3"}));
  EXPECT_TRUE(has(log, "Create partition FAILED"));
  EXPECT_FALSE(node_step_ran());
}

TEST_F(Partition, APartitionThatDoesNotShowFailsTheVolume) {
  partitions("", 0);
  partitions("", 0);
  fakes::on("sys_create_1_partition", "/dev/sdb").returns(0);
  EXPECT_EQ(prepare(), kMountNoPartition);
  EXPECT_EQ(written("volume_state"), (Texts{"1", "0", "3"}));
  EXPECT_TRUE(has(log, "Create partition FAILED"));
}

TEST_F(Partition, ADiskThatCannotBeReadGetsNoPartition) {
  partitions("", -1);
  EXPECT_EQ(prepare(), kMountNoPartition);
  EXPECT_EQ(written("volume_state"), Texts{"3"});
  EXPECT_TRUE(fakes::calls({"sys_create_1_partition"}).empty());
}

TEST_F(Partition, OnePartitionThatFillsTheDiskIsLeftAlone) {
  partitions("sdb1", 1);
  partitions("sdb1", 1);
  EXPECT_EQ(prepare(), 0);
  EXPECT_STREQ(list, "sdb1");
  EXPECT_EQ(force, 0);
  EXPECT_TRUE(fakes::writes().empty());
  EXPECT_TRUE(has(log, "one partition found on /dev/sdb"));
  EXPECT_FALSE(node_step_ran());
}

TEST_F(Partition, AGrownDiskGetsItsPartitionGrown) {
  for (int i = 0; i < 3; i++) partitions("sdb1", 1);
  fakes::on("sys_get_disk_space", "/dev/sdb").returns(1'200'000'000);
  fakes::on("sys_expand_1_partition", "/dev/sdb").does([] { EXPECT_EQ(stored("volume_state"), "1"); });
  EXPECT_EQ(prepare(), 0);
  EXPECT_EQ(force, 0);
  EXPECT_EQ(written("volume_state"), (Texts{"1", "0"}));
  EXPECT_TRUE(node_step_ran());
  EXPECT_TRUE(has(log, "/dev/sdb, try to expand partition..."));
  EXPECT_TRUE(has(log, "Expanding partition on /dev/sdb"));
}

TEST_F(Partition, AFailedGrowthLeavesThePartitionAndTheState) {
  for (int i = 0; i < 3; i++) partitions("sdb1", 1);
  fakes::on("sys_get_disk_space", "/dev/sdb").returns(1'200'000'000);
  fakes::on("sys_expand_1_partition", "/dev/sdb").returns(-1);
  EXPECT_EQ(prepare(), 0);
  EXPECT_EQ(written("volume_state"), Texts{"1"});
  EXPECT_TRUE(has(log, "Expand partition FAILED"));
  EXPECT_FALSE(node_step_ran());
}

TEST_F(Partition, SeveralPartitionsAreLeftAlone) {
  partitions("sdb1,sdb2", 2);
  fakes::on("sys_get_disk_space", "/dev/sdb").returns(9'000'000'000);
  EXPECT_EQ(prepare(), 0);
  EXPECT_STREQ(list, "sdb1,sdb2");
  EXPECT_TRUE(fakes::writes().empty());
}

TEST_F(Partition, TheLookForPartitionsSaysNothing) {
  std::filesystem::create_directories("/sys/block/sdb/sdb1");
  EXPECT_EQ(fakes::output_of([] { EXPECT_FALSE(has_partition("sdb")); }), "");
  std::ofstream("/sys/block/sdb/sdb1/partition") << "1\n";
  EXPECT_TRUE(has_partition("sdb"));
}

TEST_F(Partition, AMissingNodeOfTheDiskIsMade) {
  partitions("sdb1,sdb2", 2);
  fakes::on("access", "/dev/sdb").returns(-1);
  EXPECT_EQ(prepare(), -1);
  EXPECT_TRUE(has(log, "create device node failed"));
  EXPECT_TRUE(node_step_ran());
}
