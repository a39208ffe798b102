// Locks between runs: the lock files, holding a target, and temporary files for one run at a time.
#include <poll.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <string>

#include "iscsi/session.h"
#include "support/disk_look.h"
#include "support/lun_list.h"
#include "support/run_lock.h"
#include "support/session_hold.h"
#include "support/target_hold.h"
#include "support/temp_file.h"
#include "tree/slots.h"
#include "volume/format.h"
#include "volume/lun_status.h"
#include "volume/mount_point.h"
#include "volume/unmount.h"
#include "volume_fixture.h"

using namespace remvol;

namespace {

class RunLocks : public VolumeTest {
 protected:
  RunLocks() { cover("/run"); }
  ~RunLocks() override {
    if (run_ > 0) end_run();
    uncover("/run");
  }

  // Starts another run that does `hold` and waits until it has.
  void start_run(const std::function<void()>& hold) {
    int ready[2];
    ASSERT_EQ(pipe(ready), 0);
    run_ = fork();
    if (run_ == 0) {
      const std::function<void()> wait = [&] {
        (void)!write(ready[1], "x", 1);
        for (;;) pause();
      };
      held_then_ = &wait;
      hold();
      _exit(0);
    }
    char byte = 0;
    ASSERT_EQ(read(ready[0], &byte, 1), 1);
    close(ready[0]);
    close(ready[1]);
  }

  // What the other run does while it holds what it holds: it waits to be killed.
  static void stay() { (*held_then_)(); }

  void end_run() {
    kill(run_, SIGKILL);
    waitpid(run_, nullptr, 0);
    run_ = 0;
  }

 private:
  static inline const std::function<void()>* held_then_ = nullptr;
  pid_t run_ = 0;
};

TEST_F(RunLocks, ALockIsHadByOneRunAtATime) {
  start_run([] {
    RunLock lock;
    lock.take("a.lock", LockMode::kExclusive);
    stay();
  });
  RunLock lock;
  EXPECT_EQ(lock.try_take("a.lock", LockMode::kExclusive), LockTry::kBusy);
  EXPECT_EQ(lock.try_take("a.lock", LockMode::kShared), LockTry::kBusy);
  EXPECT_EQ(lock.try_take("b.lock", LockMode::kExclusive), LockTry::kTaken);
  end_run();
  EXPECT_EQ(lock.try_take("a.lock", LockMode::kExclusive), LockTry::kTaken);
}

TEST_F(RunLocks, TheFolderAndItsFilesAreRootsAlone) {
  RunLock lock;
  lock.take("a.lock", LockMode::kExclusive);
  struct stat found;
  ASSERT_EQ(stat("/run/remvol", &found), 0);
  EXPECT_EQ(found.st_mode & 07777, 0700U);
  ASSERT_EQ(stat("/run/remvol/a.lock", &found), 0);
  EXPECT_EQ(found.st_mode & 07777, 0600U);
}

TEST_F(RunLocks, ALinkInTheLocksPlaceIsNotFollowed) {
  std::filesystem::create_directory("/run/remvol");
  std::filesystem::create_symlink("/run/victim", "/run/remvol/a.lock");
  RunLock lock;
  EXPECT_EQ(lock.take("a.lock", LockMode::kExclusive), LockTry::kNone);
  EXPECT_FALSE(std::filesystem::exists("/run/victim"));
}

TEST_F(RunLocks, AProgramThatIsStartedDoesNotKeepTheLock) {
  start_run([] {
    RunLock lock;
    lock.take("a.lock", LockMode::kExclusive);
    const pid_t daemon = fork();
    if (daemon == 0) execl("/bin/sleep", "sleep", "2", nullptr);
    poll(nullptr, 0, 200);
    stay();
  });
  end_run();
  RunLock lock;
  EXPECT_EQ(lock.try_take("a.lock", LockMode::kExclusive), LockTry::kTaken);
}

TEST_F(RunLocks, ATargetThatIsBroughtUpIsNotIdle) {
  EXPECT_FALSE(IdleTarget("iqn.t1"));  // no run has ever held it
  start_run([] {
    const TargetHold hold("iqn.t1");
    stay();
  });
  EXPECT_FALSE(IdleTarget("iqn.t1"));
  EXPECT_FALSE(IdleTarget("iqn.t1", 1));
  EXPECT_FALSE(IdleTarget("iqn.t2"));
  end_run();
  EXPECT_TRUE(IdleTarget("iqn.t1"));
  EXPECT_TRUE(IdleTarget("iqn.t1", 1));
}

TEST_F(RunLocks, LunsOfOneTargetAreBroughtUpSideBySide) {
  start_run([] {
    const TargetHold hold("iqn.t1", 1);
    stay();
  });
  const TargetHold other("iqn.t1", 2);
  EXPECT_FALSE(other.waited());
  EXPECT_FALSE(IdleTarget("iqn.t1"));
  EXPECT_FALSE(IdleTarget("iqn.t1", 1));
}

TEST_F(RunLocks, AnIdleLunBesideABusyOne) {
  start_run([] {
    const TargetHold hold("iqn.t1", 1);
    stay();
  });
  EXPECT_TRUE(IdleTarget("iqn.t1", 2));
}

// Returns whether the process comes to wait for a lock: the kernel lists who waits behind "->",
// proc_locks(5).
bool comes_to_wait(pid_t process) {
  const fakes::Expression waits{"-> FLOCK +ADVISORY +[A-Z]+ +" + std::to_string(process) + " "};
  for (int looks = 0; looks < 1000; looks++) {
    std::ifstream locks("/proc/locks");
    const std::string listed((std::istreambuf_iterator<char>(locks)), {});
    if (fakes::match(waits, listed)) return true;
    poll(nullptr, 0, 10);
  }
  return false;
}

TEST_F(RunLocks, AWaitingRunGoesOnWhenTheHolderIsKilled) {
  start_run([] {
    const TargetHold hold("iqn.t1");
    stay();
  });
  const pid_t waiter = fork();
  if (waiter == 0) {
    const TargetHold hold("iqn.t1");
    _exit(hold.waited() ? 0 : 1);
  }
  EXPECT_TRUE(comes_to_wait(waiter));
  int status = -1;
  EXPECT_EQ(waitpid(waiter, &status, WNOHANG), 0);
  end_run();
  waitpid(waiter, &status, 0);
  EXPECT_EQ(status, 0);
}

TEST_F(RunLocks, AnIdleLunThatNoRunHasHeldBeforeIsHeldAllTheSame) {
  mark_target("iqn.t1");
  pid_t waiter = -1;
  {
    const IdleTarget idle("iqn.t1", 2);
    EXPECT_TRUE(idle);
    waiter = fork();
    if (waiter == 0) _exit(TargetHold("iqn.t1", 2).waited() ? 0 : 1);
    EXPECT_TRUE(comes_to_wait(waiter));
  }
  int status = -1;
  waitpid(waiter, &status, 0);
  EXPECT_EQ(status, 0);
}

TEST_F(RunLocks, AHeldTargetIsHeldOn) {
  const TargetHold outer("iqn.t1");
  {
    const TargetHold inner("iqn.t1");
    EXPECT_FALSE(inner.waited());
  }
  const pid_t other = fork();
  if (other == 0) {
    RunLock lock;
    _exit(IdleTarget("iqn.t1") ? 1 : 0);
  }
  int status = 0;
  waitpid(other, &status, 0);
  EXPECT_EQ(status, 0);
}

int asked = 0;

TEST_F(RunLocks, ARunThatTakesAwayWaitsOnlyForAsLongAsItMay) {
  start_run([] {
    const TargetHold hold("iqn.t1");
    stay();
  });
  asked = 0;
  const BriefTargetHold hold("iqn.t1",
                             [](const char* name) { return strcmp(name, "iqn.t1") == 0 && ++asked < 3; });
  EXPECT_EQ(asked, 3);
  EXPECT_EQ(fakes::calls(), (Texts{"usleep 100000", "usleep 100000"}));
}

TEST_F(RunLocks, ARunThatTakesAwayWaitsAMinuteAtMost) {
  start_run([] {
    const TargetHold hold("iqn.t1");
    stay();
  });
  const BriefTargetHold hold("iqn.t1", [](const char*) { return true; });
  EXPECT_EQ(fakes::calls().size(), 600U);
}

TEST_F(RunLocks, ARunThatTakesAwayKeepsOthersFromBringingUp) {
  const BriefTargetHold hold("iqn.t1", [](const char*) { return true; });
  const pid_t other = fork();
  if (other == 0) {
    RunLock lock;
    _exit(IdleTarget("iqn.t1") ? 1 : 0);
  }
  int status = 0;
  waitpid(other, &status, 0);
  EXPECT_EQ(status, 0);
}

// Whether another run could use, or change, the slots now.
bool another_run_can(SlotsHeld::Purpose purpose) {
  const pid_t other = fork();
  if (other == 0) {
    RunLock lock;
    const LockMode mode = purpose == SlotsHeld::kUse ? LockMode::kShared : LockMode::kExclusive;
    _exit(lock.try_take("slots.lock", mode) == LockTry::kTaken ? 0 : 1);
  }
  int status = 0;
  waitpid(other, &status, 0);
  return status == 0;
}

TEST_F(RunLocks, RunsShareTheirUseOfTheSlotsAndOneAloneChangesThem) {
  {
    const SlotsHeld held;
    EXPECT_TRUE(another_run_can(SlotsHeld::kUse));
    EXPECT_FALSE(another_run_can(SlotsHeld::kChange));
  }
  {
    SlotsHeld held(SlotsHeld::kChange);
    { const SlotsHeld inner; }
    EXPECT_FALSE(another_run_can(SlotsHeld::kUse));
    held.let_go();
    EXPECT_TRUE(another_run_can(SlotsHeld::kChange));
    held.take();
    EXPECT_FALSE(another_run_can(SlotsHeld::kUse));
  }
  EXPECT_TRUE(another_run_can(SlotsHeld::kChange));
}

TEST_F(RunLocks, ASessionIsKeptByAsManyAsNeedItAndClosedBesideAnother) {
  start_run([] {
    const SessionKept kept("iqn.t1");
    stay();
  });
  { const SessionKept kept("iqn.t1"); }
  { const SessionClosing closing("iqn.t2"); }
  EXPECT_TRUE(fakes::calls().empty()) << "nothing was waited for";
}

TEST_F(RunLocks, ASessionThatIsKeptIsNotClosedBeforeAMinute) {
  start_run([] {
    const SessionKept kept("iqn.t1");
    stay();
  });
  { const SessionClosing closing("iqn.t1"); }
  EXPECT_EQ(fakes::calls(), Texts(3000, "usleep 20000"));
  { const SessionClosing closing(nullptr); }
  EXPECT_EQ(fakes::calls().size(), 6000U);
}

TEST_F(RunLocks, WhileSessionsAreClosedNoneIsKept) {
  start_run([] {
    const SessionClosing closing(nullptr);
    stay();
  });
  { const SessionKept kept("iqn.t1"); }
  EXPECT_FALSE(fakes::calls().empty());
}

TEST_F(RunLocks, WhoClosesASessionMayUseItsDisks) {
  const SessionClosing closing("iqn.t1");
  { const SessionKept kept("iqn.t1"); }
  EXPECT_TRUE(fakes::calls().empty());
  const pid_t other = fork();
  if (other == 0) {
    RunLock lock;
    const LockName name = hashed_lock_name("session", "iqn.t1");
    _exit(lock.try_take(name, LockMode::kShared) == LockTry::kBusy ? 0 : 1);
  }
  int status = -1;
  waitpid(other, &status, 0);
  EXPECT_EQ(status, 0) << "still closed to others";
}

TEST_F(RunLocks, LoginsGoOnSideBySideAndAreWaitedForSomeSeconds) {
  start_run([] {
    const LoginUnderWay login;
    stay();
  });
  { const LoginUnderWay login; }
  EXPECT_TRUE(fakes::calls().empty());
  LoginsHeldOff logins;
  logins.begin();
  EXPECT_EQ(fakes::calls(), Texts(250, "usleep 20000"));
}

TEST_F(RunLocks, LoginsThatAreHeldOffWait) {
  start_run([] {
    LoginsHeldOff logins;
    logins.begin();
    stay();
  });
  { const LoginUnderWay login; }
  EXPECT_EQ(fakes::calls().size(), 3000U);
}

TEST_F(RunLocks, WhoeverLooksAtADiskIsNotEndedAsItsUser) {
  store_entry();
  fakes::tree_set({{lun("mnt_dev"), "/dev/sdb1"}});
  copy_text(entry.mnt_dev, "/dev/sdb1");
  start_run([] {
    const DiskLook look("/dev/sdb1");
    stay();
  });
  { const DiskLook beside("/dev/sdb1"); }
  { const DiskLooksHeldOff another("/dev/sdc1"); }
  EXPECT_TRUE(fakes::calls().empty());
  EXPECT_EQ(Target_LUN_umount(&entry), 0);
  const Texts calls = fakes::calls();
  ASSERT_EQ(calls.size(), 251U) << "5 seconds, then it goes on";
  EXPECT_EQ(calls.front(), "usleep 20000");
  EXPECT_EQ(calls.back(), "system fuser -mk /dev/sdb1");
}

TEST_F(RunLocks, AFormatWaitsForLooksBeforeItEndsTheUsers) {
  store_entry();
  fakes::otherwise("sys_get_fs_type", "/dev/sdb1").returns(-1);
  fakes::otherwise("popen").text("");
  start_run([] {
    const DiskLook look("/dev/sdb1");
    stay();
  });
  EXPECT_EQ(Target_format(&entry, "/dev/sdb1"), 0);
  const Texts calls = fakes::calls();
  const auto end = std::find(calls.begin(), calls.end(), "system fuser -mk \"/dev/sdb1\"");
  ASSERT_NE(end, calls.end());
  EXPECT_EQ(std::count(calls.begin(), end, "usleep 20000"), 250);
}

TEST_F(RunLocks, ADiskWhoseUsersAreEndedIsNotLookedAt) {
  store_entry();
  fakes::tree_set({{lun("enable"), "1"}});
  fakes::on("sys_get_fs_type").returns(-1);
  copy_text(entry.mnt_dev, "/dev/sdb1");
  start_run([] {
    const DiskLooksHeldOff kept_off("/dev/sdb1");
    stay();
  });
  EXPECT_EQ(ktree_update_lun_status(&entry, 0), 0);
  EXPECT_EQ(fakes::calls({"usleep"}).size(), 750U);
}

TEST_F(RunLocks, ASearchIsNotEndedAsAUserOfTheDiskThatItFinds) {
  cover("/dev");
  std::ofstream("/dev/sdb1") << "";
  fakes::on("system", fakes::Expression{"^iscsiadm -m session -P 3"}).does([] {
    const std::string command = fakes::commands().back();
    const size_t from = command.find('>') + 1;
    std::ofstream(command.substr(from, command.find(' ', from) - from))
        << "Target: iqn.t\n\t\tiSCSI Session State: LOGGED_IN\n\t\tHost Number: 7\tState: running\n"
           "\t\tscsi7 Channel 00 Id 0 Lun: 0\n\t\t\tAttached scsi disk sdb\t\tState: running\n";
  });
  fakes::on("sys_get_disk_space").returns(2000000000);
  fakes::on("sys_get_fs_type").text("ext4").returns(0);
  start_run([] {
    const DiskLooksHeldOff kept_off("/dev/sdb1");
    stay();
  });
  LunNode* luns = nullptr;
  EXPECT_EQ(_get_sess_lun_list(&luns, "iqn.t", [](const char*) { return kOk; }), 0);
  uncover("/dev");
  ASSERT_NE(luns, nullptr);
  EXPECT_EQ(luns->fs_type, std::string("ext4"));
  lun_node_free_list(luns);
  EXPECT_EQ(fakes::calls({"usleep"}).size(), 750U);
}

TEST_F(RunLocks, MountPointsBelowOneFolderAreHeldTogetherForAMinuteAtMost) {
  start_run([] {
    const MountPointHold hold("/mnt/VV/a");
    stay();
  });
  for (const char* path : {"/mnt/VV/b", "/mnt/VV/ab", "/mnt/VV/.a/a", "/mnt/VV/..a"}) {
    EXPECT_FALSE(MountPointHold(path).is_anothers(path));
  }
  EXPECT_TRUE(fakes::calls().empty());
  size_t waits = 0;
  for (const char* path : {"/mnt/VV/a", "/mnt/VV/a/b", "/mnt/VV/./a", "/mnt/VV//.//./a/", "/mnt/VV/a/."}) {
    const std::string log = fakes::output_of([=] { EXPECT_TRUE(MountPointHold(path).is_anothers(path)); });
    EXPECT_TRUE(has(log, std::string(path) + " is neither made nor removed, another run is at work there"));
    EXPECT_EQ(fakes::calls().size(), waits += 3000);
  }
  end_run();
  EXPECT_FALSE(MountPointHold("/mnt/VV/a").is_anothers("/mnt/VV/a"));
}

TEST_F(RunLocks, AMountPointAtWhichAnotherRunWorksIsNotTakenAway) {
  store_entry();
  copy_text(entry.mnt_dev, "/dev/sdb1");
  cover("/mnt");
  std::filesystem::create_directories("/mnt/VV/Data");
  fakes::on("sys_mount_point").returns(1);
  start_run([] {
    const MountPointHold hold("/mnt/VV/Data");
    stay();
  });
  EXPECT_EQ(Target_LUN_umount(&entry), -1);
  uncover("/mnt");
  EXPECT_EQ(fakes::commands(), Texts{"fuser -mk /dev/sdb1"});
}

TEST_F(RunLocks, WhereNoLockCanBeHadTheMountPointIsNobodys) {
  ASSERT_EQ(mount(nullptr, "/run", nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
  EXPECT_FALSE(MountPointHold("/mnt/VV/a").is_anothers("/mnt/VV/a"));
}

class TempFiles : public RunLocks {
 protected:
  TempFiles() { cover("/tmp"); }
  ~TempFiles() override { uncover("/tmp"); }
};

TEST_F(TempFiles, WhatIsPlantedAtTheNameIsNotWrittenThrough) {
  std::ofstream("/tmp/victim") << "kept";
  std::filesystem::create_symlink("/tmp/victim", "/tmp/x.tmp");
  const TempFile file("/tmp/x.tmp");
  EXPECT_STREQ(file.path(), "/tmp/x.tmp");
  struct stat found;
  ASSERT_EQ(lstat("/tmp/x.tmp", &found), 0);
  EXPECT_TRUE(S_ISREG(found.st_mode));
  EXPECT_EQ(found.st_mode & 07777, 0600U);
  std::ofstream("/tmp/x.tmp") << "listing";
  EXPECT_EQ(std::filesystem::file_size("/tmp/victim"), 4U);
}

TEST_F(TempFiles, AnOldListingIsNotReadAgain) {
  std::ofstream("/tmp/x.tmp") << "old";
  const TempFile file("/tmp/x.tmp");
  EXPECT_EQ(std::filesystem::file_size("/tmp/x.tmp"), 0U);
}

TEST_F(TempFiles, AnotherRunGetsAFileOfItsOwn) {
  start_run([] {
    const TempFile file("/tmp/x.tmp");
    std::ofstream("/tmp/x.tmp") << "theirs";
    stay();
  });
  std::string path;
  {
    const TempFile file("/tmp/x.tmp");
    path = file.path();
    EXPECT_EQ(path, "/tmp/x.tmp." + std::to_string(getpid()));
    std::ofstream(path) << "ours";
  }
  EXPECT_FALSE(std::filesystem::exists(path));
  EXPECT_EQ(std::filesystem::file_size("/tmp/x.tmp"), 6U);
}

}  // namespace
