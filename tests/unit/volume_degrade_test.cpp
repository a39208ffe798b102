// Volumes that the kernel turned read-only: what the mount tables say, and what a write tells.
#include "volume/degrade.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <utility>

#include "volume_fixture.h"

using namespace remvol;

namespace {

constexpr char kTable[] = "/mnt/table";
constexpr char kVolume[] = "/mnt/volume";

class Degrade : public VolumeTest {
 protected:
  Degrade() {
    cover("/mnt");
    debug_level = 2;
  }
  ~Degrade() override { uncover("/mnt"); }

  int right_in(const std::string& lines, const char* device = "/dev/sdb1") {
    std::ofstream(kTable) << lines;
    int right = 0;
    log = fakes::output_of([&] { right = get_mnt_ac_right_from_mnt_file(device, kTable); });
    return right;
  }

  std::string log;
};

}  // namespace

TEST_F(Degrade, TheOptionDecides) {
  EXPECT_EQ(right_in("/dev/sdb1 /mnt/VV/Data ext4 rw,relatime 0 0\n"), 0);
  EXPECT_TRUE(has(log, "get a possible entry dev = |/dev/sdb1|"));
  EXPECT_TRUE(has(log, "get mnt file access right = 0 for dev /dev/sdb1"));
  EXPECT_EQ(right_in("/dev/sdb1 /mnt/VV/Data ext4 ro,relatime 0 0\n"), 1);
  EXPECT_EQ(right_in("/dev/sdb1 /mnt/VV/Data ext4 rw 0 0\n"), 0);
  EXPECT_EQ(right_in("/dev/sdb1\t/mnt/VV/Data\text4\tro\t0\t0\n"), 1);
  EXPECT_EQ(right_in("/dev/sdb1 /mnt/VV/Data ext4 noatime,rw 0 0\n"), 0);
  EXPECT_EQ(right_in("/dev/sdb1 /mnt/VV/Data ext4 noatime,ro,x 0 0\n"), 1);
  EXPECT_EQ(right_in("/dev/sdb1 /mnt/VV/Data ext4 ro"), 1) << "at the end of the table";
}

TEST_F(Degrade, OnlyTheFirstOccurrenceInAFieldCounts) {
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 rw,errors=remount-ro 0 0\n"), 0);
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 errors=remount-ro 0 0\n"), 2);
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 errors=x,ro 0 0\n"), 2) << "the ro of errors hides the other one";
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 xrw,ro 0 0\n"), 2) << "an unbounded rw hides a following ro";
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 xrw ro 0 0\n"), 1) << "but not in the next field";
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 noatime 0 0\n"), 2);
}

TEST_F(Degrade, FieldsThatStartWithASlashAreSkipped) {
  EXPECT_EQ(right_in("/dev/sdb1 /ro,rw ext4 noatime 0 0\n"), 2);
  EXPECT_EQ(right_in("/dev/sdb1 ro ext4 rw 0 0\n"), 1) << "any other field may decide";
}

TEST_F(Degrade, ADiskMatchesItsPartitionsOnly) {
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 ro 0 0\n", "/dev/sdb"), 1);
  EXPECT_EQ(right_in("/dev/sdb /m ext4 ro 0 0\n", "/dev/sdb"), 1);
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 ro 0 0\n", "sdb"), 1);
  EXPECT_EQ(right_in("/dev/sdbc1 /m ext4 ro 0 0\n", "/dev/sdb"), -1);
  EXPECT_TRUE(has(log, "/dev/sdbc1 is not under /dev/sdb, skip"));
  EXPECT_EQ(right_in("/dev/sdc1 /m ext4 ro 0 0\n", "/dev/sdb"), -1);
  EXPECT_EQ(right_in("", "/dev/sdb"), -1);
  EXPECT_EQ(right_in("\n \n", "/dev/sdb"), -1);
}

TEST_F(Degrade, ALaterLineMayDecide) {
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 noatime 0 0\n/dev/sdb1 /n ext4 ro 0 0\n"), 1);
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 noatime 0 0\n/dev/sdc1 /n ext4 ro 0 0\n"), 2);
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 rw 0 0\n/dev/sdb1 /n ext4 ro 0 0\n"), 0) << "the first that decides";
}

TEST_F(Degrade, AKernelThatKeepsRwSaysItOtherwise) {
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 rw,relatime,emergency_ro 0 0\n"), 1);
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 rw,shutdown,relatime 0 0\n"), 1);
  EXPECT_EQ(right_in("/dev/sdb1 /m ext4 rw,x-emergency_ro,noshutdown 0 0\n"), 0) << "whole options only";
}

TEST_F(Degrade, ATableThatCannotBeRead) {
  const std::string said =
      fakes::output_of([] { EXPECT_EQ(get_mnt_ac_right_from_mnt_file("sdb", "/mnt/none"), -2); });
  EXPECT_TRUE(has(said, "failed to open mtab file at /mnt/none"));
  EXPECT_EQ(get_mnt_ac_right_from_mnt_file(nullptr, kTable), -2);
  EXPECT_EQ(get_mnt_ac_right_from_mnt_file("", kTable), -2);
}

TEST_F(Degrade, AnInvalidDevice) {
  const std::string said = fakes::output_of([] {
    EXPECT_EQ(get_mtab_access_right(nullptr), -2);
    EXPECT_EQ(get_mtab_access_right(""), -2);
    EXPECT_EQ(get_proc_mount_access_right(nullptr), -2);
    EXPECT_EQ(get_proc_mount_access_right(""), -2);
  });
  EXPECT_TRUE(has(said, "dev is not valid value"));
  const std::string checked = fakes::output_of([] {
    EXPECT_EQ(check_mnt_dev_degrade_to_ro(nullptr, ""), -2);
    EXPECT_EQ(check_mnt_dev_degrade_to_ro("", "/m"), -2);
  });
  EXPECT_TRUE(has(checked, "dev is not valid!"));
}

// --- the two tables ---

namespace {

// /etc and /proc of the test's own: mtab a file, or a link into /proc.
class TwoTables : public Degrade {
 protected:
  TwoTables() {
    cover("/etc");
    cover("/proc");
    std::filesystem::create_directories("/proc/self");
    proc_mounts("");
  }
  ~TwoTables() override {
    uncover("/proc");
    uncover("/etc");
  }

  static void mtab(const std::string& options) { std::ofstream("/etc/mtab") << line(options); }
  static void proc_mounts(const std::string& options) { std::ofstream("/proc/mounts") << line(options); }
  static void live_mtab() { std::filesystem::create_symlink("/proc/mounts", "/etc/mtab"); }
  static void mountinfo(const std::string& lines) { std::ofstream("/proc/self/mountinfo") << lines; }

  int check(const char* path = "") {
    int result = 0;
    log = fakes::output_of([&] { result = check_mnt_dev_degrade_to_ro("/dev/sdb1", path); });
    return result;
  }

 private:
  static std::string line(const std::string& options) {
    return options.empty() ? "" : "/dev/sdb1 /mnt/volume ext4 " + options + " 0 0\n";
  }
};

}  // namespace

TEST_F(TwoTables, RwThatBecameRoIsDegraded) {
  mtab("rw");
  proc_mounts("ro,relatime");
  EXPECT_EQ(check(), 1);
  EXPECT_TRUE(has(log, "get mtab access right = 0 for dev /dev/sdb1"));
  EXPECT_TRUE(has(log, "get proc mounts access right = 1 for dev /dev/sdb1"));
  EXPECT_TRUE(has(log, "the access right is degrade to ro for dev /dev/sdb1"));
}

TEST_F(TwoTables, RwThatStayedRwIsNot) {
  mtab("rw");
  proc_mounts("rw,relatime");
  EXPECT_EQ(check(), 0);
  EXPECT_TRUE(has(log, "access right in mtab and proc are both rw for dev /dev/sdb1"));
}

TEST_F(TwoTables, MountedRoOnPurposeIsNotLookedAtFurther) {
  mtab("ro");
  EXPECT_EQ(check("/mnt/volume"), 0) << "no remount, and no look at the kernel's table";
  EXPECT_TRUE(has(log, "/dev/sdb1 has been mounted as ro, skip to check degrade"));
  EXPECT_TRUE(fakes::calls().empty());
}

TEST_F(TwoTables, ADeviceThatATableDoesNotKnow) {
  mtab("");
  EXPECT_EQ(check("/mnt/volume"), -1);
  EXPECT_TRUE(has(log, "can not find /dev/sdb1 in mtab"));
  mtab("rw");
  EXPECT_EQ(check(), -1);
  EXPECT_TRUE(has(log, "can not find /dev/sdb1 in /proc/mounts"));
}

TEST_F(TwoTables, ATableThatIsMissing) {
  EXPECT_EQ(check(), -2);
  EXPECT_TRUE(has(log, "failed to get mtab access right"));
  mtab("rw");
  std::filesystem::remove("/proc/mounts");
  EXPECT_EQ(check(), -2);
  EXPECT_TRUE(has(log, "failed to get proc mounts access right for /dev/sdb1"));
}

TEST_F(TwoTables, TheVolumeIsRemountedBeforeTheKernelIsAsked) {
  mtab("noatime");  // neither option: the kernel's table decides
  proc_mounts("rw");
  fakes::on("sys_mount_point", kVolume).returns(1);
  std::filesystem::create_directories(kVolume);
  fakes::on("sleep", "5").does([] { proc_mounts("ro"); });
  fakes::on("system", "mount -o remount \"/mnt/volume\"").returns(32 << 8);
  EXPECT_EQ(check(kVolume), 1) << "the result of the remount is ignored";
  EXPECT_EQ(fakes::calls(), (Texts{"system mount -o remount \"/mnt/volume\"", "sleep 5"}));
}

TEST_F(TwoTables, ALiveMtabGivesWayToTheMountsOwnOptions) {
  live_mtab();
  proc_mounts("ro,relatime");
  mountinfo(
      "21 1 8:2 / / rw,relatime - ext4 /dev/sda2 rw\n"
      "36 21 8:17 /ro /mnt/volume rw,relatime shared:7 master:2 - ext4 /dev/sdb1 ro,errors=continue\n");
  EXPECT_EQ(check(), 1) << "mounted rw, and the file system turned ro";
  mountinfo("36 21 8:17 / /mnt/volume ro,relatime - ext4 /dev/sdb1 ro\n");
  EXPECT_EQ(check(), 0) << "mounted ro on purpose";
  mountinfo("36 21 8:17 / /mnt/volume rw - ext4 /dev/sdbc1 rw\nno separator /dev/sdb1 rw\n - \n");
  EXPECT_EQ(check(), -1);
  EXPECT_TRUE(has(log, "can not find /dev/sdb1 in mtab"));
  std::filesystem::remove("/proc/self/mountinfo");
  EXPECT_EQ(check(), -2);
}

TEST_F(TwoTables, ALongLineOfAnotherMountIsNoTrouble) {
  live_mtab();
  proc_mounts("rw");
  mountinfo("9 1 0:5 / /o rw - overlay overlay rw,lowerdir=" + std::string(6000, 'x') +
            "\n36 21 8:17 / /mnt/volume rw - ext4 /dev/sdb1 rw\n");
  EXPECT_EQ(check(), 0);
}

// --- the write ---

TEST_F(TwoTables, AWriteTellsWhatTheTablesDoNot) {
  mtab("rw");
  proc_mounts("rw,relatime");
  std::filesystem::create_directories(kVolume);
  ASSERT_EQ(mount("tmpfs", kVolume, "tmpfs", 0, nullptr), 0);
  fakes::on("sys_mount_point", kVolume).returns(1);
  EXPECT_EQ(check(kVolume), 0);
  EXPECT_TRUE(std::filesystem::is_empty(kVolume)) << "the trial leaves nothing behind";
  ASSERT_EQ(mount(nullptr, kVolume, nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
  EXPECT_EQ(check(kVolume), 1);
  EXPECT_TRUE(has(log, "the access right is degrade to ro for dev /dev/sdb1"));
}

TEST_F(TwoTables, AWriteThatNeverReachesTheDiskTellsItToo) {
  mtab("rw");
  proc_mounts("rw,relatime");
  std::filesystem::create_directories(kVolume);
  ASSERT_EQ(mount("tmpfs", kVolume, "tmpfs", 0, nullptr), 0);
  fakes::on("sys_mount_point", kVolume).returns(1);
  for (const auto& [error, degraded] : {std::pair{EIO, 1}, {EROFS, 1}, {ENOSPC, 0}}) {
    fakes::on("fsync").error(error).returns(-1).times(1);
    EXPECT_EQ(check(kVolume), degraded) << strerror(error);
  }
}

TEST_F(TwoTables, ErrorsOtherThanARefusalDecideNothing) {
  mtab("rw");
  proc_mounts("rw,relatime");
  fakes::on("sys_mount_point", kVolume).returns(1);
  EXPECT_EQ(check(kVolume), 0) << "no such folder";
  std::filesystem::create_directories(kVolume);
  ASSERT_EQ(mount("tmpfs", kVolume, "tmpfs", 0, "size=4k"), 0);
  std::ofstream(std::string(kVolume) + "/full") << std::string(8192, 'x');
  EXPECT_EQ(check(kVolume), 0) << "no space";
}

TEST_F(TwoTables, WithoutAMountNothingIsTried) {
  mtab("rw");
  proc_mounts("rw,relatime");
  std::filesystem::create_directories(kVolume);
  ASSERT_EQ(mount("tmpfs", kVolume, "tmpfs", MS_RDONLY, nullptr), 0);
  fakes::on("sys_mount_point", kVolume).returns(0);
  EXPECT_EQ(check(kVolume), 0);
}
