// Mounting a LUN: the steps, and what each failure leaves.
#include "volume/mount.h"
#include "volume/remount.h"

#include <filesystem>
#include <fstream>

#include "volume_fixture.h"

using namespace remvol;

namespace {

int allocations = -1;  // how many allocations that may fail are left before they do; -1: none fails

}  // namespace

// In front of the library's, by the linker.
extern "C" void* __real_calloc(size_t count, size_t size);
extern "C" void* __wrap_calloc(size_t count, size_t size) {
  if (allocations == 0) return nullptr;
  if (allocations > 0) allocations--;
  return __real_calloc(count, size);
}

namespace {

constexpr char kNode[] = "/dev/sdb1";
constexpr char kMkdir[] = "mkdir -p \"/mnt/VV/Data\"";
constexpr char kMount[] = "mount -t ext4 /dev/sdb1 \"/mnt/VV/Data\"";
constexpr char kResize[] = "resize2fs -fp /dev/sdb1 &";
constexpr char kChmod[] = "chmod 777 \"/mnt/VV/Data\"";
constexpr char kRemove[] = "rm -rf \"/mnt/VV/Data\"";
constexpr char kReload[] = "winshare_reload ; macshare_reload";
constexpr char kFuser[] = "fuser -mk \"/dev/sdb1\"";
constexpr char kWipe[] = "dd if=/dev/zero of=/dev/sdb1 bs=1M count=1";
constexpr char kMkfs[] = "MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 -T ext4 /dev/sdb1";

// A disk that is ready: one partition that fills it, with ext4, and mounts that take hold.
class Mount : public VolumeTest {
 protected:
  Mount() {
    store_entry();
    cover("/mnt");
    std::filesystem::create_directory("/mnt/VV");
    fakes::otherwise("access", "/dev/sdb").returns(0);
    fakes::otherwise("sys_get_disk_space", "/dev/sdb").returns(1'000'000'000);
    fakes::otherwise("sys_get_partition_list", "/dev/sdb").text("sdb1").returns(1);
    fakes::otherwise("sys_get_partition_size", "sdb1").returns(998'000'000);
    fakes::otherwise("sys_check_dev", kNode).returns(0);
    fakes::otherwise("sys_get_fs_type", kNode).text("ext4").returns(0);
    fakes::otherwise("sys_check_fs_state", kNode).returns(0);
    fakes::otherwise("sys_mount_point", "/mnt/VV/Data").returns(1);
    fakes::otherwise("popen").text("");
  }
  ~Mount() override { uncover("/mnt"); }

  int mount_it(int force_format = 0, int update_share = 1) {
    int result = 0;
    log = fakes::output_of([&] { result = Target_mount(&entry, force_format, update_share); });
    return result;
  }

  // An empty disk: the partition carries nothing until mke2fs has run.
  void empty_disk() {
    fakes::on("sys_get_partition_list", "/dev/sdb").text("").returns(0).times(1);
    fakes::on("sys_create_1_partition", "/dev/sdb").returns(0);
    empty_partition();
  }
  // What step 3, step 6 and the format ask before there is a file system.
  void empty_partition(int questions = 3) {
    fakes::on("sys_get_fs_type", kNode).returns(-1).times(questions);
  }

  void not_mounted() { fakes::on("sys_mount_point", "/mnt/VV/Data").returns(0); }

  std::string log;
};

}  // namespace

TEST_F(Mount, AReadyVolumeIsMountedAndRecorded) {
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::calls(), (Texts{std::string("system ") + kMkdir, std::string("system ") + kMount,
                                   std::string("system ") + kResize, std::string("system ") + kChmod,
                                   std::string("system ") + kReload}));
  EXPECT_EQ(stored("mnt_dev"), "/dev/sdb1");
  EXPECT_EQ(stored("mnt"), "/mnt/VV/Data");
  EXPECT_EQ(stored("fs_type"), "ext4");
  EXPECT_EQ(stored("format_state"), "0");
  EXPECT_EQ(stored("volume_state"), "0");
  EXPECT_EQ(stored("vol_access_right"), "1");
  EXPECT_STREQ(entry.mnt_dev, "/dev/sdb1");
  EXPECT_STREQ(entry.mnt, "/mnt/VV/Data");
}

TEST_F(Mount, WhatIsRecordedWhen) {
  fakes::tree_set({{lun("volume_state"), "2"}});
  fakes::on("system", kResize).does([] {
    EXPECT_EQ(stored("mnt_dev"), "/dev/sdb1");
    EXPECT_EQ(stored("mnt"), "/mnt/VV/Data");
    EXPECT_EQ(stored("fs_type"), "ext4");
    EXPECT_EQ(stored("volume_state"), "2");
  });
  fakes::on("system", kChmod).does([] {
    EXPECT_EQ(stored("volume_state"), "0");
    EXPECT_EQ(stored("vol_access_right"), "");
  });
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::calls({"system"}).size(), 5U);
}

TEST_F(Mount, SharesAreReloadedOnlyWhenAsked) {
  EXPECT_EQ(mount_it(0, 0), 0);
  EXPECT_EQ(fakes::commands().back(), kChmod);
}

TEST_F(Mount, EveryFileSystemHasItsCommand) {
  const std::pair<const char*, const char*> rows[] = {
      {"ext2", "mount -t ext2 "},
      {"ext3", "mount -t ext3 "},
      {"ext4", "mount -t ext4 "},
      {"vfat", "mount -t vfat -o umask=0,iocharset=utf8,shortname=winnt "},
      {"ntfs", "mount -t ufsd -o rw,nls=utf8,fmask=0,dmask=0,force,user_xattr "},
      {"hfsplus", "mount -t ufsd -o rw,nls=utf8,fmask=0,dmask=0,force,user_xattr "},
      {"xfs", "mount -t xfs -o rw,attr2 "}};
  for (const auto& [fs_type, command] : rows) {
    fakes::on("sys_get_fs_type", kNode).text(fs_type).times(3);
    const size_t before = fakes::commands().size();
    EXPECT_EQ(mount_it(0, 0), 0);
    const Texts all = fakes::commands();
    ASSERT_GT(all.size(), before + 1);
    EXPECT_EQ(all[before + 1], std::string(command) + "/dev/sdb1 \"/mnt/VV/Data\"");
    EXPECT_EQ(stored("fs_type"), fs_type);
    const bool resized = std::string(fs_type) == "ext4";
    EXPECT_EQ(all.size(), before + (resized ? 4 : 3)) << fs_type << ": only ext4 is resized";
  }
}

TEST_F(Mount, WhatIsLeftOfAnOverwrittenFileSystemIsNone) {
  fakes::on("sys_get_fs_type", kNode).text("ext4").returns(0).times(3);
  fakes::on("sys_get_fs_type", kNode).text("damaged_ext").returns(0);  // mke2fs failed
  EXPECT_EQ(mount_it(1), -1);
  EXPECT_EQ(fakes::commands().back(), kMkfs);
}

TEST_F(Mount, AnUnsupportedFileSystemIsNeitherMountedNorFormatted) {
  debug_level = 1;
  for (const char* fs_type : {"btrfs", "LVM2_member", "linux_raid_memb", "crypto_LUKS", "ambivalent",
                              "unreadable", "damaged_ext"}) {
    fakes::on("sys_get_fs_type", kNode).text(fs_type).times(3);
    const size_t before = fakes::commands().size();
    EXPECT_EQ(mount_it(), kMountUnsupported);
    EXPECT_TRUE(has(log, std::string("Unsupported filesystem type ") + fs_type));
    EXPECT_EQ(stored("volume_state"), "5");
    EXPECT_EQ(fakes::commands().size(), before + 1);
    EXPECT_EQ(fakes::commands().back(), kMkdir);
  }
  fakes::on("sys_get_fs_type", kNode).text("btrfs");
  fakes::on("ktreec_set", lun("volume_state")).returns(-1);
  EXPECT_EQ(mount_it(), -103);
  EXPECT_TRUE(has(log, "Update ktree FAILED"));
}

TEST_F(Mount, AnEmptyDiskIsPartitionedFormattedAndMounted) {
  empty_disk();
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kFuser, kWipe, kMkfs, kMkdir, kMount, kResize, kChmod, kReload}));
  EXPECT_EQ(written("volume_state"), (Texts{"1", "0", "0"}));
  EXPECT_EQ(written("format_state"), (Texts{"4", "1", "0"}));
  EXPECT_TRUE(has(log, "Got FS type = , creating volume"));
}

TEST_F(Mount, ANewPartitionIsFormattedWhateverItCarries) {
  fakes::on("sys_get_partition_list", "/dev/sdb").text("").returns(0).times(1);
  fakes::on("sys_create_1_partition", "/dev/sdb").returns(0);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::calls({"popen"}), Texts{std::string("popen ") + kMkfs});
}

TEST_F(Mount, AnEmptyPartitionIsFormatted) {
  debug_level = 2;
  empty_partition();
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::calls({"popen"}), Texts{std::string("popen ") + kMkfs});
  EXPECT_TRUE(has(log, "Got dev /dev/sdb1, force_format=1"));
}

TEST_F(Mount, AFileSystemIsFormattedWhenAsked) {
  EXPECT_EQ(mount_it(1), 0);
  EXPECT_EQ(fakes::calls({"popen"}), Texts{std::string("popen ") + kMkfs});
  EXPECT_TRUE(has(log, "Got FS type = ext4, creating volume"));
}

TEST_F(Mount, AFileSystemIsKeptOtherwise) {
  debug_level = 2;
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::calls({"popen"}), Texts{});
  EXPECT_TRUE(has(log, "start"));
  EXPECT_TRUE(has(log, "Got dev /dev/sdb1, force_format=0"));
  EXPECT_TRUE(has(log, "Got FS type = ext4, skip creating volume"));
  EXPECT_TRUE(has(log, std::string("cmd = ") + kMkdir));
  EXPECT_TRUE(has(log, std::string("cmd = ") + kMount));
  EXPECT_TRUE(has(log, "Update_sharefolder_status = 1"));
  EXPECT_TRUE(has(log, "end"));
}

TEST_F(Mount, TheFirstRecognisedPartitionIsTaken) {
  fakes::on("sys_get_partition_list", "/dev/sdb").text("sdb1,sdb2 sdb3").returns(3);
  fakes::on("sys_get_fs_type", kNode).returns(-1);
  fakes::on("sys_check_dev", "/dev/sdb2").returns(0);
  fakes::on("sys_get_fs_type", "/dev/sdb2").text("ext3");
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(stored("mnt_dev"), "/dev/sdb2");
  EXPECT_EQ(fakes::commands()[1], "mount -t ext3 /dev/sdb2 \"/mnt/VV/Data\"");
}

TEST_F(Mount, ANodeThatIsNotUsableIsPassedOver) {
  fakes::on("sys_get_partition_list", "/dev/sdb").text("sdb1,sdb2").returns(2);
  fakes::on("sys_check_dev", kNode).returns(-1);
  fakes::on("sys_check_dev", "/dev/sdb2").returns(0);
  fakes::on("sys_get_fs_type", "/dev/sdb2").text("ext3");
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(stored("mnt_dev"), "/dev/sdb2");
}

TEST_F(Mount, WithoutAUsableNodeNothingIsFormatted) {
  fakes::on("sys_check_dev", kNode).returns(-1);
  EXPECT_EQ(mount_it(), kMountNoPartition);
  EXPECT_EQ(mount_it(1), kMountNoPartition);
  EXPECT_TRUE(fakes::commands().empty());
  EXPECT_TRUE(written("volume_state").empty());
}

// Data that nobody asked to overwrite.
TEST_F(Mount, WhatIsRecognisedOnTheSecondLookIsNotFormatted) {
  empty_partition(1);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kMkdir, kMount, kResize, kChmod, kReload}));
}

TEST_F(Mount, WhatIsRecognisedBehindTheSemaphoreIsNotFormatted) {
  empty_partition(2);  // and what it begins with cannot be read
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kMkdir, kMount, kResize, kChmod, kReload}));
  EXPECT_TRUE(has(log, "/dev/sdb1 carries ext4 by now, it is not formatted"));
}

TEST_F(Mount, WhatWasRecognisedIsNotTakenForEmptyLater) {
  fakes::on("sys_get_fs_type", kNode).text("ext4").returns(0).times(1);
  fakes::on("sys_get_fs_type", kNode).returns(-1);
  EXPECT_EQ(mount_it(), -2);
  EXPECT_TRUE(fakes::commands().empty());
  EXPECT_TRUE(has(log, "/dev/sdb1 carried a file system a moment ago and shows none now, it is left alone"));
}

TEST_F(Mount, AnExt4ThatWantsACheckIsLookedAt) {
  fakes::on("sys_check_fs_state", kNode).returns(1);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::commands().front(), "e2fsck -n -f /dev/sdb1");
  EXPECT_EQ(fakes::commands().size(), 6u);
}

TEST_F(Mount, AnotherFileSystemIsNotChecked) {
  fakes::on("sys_get_fs_type", kNode).text("ext3");
  fakes::on("sys_check_fs_state", kNode).returns(1);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::commands().front(), kMkdir);
}

TEST_F(Mount, BadEntriesTouchNothing) {
  const auto refused = [](TargetEntry* bad, const char* message) {
    const std::string said = fakes::output_of([&] { EXPECT_EQ(Target_mount(bad, 0, 1), -1); });
    EXPECT_TRUE(has(said, message));
  };
  TargetEntry bad = entry;
  refused(nullptr, "Error entry");
  bad.dev[0] = '\0';
  refused(&bad, "Error entry");
  bad = entry;
  bad.db_idx = 0;
  refused(&bad, "Error entry - db_idx or lun_db_idx is not given");
  bad = entry;
  bad.lun_db_idx = -1;
  refused(&bad, "Error entry - db_idx or lun_db_idx is not given");
  bad = entry;
  bad.share[0] = '\0';
  refused(&bad, "Error entry - share name is empty");
  EXPECT_TRUE(fakes::calls().empty());
  EXPECT_TRUE(fakes::writes().empty());
}

TEST_F(Mount, AShareThatLeavesTheRootTouchesNothing) {
  for (const char* share : {"..", "../../etc", "a/../..", "/", "."}) {
    copy_text(entry.share, share);
    EXPECT_EQ(mount_it(1), kMountNoMountPoint);
    EXPECT_TRUE(has(log, std::string("share name ") + share + " leaves /mnt/VV/"));
  }
  EXPECT_TRUE(fakes::calls().empty());
  EXPECT_TRUE(fakes::writes().empty());
}

TEST_F(Mount, EveryCommandEscapesTheShare) {
  const std::string escaped = "\"/mnt/VV/a \\\"b\\\" \\$(c) \\`d\\` \\\\ \xc3\xa9\"";
  copy_text(entry.share, "a \"b\" $(c) `d` \\ \xc3\xa9");
  fakes::on("sys_mount_point").returns(1).times(1);
  EXPECT_EQ(mount_it(), 0);
  fakes::on("sys_mount_point").returns(0);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{"mkdir -p " + escaped, "mount -t ext4 /dev/sdb1 " + escaped, kResize,
                                      "chmod 777 " + escaped, kReload, "mkdir -p " + escaped,
                                      "mount -t ext4 /dev/sdb1 " + escaped, "rm -rf " + escaped, kReload}));
  EXPECT_EQ(stored("mnt"), "/mnt/VV/a \"b\" $(c) `d` \\ \xc3\xa9");
}

TEST_F(Mount, TheLongestShareIsNotCut) {
  const std::string share(127, '`');
  std::string escaped = "/mnt/VV/";
  for (size_t i = 0; i < share.size(); i++) escaped += "\\`";
  copy_text(entry.share, share.c_str());
  fakes::on("sys_get_fs_type", kNode).text("ntfs");
  fakes::on("sys_mount_point").returns(1);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::commands()[1],
            "mount -t ufsd -o rw,nls=utf8,fmask=0,dmask=0,force,user_xattr /dev/sdb1 \"" + escaped + "\"");
  EXPECT_EQ(fakes::commands()[2], "chmod 777 \"" + escaped + "\"");
}

TEST_F(Mount, AMountIsTriedFourTimes) {
  fakes::on("system", kMount).returns(32 << 8);
  not_mounted();
  EXPECT_EQ(mount_it(), 0) << "only the volume state tells";
  const std::string run = std::string("system ") + kMount;
  EXPECT_EQ(fakes::calls(), (Texts{std::string("system ") + kMkdir, run, "usleep 500000", run,
                                   "usleep 500000", run, "usleep 500000", run,
                                   std::string("system ") + kRemove, std::string("system ") + kReload}));
  EXPECT_EQ(stored("volume_state"), "3");
  EXPECT_EQ(stored("mnt"), "");
  EXPECT_TRUE(has(log, std::string("system() of cmd '") + kMount + "' failed"));
  EXPECT_TRUE(has(log, "wait 500000 micro seconds"));
}

// Kernels without the driver that is built for this job.
namespace {

class StockKernel : public Mount {
 protected:
  // Mounts a volume of that file system with these drivers in the kernel; the drivers' list may be missing.
  Texts mount_with(const char* fs_type, const char* drivers) {
    fakes::on("sys_get_fs_type", kNode).text(fs_type);
    fakes::on("system", fakes::Expression{"^mount -t ufsd"}).returns(32 << 8);
    cover("/proc");
    if (drivers != nullptr) std::ofstream("/proc/filesystems") << drivers;
    EXPECT_EQ(mount_it(0, 0), 0);
    uncover("/proc");
    Texts mounts;
    for (const std::string& command : fakes::commands()) {
      if (command.rfind("mount", 0) == 0) mounts.push_back(command);
    }
    return mounts;
  }
  static constexpr char kUfsd[] =
      "mount -t ufsd -o rw,nls=utf8,fmask=0,dmask=0,force,user_xattr /dev/sdb1 \"/mnt/VV/Data\"";
  static constexpr char kStockDrivers[] = "nodev\tsysfs\nnodev\tufsd2\n\text4\n\tntfs3\n\thfsplus\n";
};

}  // namespace

TEST_F(StockKernel, NtfsIsMountedByItsOwnDriver) {
  const char* stock = "mount -t ntfs3 -o rw,iocharset=utf8,fmask=0,dmask=0 /dev/sdb1 \"/mnt/VV/Data\"";
  EXPECT_EQ(mount_with("ntfs", kStockDrivers), (Texts{kUfsd, kUfsd, kUfsd, kUfsd, stock}));
  EXPECT_EQ(stored("volume_state"), "0");
}

TEST_F(StockKernel, HfsplusIsMountedByItsOwnDriver) {
  const char* stock = "mount -t hfsplus -o rw,nls=utf8,umask=0 /dev/sdb1 \"/mnt/VV/Data\"";
  EXPECT_EQ(mount_with("hfsplus", kStockDrivers), (Texts{kUfsd, kUfsd, kUfsd, kUfsd, stock}));
}

TEST_F(StockKernel, ItsDriverIsTriedOnceAndItsFailureSaid) {
  const char* stock = "mount -t ntfs3 -o rw,iocharset=utf8,fmask=0,dmask=0 /dev/sdb1 \"/mnt/VV/Data\"";
  fakes::on("system", stock).returns(32 << 8);
  not_mounted();
  EXPECT_EQ(mount_with("ntfs", kStockDrivers).size(), 5u);
  EXPECT_TRUE(has(log, std::string("system() of cmd '") + stock + "' failed"));
  EXPECT_EQ(stored("volume_state"), "3");
}

TEST_F(StockKernel, AKernelWithTheDriverIsTakenAtItsWord) {
  EXPECT_EQ(mount_with("ntfs", "\text4\n\tufsd\n\tntfs3\n"), (Texts{kUfsd, kUfsd, kUfsd, kUfsd}));
}

TEST_F(StockKernel, TheEndOfALongLineIsNoLine) {
  const std::string drivers = "nodev\t" + std::string(121, 'x') + "\tufsd\n\tntfs3\n";
  EXPECT_EQ(mount_with("ntfs", drivers.c_str()).size(), 5u);
}

TEST_F(StockKernel, WithoutAListOfDriversNothingElseIsTried) {
  EXPECT_EQ(mount_with("ntfs", nullptr), (Texts{kUfsd, kUfsd, kUfsd, kUfsd}));
}

// The folder below the mount.
TEST_F(Mount, TheBareFolderIsThereAndTakesNoDataBeforeTheMount) {
  bool refused = false;
  fakes::on("system", kMkdir).does([&refused] { refused = is_immutable("/mnt/VV/Data"); });
  EXPECT_EQ(mount_it(), 0);
  EXPECT_TRUE(refused);
  EXPECT_TRUE(is_immutable("/mnt/VV/Data"));
}

TEST_F(Mount, TheBareFolderOfAFailedMountIsRemoved) {
  not_mounted();
  EXPECT_EQ(mount_it(), 0);
  EXPECT_FALSE(std::filesystem::exists("/mnt/VV/Data"));
}

TEST_F(Mount, APlantedLinkIsNotFollowed) {
  copy_text(entry.share, "a/Data");
  std::filesystem::create_directories("/mnt/elsewhere/Data");
  std::filesystem::create_directory_symlink("/mnt/elsewhere", "/mnt/VV/a");
  EXPECT_EQ(mount_it(1), kMountNoMountPoint);
  EXPECT_TRUE(has(log, "share name a/Data leads through a symbolic link below /mnt/VV/"));
  EXPECT_TRUE(fakes::calls().empty());
  EXPECT_TRUE(fakes::writes().empty());
}

TEST_F(Mount, AMountThatTakesHoldAtTheSecondTryIsRecorded) {
  fakes::on("system", kMount).returns(32 << 8).times(1);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(fakes::calls({"usleep"}).size(), 1u);
  EXPECT_EQ(stored("volume_state"), "0");
}

// The platform may say that nothing is mounted when something is: the volume's files are kept.
TEST_F(Mount, AMountPointThatIsStillMountedIsNotRemoved) {
  std::filesystem::create_directories("/mnt/VV/Data");
  cover("/mnt/VV/Data");
  not_mounted();
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(stored("volume_state"), "3");
  EXPECT_TRUE(has(log, "/mnt/VV/Data is not removed, tmpfs is mounted on /mnt/VV/Data"));
  EXPECT_EQ(log.find("failed"), std::string::npos) << "no command ran";
  EXPECT_EQ(fakes::commands(), (Texts{kMkdir, kMount, kReload}));
}

TEST_F(Mount, ARefusedPartitionIsPassedOn) {
  fakes::on("sys_get_partition_list", "/dev/sdb").text("").returns(0);
  fakes::on("sys_create_1_partition", "/dev/sdb").returns(-1);
  EXPECT_EQ(mount_it(), kMountNoPartition);
  EXPECT_EQ(stored("volume_state"), "3");
  EXPECT_TRUE(fakes::commands().empty());
}

TEST_F(Mount, ASmallDiskIsOffline) {
  fakes::on("sys_get_disk_space", "/dev/sdb").returns(1048576);
  EXPECT_EQ(mount_it(), kMountTooSmall);
  EXPECT_TRUE(fakes::writes().empty());
}

TEST_F(Mount, AFileSystemThatIsStillNotThereFailsTheMount) {
  empty_partition(9);
  EXPECT_EQ(mount_it(), -1);
  EXPECT_EQ(fakes::commands(), (Texts{kFuser, kWipe, kMkfs}));
}

TEST_F(Mount, LostStatesOfTheTree) {
  fakes::on("ktreec_set", lun("format_state")).times(3).returns(-1);
  EXPECT_EQ(mount_it(), -103);
  EXPECT_TRUE(has(log, "Update ktree FAILED"));
  EXPECT_TRUE(fakes::commands().empty());

  fakes::on("ktreec_set", lun("volume_state")).times(3).returns(-1);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_TRUE(has(log, "Update ktree FAILED"));
  EXPECT_EQ(stored("vol_access_right"), "1");

  fakes::on("ktreec_set", lun("vol_access_right")).times(3).returns(-1);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_TRUE(has(log, "ktree_update_lun_vol_access_right to RW, FAILED, ret = -103"));

  fakes::on("ktreec_set", lun("vol_access_right")).times(3).returns(-1);
  fakes::on("system", kChmod).returns(256).times(1);
  EXPECT_EQ(mount_it(), -103);
  EXPECT_TRUE(has(log, "ktree_update_lun_vol_access_right to RO, FAILED, ret = -103"));

  fakes::on("ktreec_set", lun("vol_access_right")).times(3).returns(-1);
  fakes::on("system", kWipe).returns(256).times(1);
  EXPECT_EQ(mount_it(1), -103);
  EXPECT_TRUE(has(log, "ktree_update_lun_vol_access_right to RO, FAILED, ret = -103"));
}

TEST_F(Mount, AllLunsUpToTheFirstGap) {
  fakes::tree_set({{"/iscsi/initiator/id:2/lun/id:1/lun", "0"},
                   {"/iscsi/initiator/id:2/lun/id:1/share", "Data"},
                   {"/iscsi/initiator/id:2/lun/id:1/dev", "sdb"},
                   {"/iscsi/initiator/id:2/lun/id:2/lun", "1"},
                   {"/iscsi/initiator/id:2/lun/id:2/share", "Other"},
                   {"/iscsi/initiator/id:2/lun/id:4/lun", "3"},
                   {"/iscsi/initiator/id:2/lun/id:4/share", "Fourth"}});
  fakes::tree_delete("/iscsi/initiator/id:2/lun/id:3/lun");
  EXPECT_EQ(Target_mount_all_lun(&entry, 0, 0), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kMkdir, kMount, kResize, kChmod})) << "the second has no device";
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:2/lun/id:1/status"), "Disable");
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:2/lun/id:2/status"), "Disable");
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:2/lun/id:4/status"), std::nullopt);
  EXPECT_EQ(Target_mount_all_lun(nullptr, 0, 0), -1);
  entry.db_idx = 0;
  EXPECT_EQ(Target_mount_all_lun(&entry, 0, 0), -1);
}

// --- each command failing alone ---

namespace {

struct Failure {
  const char* command;
  int result;
  const char* message;       // "" when the failure is ignored without a word
  const char* volume_state;  // "" when never written
  const char* access_right;
  size_t commands;  // how many of the clean run's commands run before the end, this one included
};

// A LUN whose disk is empty meets all commands but e2fsck, which has a test of its own.
constexpr Failure kFailures[] = {
    {kFuser, 0, "", "0", "1", 8},
    {kWipe, kMountFormatFailed, "Create Format FAILED", "0", "0", 2},
    {kMkfs, 0, "", "0", "1", 8},
    {kMkdir, kMountNoMountPoint, "system() of cmd 'mkdir -p \"/mnt/VV/Data\"' failed", "0", "", 4},
    {kResize, 0, "", "0", "1", 8},
    {kChmod, kMountReadOnly, "change mode 777 to Data failed, this might be a read only filesystem", "0", "0",
     7},
    {kReload, 0, "", "0", "1", 8},
};

class MountFailure : public Mount, public testing::WithParamInterface<Failure> {};

}  // namespace

TEST_P(MountFailure, LeavesWhatIsStated) {
  const Failure& failure = GetParam();
  debug_level = 1;
  empty_disk();
  fakes::on("system", failure.command).returns(256);
  fakes::on("popen", failure.command).text("mke2fs: failed\n").returns(256);
  EXPECT_EQ(mount_it(), failure.result);
  if (failure.message[0] != '\0') {
    EXPECT_TRUE(has(log, failure.message));
  }
  EXPECT_EQ(stored("volume_state"), failure.volume_state);
  EXPECT_EQ(stored("vol_access_right"), failure.access_right);
  const Texts all = {kFuser, kWipe, kMkfs, kMkdir, kMount, kResize, kChmod, kReload};
  EXPECT_EQ(fakes::commands(), Texts(all.begin(), all.begin() + static_cast<long>(failure.commands)));
}

INSTANTIATE_TEST_SUITE_P(EachCommand, MountFailure, testing::ValuesIn(kFailures),
                         [](const auto& row) { return "Number" + std::to_string(row.index); });

TEST_F(Mount, TheTableOfFailuresHoldsEveryCommand) {
  empty_disk();
  EXPECT_EQ(mount_it(), 0);
  Texts table = {kMount};  // its retries have tests of their own
  for (const Failure& failure : kFailures) table.push_back(failure.command);
  Texts run = fakes::commands();
  std::sort(table.begin(), table.end());
  std::sort(run.begin(), run.end());
  EXPECT_EQ(run, table);
}

TEST_F(Mount, AFailingRemovalIsSaid) {
  fakes::on("system", kMount).returns(256);
  fakes::on("system", kRemove).returns(256);
  not_mounted();
  EXPECT_EQ(mount_it(), 0);
  EXPECT_TRUE(has(log, std::string("system() of cmd '") + kRemove + "' failed"));
}

TEST_F(Mount, AFailingCheckIsIgnored) {
  fakes::on("sys_check_fs_state", kNode).returns(1);
  fakes::on("system", "e2fsck -n -f /dev/sdb1").returns(4 << 8);
  EXPECT_EQ(mount_it(), 0);
  EXPECT_EQ(stored("volume_state"), "0");
}

// --- remounting in place ---

TEST_F(Mount, ARemountEscapesThePathAndWaits) {
  fakes::on("sys_mount_point", "/mnt/VV/a \"b\"").returns(1);
  EXPECT_EQ(remount_mnt_path("/mnt/VV/a \"b\"", 5), 0);
  EXPECT_EQ(fakes::calls(), (Texts{"system mount -o remount \"/mnt/VV/a \\\"b\\\"\"", "sleep 5"}));
}

TEST_F(Mount, AShortWaitIsThreeSeconds) {
  debug_level = 2;
  for (const int seconds : {0, -1, 1, 2, 3, 4}) {
    log = fakes::output_of([seconds] { EXPECT_EQ(remount_mnt_path("/mnt/VV/Data", seconds), 0); });
  }
  EXPECT_EQ(fakes::calls({"sleep"}), (Texts{"sleep 3", "sleep 3", "sleep 3", "sleep 4"}));
  EXPECT_TRUE(has(log, "start remount path /mnt/VV/Data"));
  EXPECT_TRUE(has(log, "sleep 4 seconds to wait remount done..."));
}

TEST_F(Mount, AFailedRemountStillWaits) {
  fakes::on("system").returns(32 << 8);
  log = fakes::output_of([] { EXPECT_EQ(remount_mnt_path("/mnt/VV/Data", 5), -1); });
  EXPECT_TRUE(has(log, "cmd 'mount -o remount \"/mnt/VV/Data\"' failed"));
  EXPECT_EQ(fakes::calls({"sleep"}), Texts{"sleep 5"});
}

TEST_F(Mount, ARemountOfNothingDoesNothing) {
  not_mounted();
  EXPECT_EQ(remount_mnt_path("/mnt/VV/Data", 5), 0);
  log = fakes::output_of([] { EXPECT_EQ(remount_mnt_path(nullptr, 5), -1); });
  EXPECT_TRUE(has(log, "mnt_path not vaild"));
  EXPECT_TRUE(fakes::calls().empty());
}

TEST_F(Mount, ARemountOfTheLongestPathIsNotCut) {
  const std::string path(4000, '$');
  fakes::on("sys_mount_point").returns(1);
  EXPECT_EQ(remount_mnt_path(path.c_str(), 0), 0);
  std::string escaped;
  for (size_t i = 0; i < path.size(); i++) escaped += "\\$";
  EXPECT_EQ(fakes::commands(), Texts{"mount -o remount \"" + escaped + "\""});
}

TEST_F(Mount, ARemountWithoutMemoryDoesNothing) {
  for (const int left : {0, 1}) {
    allocations = left;
    log = fakes::output_of([] { EXPECT_EQ(remount_mnt_path("/mnt/VV/Data", 5), -1); });
    allocations = -1;
    EXPECT_TRUE(has(log, "malloc failed")) << left;
    EXPECT_TRUE(fakes::calls().empty());
  }
}
