// Taking volumes away: the rounds of an unmount, the removal of the mount point, the FTP mount.
#include "volume/unmount.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "volume/bare_folder.h"
#include "volume/session_volumes.h"
#include "volume_fixture.h"

using namespace remvol;

namespace {

constexpr char kPath[] = "/mnt/VV/Data";
constexpr char kKillDevice[] = "fuser -mk /dev/sdb1";
constexpr char kRemount[] = "mount -o remount \"/mnt/VV/Data\"";
constexpr char kKill[] = "fuser -mk \"/mnt/VV/Data\"";
constexpr char kUmount[] = "umount -f \"/mnt/VV/Data\"";
constexpr char kRemove[] = "rm -rf \"/mnt/VV/Data\"";

std::string in_system(const char* command) {
  return std::string("system ") + command;
}

// A volume whose mount point is a folder; the platform says that it is mounted.
class Unmount : public VolumeTest {
 protected:
  Unmount() {
    store_entry();
    copy_text(entry.mnt_dev, "/dev/sdb1");
    fakes::tree_set({{lun("mnt_dev"), "/dev/sdb1"}});
    cover("/mnt");
    std::filesystem::create_directories(kPath);
    fakes::otherwise("sys_mount_point", kPath).returns(1);
  }
  ~Unmount() override { uncover("/mnt"); }

  int unmount() {
    int result = 0;
    log = fakes::output_of([&] { result = Target_LUN_umount(&entry); });
    return result;
  }

  static void not_mounted() { fakes::on("sys_mount_point", kPath).returns(0); }

  std::string log;
};

}  // namespace

TEST_F(Unmount, TheStepsComeInOrder) {
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::calls(), (Texts{in_system(kKillDevice), in_system(kRemount), in_system(kKill), "sleep 1",
                                   in_system(kUmount), in_system(kRemove)}));
}

TEST_F(Unmount, TheMessagesOfACleanRun) {
  debug_level = 2;
  EXPECT_EQ(unmount(), 0);
  for (const char* message : {"start", "start fuser", "start umount", "end umount", "end"}) {
    EXPECT_TRUE(has(log, message));
  }
}

TEST_F(Unmount, WithoutAMountPointOnlyTheDevicesUsersAreKilled) {
  std::filesystem::remove(kPath);
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::calls(), Texts{in_system(kKillDevice)});
}

TEST_F(Unmount, AFolderThatIsNotMountedIsRemoved) {
  not_mounted();
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kKillDevice, kRemove}));
}

TEST_F(Unmount, NoSessionIsClosedWhileTheTableOfMountsCannotBeRead) {
  int result = 0;
  bool needed = false;
  log = fakes::output_of([&] {
    rlimit before{};
    getrlimit(RLIMIT_NOFILE, &before);
    const rlimit none = {0, before.rlim_max};
    setrlimit(RLIMIT_NOFILE, &none);
    result = close_sessions("iqn.t1", "logout");
    needed = has_session_volume("iqn.t1");
    setrlimit(RLIMIT_NOFILE, &before);
  });
  EXPECT_EQ(result, 1);
  EXPECT_TRUE(needed);
  EXPECT_EQ(fakes::calls(), Texts{});
  EXPECT_TRUE(has(log, "/proc/self/mountinfo cannot be read: Too many open files, no session is closed"));
  EXPECT_EQ(close_sessions("iqn.t1", "logout"), 0);
}

TEST_F(Unmount, BadEntriesTouchNothing) {
  debug_level = 2;
  EXPECT_EQ(Target_LUN_umount(nullptr), -1);
  for (const char* share : {"", "..", "a/../..", "/", ".", "../../home"}) {
    copy_text(entry.share, share);
    EXPECT_EQ(unmount(), -1);
    EXPECT_TRUE(has(log, "end"));
    if (share[0] != '\0') {
      EXPECT_TRUE(has(log, std::string("share name ") + share + " leaves /mnt/VV/"));
    }
  }
  EXPECT_TRUE(fakes::calls().empty());
}

TEST_F(Unmount, AnUnmountThatKeepsFailingIsTriedFourTimes) {
  fakes::on("system", kUmount).returns(32 << 8);
  EXPECT_EQ(unmount(), 0);
  Texts expected = {in_system(kKillDevice), in_system(kRemount), in_system(kKill), "sleep 1",
                    in_system(kUmount)};
  for (int round = 0; round < 3; round++) {
    expected.push_back(in_system(kKill));
    expected.push_back(in_system(kUmount));
  }
  expected.push_back(in_system(kRemove));
  EXPECT_EQ(fakes::calls(), expected) << "the further rounds do not sleep";
  EXPECT_TRUE(has(log, std::string("cmd '") + kUmount + "' failed"));
}

TEST_F(Unmount, ARoundThatSucceedsIsTheLast) {
  fakes::on("system", kUmount).returns(32 << 8).times(2);
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::commands(),
            (Texts{kKillDevice, kRemount, kKill, kUmount, kKill, kUmount, kKill, kUmount, kRemove}));
}

// fuser -m on a folder that is no mount point means the disk that the folder is on.
TEST_F(Unmount, NoRoundKillsTheUsersOfTheSystemsDisk) {
  fakes::on("system", kUmount).returns(32 << 8);
  fakes::on("sys_mount_point", kPath).returns(1).times(3);
  not_mounted();
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kKillDevice, kRemount, kKill, kUmount, kRemove}));
}

TEST_F(Unmount, NorDoesTheFirstOneAfterALongRemount) {
  fakes::on("sys_mount_point", kPath).returns(1).times(2);
  not_mounted();
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kKillDevice, kRemount, kRemove}));
}

TEST_F(Unmount, AKillThatFailsIsTriedThreeTimes) {
  debug_level = 1;
  fakes::on("system", kKill).returns(256);
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kKillDevice, kRemount, kKill, kKill, kKill, kUmount, kRemove}));
  EXPECT_TRUE(has(log, std::string("cmd '") + kKill + "' return code = 256"));
  for (const std::string& wait : fakes::calls({"usleep"})) EXPECT_LT(std::stoi(wait.substr(7)), 200000);
}

TEST_F(Unmount, EveryCommandEscapesTheShare) {
  const std::string path = "/mnt/VV/a \"b\" $(c) `d` \\ \xc3\xa9";
  const std::string escaped = "\"/mnt/VV/a \\\"b\\\" \\$(c) \\`d\\` \\\\ \xc3\xa9\"";
  copy_text(entry.share, "a \"b\" $(c) `d` \\ \xc3\xa9");
  std::filesystem::create_directories(path);
  fakes::on("sys_mount_point", path).returns(1);
  EXPECT_EQ(unmount(), 0);
  EXPECT_EQ(fakes::commands(), (Texts{kKillDevice, "mount -o remount " + escaped, "fuser -mk " + escaped,
                                      "umount -f " + escaped, "rm -rf " + escaped}));
}

// --- each command failing alone ---

namespace {

struct Failure {
  const char* command;
  int result;
  const char* message;  // "" when the failure is ignored without a word
};

constexpr Failure kFailures[] = {
    {kKillDevice, 0, ""},
    {kRemount, 0, "cmd 'mount -o remount \"/mnt/VV/Data\"' failed"},
    {kKill, 0, "cmd 'fuser -mk \"/mnt/VV/Data\"' return code = 256"},
    {kUmount, 0, "cmd 'umount -f \"/mnt/VV/Data\"' failed"},
    {kRemove, -1, "cmd 'rm -rf \"/mnt/VV/Data\"' failed"},
};

class UnmountFailure : public Unmount, public testing::WithParamInterface<Failure> {};

}  // namespace

TEST_P(UnmountFailure, LeavesWhatIsStated) {
  const Failure& failure = GetParam();
  debug_level = 1;
  fakes::on("system", failure.command).returns(256);
  EXPECT_EQ(unmount(), failure.result);
  if (failure.message[0] != '\0') {
    EXPECT_TRUE(has(log, failure.message));
  }
  EXPECT_EQ(fakes::commands().back(), kRemove) << "the mount point is removed whatever failed";
  EXPECT_TRUE(fakes::writes().empty());
}

INSTANTIATE_TEST_SUITE_P(EachCommand, UnmountFailure, testing::ValuesIn(kFailures),
                         [](const auto& row) { return "Number" + std::to_string(row.index); });

TEST_F(Unmount, TheTableOfFailuresHoldsEveryCommand) {
  EXPECT_EQ(unmount(), 0);
  Texts table;
  for (const Failure& failure : kFailures) table.push_back(failure.command);
  EXPECT_EQ(fakes::commands(), table);
}

// --- the volume's files ---

namespace {

// A file system of the test's own on the mount point, with a file in it; the commands are fakes that do
// nothing.
class MountedVolume : public Unmount {
 protected:
  MountedVolume() { add_layer(); }

  void add_layer() {
    cover(kPath);
    std::ofstream(std::string(kPath) + "/file") << "data";
  }

  // What the removal would have found.
  void on_removal(std::function<void()> look) { fakes::on("system", kRemove).does(std::move(look)); }

  static bool is_mounted() { return std::filesystem::exists(std::string(kPath) + "/file"); }
};

}  // namespace

TEST_F(MountedVolume, ABusyVolumeIsDetachedBeforeTheRemoval) {
  add_layer();
  fakes::on("system", kUmount).returns(32 << 8);
  const int user = open((std::string(kPath) + "/file").c_str(), O_RDONLY | O_CLOEXEC);
  bool found = true;
  on_removal([&found] { found = is_mounted(); });
  EXPECT_EQ(unmount(), 0);
  EXPECT_FALSE(found) << "the removal does not meet the volume's file";
  char text[8];
  EXPECT_EQ(read(user, text, sizeof text), 4) << "and the volume's file is still there";
  close(user);
}

TEST_F(MountedVolume, WhatCannotBeDetachedIsNotRemoved) {
  not_mounted();  // the platform errs
  EXPECT_EQ(unmount(), -1);
  EXPECT_EQ(fakes::commands(), Texts{kKillDevice});
  EXPECT_TRUE(has(log, "/mnt/VV/Data is not removed, tmpfs is mounted on /mnt/VV/Data"));
  EXPECT_EQ(log.find("failed"), std::string::npos) << "no command ran";
  EXPECT_TRUE(is_mounted());
}

TEST_F(MountedVolume, AnotherVolumeBelowIsNotRemoved) {
  umount2(kPath, MNT_DETACH);
  std::filesystem::create_directories("/mnt/VV/Data/inner");
  cover("/mnt/VV/Data/inner");
  not_mounted();
  EXPECT_EQ(unmount(), -1);
  EXPECT_EQ(fakes::commands(), Texts{kKillDevice});
}

TEST_F(MountedVolume, AFolderInsideAnotherVolumeIsNotRemoved) {
  not_mounted();
  copy_text(entry.share, "Data/inner");
  std::filesystem::create_directories("/mnt/VV/Data/inner");
  fakes::on("sys_mount_point", "/mnt/VV/Data/inner").returns(0);
  EXPECT_EQ(unmount(), -1);
  EXPECT_EQ(fakes::commands(), Texts{kKillDevice});
  EXPECT_TRUE(has(log, "/mnt/VV/Data/inner is not removed, it is not on the file system of /mnt/VV/"));
}

TEST_F(Unmount, AFolderThatTakesNoDataIsRemoved) {
  not_mounted();
  make_bare_folder("/mnt/VV/Data/a/b");
  make_bare_folder(kPath);
  ASSERT_TRUE(is_immutable(kPath));
  fakes::on("system", kRemove).does([] { std::filesystem::remove_all(kPath); });
  EXPECT_EQ(unmount(), 0);
  EXPECT_FALSE(std::filesystem::exists(kPath)) << "with what a killed run left below it";
}

TEST_F(Unmount, APlantedLinkIsNotFollowed) {
  std::filesystem::remove(kPath);
  std::filesystem::create_directories("/mnt/elsewhere");
  std::filesystem::create_directory_symlink("/mnt/elsewhere", kPath);
  EXPECT_EQ(unmount(), -1);
  EXPECT_TRUE(fakes::commands().empty());
  EXPECT_TRUE(has(log, "share name Data leads through a symbolic link below /mnt/VV/"));
}

// --- walks ---

namespace {

class Walk : public Unmount {
 protected:
  Walk() {
    for (const int target : {1, 2}) {
      for (const int slot : {1, 3}) {
        const std::string base = "/iscsi/initiator/id:" + std::to_string(target);
        const std::string name = std::to_string(target) + "-" + std::to_string(slot);
        fakes::tree_set({{base + "/target", "iqn." + std::to_string(target)},
                         {base + "/lun/id:" + std::to_string(slot) + "/lun", std::to_string(slot)},
                         {base + "/lun/id:" + std::to_string(slot) + "/share", "share-" + name},
                         {base + "/lun/id:" + std::to_string(slot) + "/mnt_dev", "/dev/" + name}});
      }
    }
  }
};

}  // namespace

TEST_F(Walk, StopsAtTheFirstGap) {
  Target_umount_all();
  EXPECT_EQ(fakes::commands(), (Texts{"fuser -mk /dev/1-1", "fuser -mk /dev/2-1"}));
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:1/lun/id:1/status"), "Disable");
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:2/lun/id:1/status"), "Disable");
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:2/lun/id:3/status"), std::nullopt);
}

TEST_F(Walk, StopsAtTheFirstMissingTarget) {
  fakes::tree_set({{"/iscsi/initiator/id:1/target", ""}});
  Target_umount_all();
  EXPECT_TRUE(fakes::commands().empty());
}

TEST_F(Walk, MeetsATargetThatMovesDownMeanwhile) {
  fakes::tree_set({{"/iscsi/initiator/ver", "1"},
                   {"/iscsi/initiator/id:3/target", "iqn.3"},
                   {"/iscsi/initiator/id:3/lun/id:1/lun", "1"},
                   {"/iscsi/initiator/id:3/lun/id:1/share", "share-3"},
                   {"/iscsi/initiator/id:3/lun/id:1/mnt_dev", "/dev/3"}});
  fakes::on("system", "fuser -mk /dev/1-1").does([] { fakes::tree_delete("/iscsi/initiator/id:2"); });
  Target_umount_all();
  EXPECT_EQ(fakes::commands(), (Texts{"fuser -mk /dev/1-1", "fuser -mk /dev/3"}));
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:2/lun/id:1/status"), "Disable");
}

TEST_F(Walk, MeetsATargetThatTakesThePlaceOfTheOneBeforeIt) {
  fakes::tree_set({{"/iscsi/initiator/ver", "1"}});
  fakes::on("system", "fuser -mk /dev/1-1").does([] { fakes::tree_delete("/iscsi/initiator/id:1"); });
  Target_umount_all();
  EXPECT_EQ(fakes::commands(), (Texts{"fuser -mk /dev/1-1", "fuser -mk /dev/2-1"}));
}

TEST_F(Walk, OfOneTarget) {
  EXPECT_EQ(Target_umount_all_lun(2), 0);
  EXPECT_EQ(fakes::commands(), Texts{"fuser -mk /dev/2-1"});
  EXPECT_EQ(Target_umount_all_lun(3), -1);
}

// --- the FTP mount ---

namespace {

class Ftp : public Unmount {
 protected:
  // Makes /proc/mounts a table of these lines.
  static void mounts_are(const std::string& lines) {
    cover("/proc");
    std::ofstream("/proc/mounts") << lines;
  }
  static void real_proc() { uncover("/proc"); }

  char path[512] = "before";
};

}  // namespace

TEST_F(Ftp, TheSecondMountBelowThePublicAreaIsFound) {
  debug_level = 2;
  mounts_are(
      "/dev/sdb1 / ext4 rw 0 0\n"
      "/dev/sdb10 /home/Public/Wrong ext4 rw 0 0\n"
      "/dev/sdb1 /mnt/VV/Data ext4 rw,relatime 0 0\n"
      "/dev/sdb1 /mnt/x/home/Public/a\\040b ext4 rw,relatime 0 0\n"
      "/dev/sdb1 /home/Public/Later ext4 rw,relatime 0 0\n");
  int result = 1;
  log = fakes::output_of([&] { result = get_ftp_share_path(&entry, path); });
  real_proc();
  EXPECT_EQ(result, 0);
  EXPECT_STREQ(path, "/mnt/x/home/Public/a b");
  EXPECT_TRUE(has(log, "found pMntInfo->mnt_fsname = /dev/sdb1"));
  EXPECT_TRUE(has(log, "--> pMntInfo->mnt_dir = /mnt/VV/Data"));
  EXPECT_TRUE(has(log, "--> pMntInfo->mnt_dir = /mnt/x/home/Public/a b"));
}

TEST_F(Ftp, NoSecondMount) {
  mounts_are("/dev/sdb1 /mnt/VV/Data ext4 rw 0 0\n/dev/sdc1 /home/Public/Data ext4 rw 0 0\n");
  const int result = get_ftp_share_path(&entry, path);
  real_proc();
  EXPECT_EQ(result, -104);
  EXPECT_STREQ(path, "");
}

TEST_F(Ftp, NoTable) {
  cover("/proc");
  int result = 0;
  log = fakes::output_of([&] { result = get_ftp_share_path(&entry, path); });
  real_proc();
  EXPECT_EQ(result, -105);
  EXPECT_TRUE(has(log, "Can not open /proc/mounts"));
}

TEST_F(Ftp, TheMountIsTakenDown) {
  debug_level = 1;
  log = fakes::output_of([this] { EXPECT_EQ(Target_umount_ftp(&entry, "/home/Public/a b"), 0); });
  EXPECT_EQ(fakes::commands(), (Texts{"fuser -mk \"/home/Public/a b\"", "umount -f \"/home/Public/a b\""}));
  EXPECT_TRUE(has(log, "start umount ftp"));
  EXPECT_TRUE(has(log, "end umount ftp"));
}

TEST_F(Ftp, EachCommandFailingAlone) {
  debug_level = 1;
  fakes::on("system", "fuser -mk \"/p\"").returns(256).times(1);
  log = fakes::output_of([this] { EXPECT_EQ(Target_umount_ftp(&entry, "/p"), 0); });
  EXPECT_TRUE(has(log, "system() of cmd 'fuser -mk \"/p\"' return code = 256"));
  fakes::on("system", "umount -f \"/p\"").returns(32 << 8);
  log = fakes::output_of([this] { EXPECT_EQ(Target_umount_ftp(&entry, "/p"), -1); });
  EXPECT_TRUE(has(log, "system() of cmd 'umount -f \"/p\"' failed"));
  EXPECT_EQ(fakes::commands().size(), 4u);
}

TEST_F(Ftp, TheMountComesBackThroughTheShareServices) {
  EXPECT_EQ(Target_remount_ftp(&entry, ""), -1);
  EXPECT_TRUE(fakes::commands().empty());
  EXPECT_EQ(Target_remount_ftp(&entry, "/home/Public/a"), 0);
  EXPECT_EQ(fakes::commands(), Texts{"winshare_reload ; macshare_reload"});
}
