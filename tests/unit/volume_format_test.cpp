// Formatting a partition: what is run, what is published, and what each failure leaves.
#include "volume/format.h"

#include "volume_fixture.h"

using namespace remvol;

namespace {

constexpr char kNode[] = "/dev/sdb1";

class Format : public VolumeTest {
 protected:
  Format() {
    fakes::otherwise("sys_get_fs_type", kNode).returns(-1);
    fakes::otherwise("popen").text("");
    store_entry();
  }

  // What runs the format of a partition that carries this file system; "" for none.
  Texts commands_for(const char* fs_type) {
    if (fs_type[0] != '\0') fakes::on("sys_get_fs_type", kNode).text(fs_type);
    EXPECT_EQ(Target_format(&entry, kNode), 0);
    return fakes::commands();
  }
};

Texts with_mke2fs(const std::string& command) {
  return {"fuser -mk \"/dev/sdb1\"", "dd if=/dev/zero of=/dev/sdb1 bs=1M count=1", command};
}

constexpr char kExt4Command[] = "MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 -T ext4 /dev/sdb1";

}  // namespace

TEST_F(Format, AnEmptyPartitionBecomesExt4) {
  EXPECT_EQ(commands_for(""), with_mke2fs(kExt4Command));
  EXPECT_EQ(written("format_state"), (Texts{"4", "1", "0"}));
  EXPECT_EQ(written("format_progress"), (Texts{"0", "100"}));
}

TEST_F(Format, Ext2StaysExt2) {
  EXPECT_EQ(commands_for("ext2"), with_mke2fs("MKE2FS_SYNC=100 mke2fs -m0 -b4096 /dev/sdb1"));
}

TEST_F(Format, Ext3StaysExt3) {
  EXPECT_EQ(commands_for("ext3"), with_mke2fs("MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 /dev/sdb1"));
}

TEST_F(Format, Ext4StaysExt4) {
  EXPECT_EQ(commands_for("ext4"), with_mke2fs(kExt4Command));
}

TEST_F(Format, AProbeThatFailsNamesNoFileSystem) {
  fakes::on("sys_get_fs_type", kNode).text("ext2").returns(-1);
  EXPECT_EQ(Target_format(&entry, kNode), 0);
  EXPECT_EQ(fakes::commands(), with_mke2fs(kExt4Command));
}

TEST_F(Format, AnythingElseBecomesExt4AndIsSaid) {
  debug_level = 1;
  fakes::on("sys_get_fs_type", kNode).text("vfat");
  const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), 0); });
  EXPECT_EQ(fakes::commands(), with_mke2fs(kExt4Command));
  EXPECT_TRUE(has(log, "vfat is not supported by this program, set file system type to ext4"));
}

TEST_F(Format, TheStepsComeInOrder) {
  fakes::on("popen").text("Writing inode tables: \b1/4\b\b\b2/4\b\b\b3/4\b\n");
  EXPECT_EQ(Target_format(&entry, kNode), 0);
  EXPECT_EQ(fakes::calls(),
            (Texts{"semget 90111 1 666", "semget 90111 1 1666", "semctl IPC_SET 600", "semctl GETNCNT",
                   "semctl SETVAL 1", "semop -1 SEM_UNDO", "system fuser -mk \"/dev/sdb1\"",
                   "system dd if=/dev/zero of=/dev/sdb1 bs=1M count=1", "sleep 1",
                   std::string("popen ") + kExt4Command, "semctl GETNCNT", "semctl IPC_RMID"}));
  EXPECT_EQ(written("format_progress"), (Texts{"0", "65", "100"}));
  EXPECT_EQ(written("status"), Texts{"Disable"})
      << "the tree of this test says nothing of the LUN being enabled";
}

TEST_F(Format, TheStatusShowsTheFormat) {
  fakes::tree_set({{lun("enable"), "1"}, {lun("format_progress"), "100"}});
  fakes::on("system", "fuser -mk \"/dev/sdb1\"").does([] {
    EXPECT_EQ(stored("format_state"), "1");
    EXPECT_EQ(stored("format_progress"), "0");
    EXPECT_EQ(stored("status"), "Formatting 0%");
  });
  EXPECT_EQ(Target_format(&entry, kNode), 0);
  EXPECT_EQ(written("status"), Texts{"Formatting 0%"});
}

TEST_F(Format, EveryReadWithACounterIsPublished) {
  debug_level = 2;
  fakes::on("popen").text(
      "Allocating group tables: \b1/4\b\b\b2/4\b\b\b3/4\b\ndone\nAllocating \b2/4\b\b\b3/4\b\b\b4/4\b\n"
      "Writing inode tables: \b1/4\b\b\b2/4\b\b\b3/4\b\n");
  const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), 0); });
  EXPECT_EQ(written("format_progress"), (Texts{"0", "20", "25", "65", "100"}));
  EXPECT_TRUE(has(log, "/dev/sdb1 : Percent=20"));
  EXPECT_TRUE(has(log, "/dev/sdb1 : Percent=65"));
  EXPECT_TRUE(has(log, "set strFS to default fs: ext4"));
  EXPECT_TRUE(has(log, "format partition /dev/sdb1"));
  EXPECT_TRUE(has(log, std::string("popen(") + kExt4Command + ")"));
}

TEST_F(Format, BadArgumentsTouchNothing) {
  const auto refused = [](TargetEntry bad, const char* node, const char* message) {
    const std::string log = fakes::output_of([&] { EXPECT_EQ(Target_format(&bad, node), -1); });
    EXPECT_TRUE(has(log, message));
  };
  TargetEntry bad = entry;
  bad.dev[0] = '\0';
  refused(bad, kNode, "dev node name is empty");
  bad = entry;
  bad.db_idx = 0;
  refused(bad, kNode, "target or lun db index is not given");
  bad = entry;
  bad.lun_db_idx = 0;
  refused(bad, kNode, "target or lun db index is not given");
  refused(entry, nullptr, "no formatting dev to do");
  EXPECT_TRUE(fakes::writes().empty());
  EXPECT_TRUE(fakes::calls().empty());
}

TEST_F(Format, WithoutTheSemaphoreNothingIsFormatted) {
  fakes::on("semop").returns(-1);
  const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), -1); });
  EXPECT_TRUE(has(log, "wait fmt_sem failed, exit"));
  EXPECT_EQ(written("format_state"), (Texts{"4", "3"}));
  EXPECT_TRUE(fakes::commands().empty());
  EXPECT_TRUE(written("format_progress").empty());
}

TEST_F(Format, AFailingKillIsIgnored) {
  fakes::on("system", "fuser -mk \"/dev/sdb1\"").returns(256);
  EXPECT_EQ(Target_format(&entry, kNode), 0);
  EXPECT_EQ(stored("format_state"), "0");
}

TEST_F(Format, APartitionThatCannotBeWrittenKeepsTheSemaphore) {
  debug_level = 1;
  fakes::on("system", fakes::Expression{"^dd "}).returns(256);
  const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), -2); });
  EXPECT_TRUE(has(log, "dd /dev/sdb1 failed, this device is not able to write."));
  EXPECT_EQ(written("format_state"), (Texts{"4", "1"}));
  EXPECT_EQ(written("format_progress"), Texts{"0"});
  EXPECT_EQ(fakes::calls({"semctl", "semop"}),
            (Texts{"semctl IPC_SET 600", "semctl GETNCNT", "semctl SETVAL 1", "semop -1 SEM_UNDO"}));
  EXPECT_EQ(fakes::calls({"popen", "sleep"}), Texts{});
}

TEST_F(Format, MkfsIsStartedUpToThreeTimes) {
  fakes::on("popen").returns(-1).times(2);
  const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), 0); });
  EXPECT_TRUE(has(log, std::string("popen(") + kExt4Command + " , ...) failed"));
  EXPECT_EQ(fakes::calls({"popen"}).size(), 3u);
  EXPECT_EQ(written("format_state"), (Texts{"4", "1", "0"}));
  EXPECT_EQ(written("format_progress"), (Texts{"0", "100"}));
}

TEST_F(Format, MkfsThatCannotBeStartedFailsTheFormatButNotTheResult) {
  debug_level = 1;
  fakes::on("sys_get_fs_type", kNode).text("vfat");
  fakes::on("popen").returns(-1);
  const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), 0); });
  EXPECT_TRUE(has(log, std::string("system() of cmd '") + kExt4Command + "' failed"));
  const std::string switched = "vfat is not supported by this program";
  EXPECT_EQ(log.find(switched), log.rfind(switched)) << "the switch to ext4 is made once";
  EXPECT_EQ(fakes::calls({"popen"}).size(), 3u);
  EXPECT_EQ(written("format_state"), (Texts{"4", "1", "3"}));
  EXPECT_EQ(written("format_progress"), Texts{"0"}) << "100 is written only after a mke2fs that was started";
  EXPECT_EQ(fakes::calls({"semctl"}).back(), "semctl IPC_RMID");
}

TEST_F(Format, AMkfsThatFailsStillEndsWithFullProgress) {
  fakes::on("popen").returns(256).text("mke2fs: no\n");
  EXPECT_EQ(Target_format(&entry, kNode), 0);
  EXPECT_EQ(stored("format_state"), "0");
  EXPECT_EQ(stored("format_progress"), "100");
}

// A writer gives up after its third try.
TEST_F(Format, ALostStateIsSaidAndTheFormatGoesOn) {
  for (int writes_before : {0, 1, 2}) {
    fakes::on("ktreec_set", lun("format_state")).skip(writes_before).times(3).returns(-1);
    const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), 0); });
    EXPECT_TRUE(has(log, "Update ktree FAILED")) << writes_before;
    EXPECT_EQ(fakes::calls({"popen"}).size(), static_cast<size_t>(writes_before) + 1);
    EXPECT_EQ(stored("format_progress"), "100");
  }
}

TEST_F(Format, TheResultIsThatOfLeavingTheSemaphore) {
  fakes::on("semctl", "IPC_RMID").returns(-1);
  fakes::on("semop", "1 SEM_UNDO").returns(-1);
  const std::string log = fakes::output_of([this] { EXPECT_EQ(Target_format(&entry, kNode), -2); });
  EXPECT_TRUE(has(log, "release fmt_sem failed, exit"));
  EXPECT_EQ(stored("format_state"), "0");
}

// Processes of the machine are none of these tests' business.
class FormatProcesses : public Format {
 protected:
  FormatProcesses() { cover("/proc"); }
  ~FormatProcesses() override { uncover("/proc"); }
};

TEST_F(FormatProcesses, ARunningMkfsOnAScsiDiskIsSeen) {
  const char command[] = "ps -w | grep mke2fs | grep -v 'grep'";
  fakes::on("popen", command).text("1 root mke2fs -m0 /dev/vdb\n2 root mke2fs -m0 /dev/sdb1\n").times(1);
  EXPECT_EQ(check_mkfs_process_existing(), 0);
  fakes::on("popen", command).text("1 root mke2fs -m0 /dev/vdb\n").times(1);
  EXPECT_EQ(check_mkfs_process_existing(), 1);
  fakes::on("popen", command).text("").times(1);
  EXPECT_EQ(check_mkfs_process_existing(), 1);
  fakes::on("popen", command).returns(-1);
  EXPECT_EQ(check_mkfs_process_existing(), 1);
}

TEST_F(FormatProcesses, ARunningResizeOfTheDeviceIsSeen) {
  debug_level = 2;
  const char command[] = "ps -w | grep resize2fs | grep -v 'grep'";
  fakes::on("popen", command).text("7 root resize2fs -fp /dev/sdb1\n").times(2);
  const std::string log = fakes::output_of([] { EXPECT_EQ(check_resizing_fs("/dev/sdb1"), 0); });
  EXPECT_TRUE(has(log, "checking if device /dev/sdb1 is resizing..."));
  EXPECT_TRUE(has(log, "get ps mke2fs buf = 7 root resize2fs -fp /dev/sdb1\n"));
  EXPECT_EQ(check_resizing_fs("/dev/sdc1"), 1);
  fakes::on("popen", command).returns(-1);
  EXPECT_EQ(check_resizing_fs("/dev/sdb1"), 1);
}
