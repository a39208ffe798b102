// Record locks: results, messages, tries. Several real runs at once are in the command line tests.
#include "support/locks.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "run_files.h"
#include "volume_fixture.h"

using namespace remvol;

namespace {

constexpr char kPath[] = "/var/lock/virtual_volume/remvol_recover_queue.lock";

class Locks : public VolumeTest {
 protected:
  Locks() {
    cover("/var/lock");
    debug_level = 2;
  }
  ~Locks() override {
    for (const int fd : opened) close(fd);
    uncover("/var/lock");
  }

  // Runs `what` with both outputs caught; `log` has what it said.
  int call(const std::function<int()>& what) {
    int result = 0;
    log = fakes::output_of([&] {
      testing::internal::CaptureStderr();
      result = what();
      errors = testing::internal::GetCapturedStderr();
    });
    if (result >= 0) opened.push_back(result);
    return result;
  }

  // Whether another process could have the lock now.
  static bool is_free(const char* path) {
    const pid_t child = fork();
    if (child == 0) {
      const int fd = open(path, O_RDWR | O_CLOEXEC);
      struct flock lock {};
      lock.l_type = F_WRLCK;
      _exit(fcntl(fd, F_SETLK, &lock) == 0 ? 0 : 1);
    }
    int status = 0;
    waitpid(child, &status, 0);
    return status == 0;
  }

  std::string log;
  std::string errors;
  std::vector<int> opened;
};

}  // namespace

TEST_F(Locks, TheDirectoryIsMadeForRootAlone) {
  EXPECT_EQ(make_lock_dir(), 0);
  struct stat status {};
  ASSERT_EQ(stat("/var/lock/virtual_volume", &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0700u);
  EXPECT_EQ(make_lock_dir(), 0) << "it exists";
  ASSERT_EQ(chmod("/var/lock/virtual_volume", 0777), 0);
  EXPECT_EQ(make_lock_dir(), 0);
  ASSERT_EQ(stat("/var/lock/virtual_volume", &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0700u);
}

TEST_F(Locks, WhatAStrangerPutInItsPlaceIsReplaced) {
  std::filesystem::create_directory("/var/lock/elsewhere");
  std::filesystem::create_directory_symlink("/var/lock/elsewhere", "/var/lock/virtual_volume");
  EXPECT_EQ(make_lock_dir(), 0);
  EXPECT_TRUE(std::filesystem::is_directory(std::filesystem::symlink_status("/var/lock/virtual_volume")));
  std::filesystem::remove("/var/lock/virtual_volume");
  std::ofstream("/var/lock/virtual_volume") << "x";
  EXPECT_EQ(make_lock_dir(), 0);
  ASSERT_EQ(chown("/var/lock/virtual_volume", 12345, 12345), 0);
  EXPECT_EQ(make_lock_dir(), 0);
  struct stat status {};
  ASSERT_EQ(stat("/var/lock/virtual_volume", &status), 0);
  EXPECT_EQ(status.st_uid, geteuid());
}

// A stranger's folder that can be neither emptied (it is too deep) nor put aside.
TEST_F(Locks, AStrangersDirectoryThatStaysIsNotUsed) {
  std::string below = "/var/lock/virtual_volume";
  for (int depth = 0; depth < 40; depth++) below += "/x";
  std::filesystem::create_directories(below);
  std::filesystem::create_directories("/var/lock/virtual_volume.foreign-" + std::to_string(getpid()) + "/x");
  ASSERT_EQ(chown("/var/lock/virtual_volume", 12345, 12345), 0);
  EXPECT_EQ(call([] { return make_lock_dir(); }), -108);
  EXPECT_EQ(errors, "/var/lock/virtual_volume/: File exists\n");
}

TEST_F(Locks, ADirectoryThatCannotBeMadeIsTold) {
  ASSERT_EQ(mount(nullptr, "/var/lock", nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
  EXPECT_EQ(call([] { return make_lock_dir(); }), -108);
  EXPECT_EQ(errors, "/var/lock/virtual_volume/: Read-only file system\n");
}

TEST_F(Locks, TheRecoverLockExcludesOtherProcesses) {
  ASSERT_EQ(make_lock_dir(), 0);
  const int fd = call([] { return get_recover_cri_flock(); });
  ASSERT_GE(fd, 0);
  EXPECT_TRUE(has(log, "get flock fd = " + std::to_string(fd)));
  EXPECT_EQ(fcntl(fd, F_GETFD), FD_CLOEXEC);
  struct stat status {};
  fstat(fd, &status);
  EXPECT_EQ(status.st_mode & 07777, 0600u);
  EXPECT_FALSE(is_free(kRecoverLock));
  EXPECT_EQ(unlock_recover_cri_flock(fd), 0);
  EXPECT_EQ(fcntl(fd, F_GETFD), -1) << "closed";
  EXPECT_TRUE(is_free(kRecoverLock));
}

TEST_F(Locks, TheRecoverLockIsTriedOnce) {
  ASSERT_EQ(make_lock_dir(), 0);
  const std::pair<int, int> rows[] = {{EAGAIN, -1}, {EACCES, -1}, {ENOLCK, -10}, {EBADF, -10}};
  for (const auto& [error, result] : rows) {
    fakes::on("fcntl", "lock").returns(-1).error(error).times(1);
    EXPECT_EQ(call([] { return get_recover_cri_flock(); }), result);
  }
  EXPECT_EQ(fakes::calls({"fcntl"}).size(), 4u);
}

TEST_F(Locks, TheRecoverLockNeedsItsDirectory) {
  EXPECT_EQ(call([] { return get_recover_cri_flock(); }), -108);
  EXPECT_EQ(errors, "/var/lock/virtual_volume/remvol_recover.lock: No such file or directory\n");
}

TEST_F(Locks, UnlockingTellsWhatFailedAndCloses) {
  const struct {
    int error;
    int result;
    const char* message;
  } rows[] = {{EAGAIN, -1, "access fail"},
              {EACCES, -1, "access fail"},
              {EBADF, -2, "wrong fd"},
              {ENOLCK, -10, "others fail"}};
  for (const auto& row : rows) {
    for (const bool recover : {false, true}) {
      fakes::on("fcntl", "unlock").returns(-1).error(row.error).times(1);
      const int fd = open("/dev/null", O_RDWR | O_CLOEXEC);
      EXPECT_EQ(call([&] { return recover ? unlock_recover_cri_flock(fd) : unlock_flock(fd); }), row.result);
      EXPECT_EQ(static_cast<bool>(has(log, row.message)), !recover || row.error == EBADF) << row.message;
      EXPECT_EQ(fcntl(fd, F_GETFD), -1) << "closed";
    }
  }
  EXPECT_EQ(call([] { return unlock_flock(-1); }), -2);
  EXPECT_EQ(call([] { return unlock_recover_cri_flock(-1); }), -2);
}

TEST_F(Locks, AFreeLockIsTakenAtOnce) {
  ASSERT_EQ(make_lock_dir(), 0);
  const int fd = call([] { return wait_flock(kPath, 3, 100000); });
  ASSERT_GE(fd, 0);
  EXPECT_TRUE(has(log, "get flock fd = " + std::to_string(fd)));
  EXPECT_EQ(fcntl(fd, F_GETFD), FD_CLOEXEC);
  EXPECT_EQ(fakes::calls({"fcntl", "usleep"}), Texts{"fcntl lock"});
  EXPECT_FALSE(is_free(kPath));
}

TEST_F(Locks, AHeldLockIsTriedFiveTimesWithFourWaits) {
  ASSERT_EQ(make_lock_dir(), 0);
  fakes::on("fcntl", "lock").returns(-1).error(EAGAIN);
  EXPECT_EQ(call([] { return wait_flock(kPath, 3, 100000); }), -1);
  EXPECT_EQ(fakes::calls({"fcntl"}).size(), 5u);
  const Texts waits = fakes::calls({"usleep"});
  ASSERT_EQ(waits.size(), 4u);
  for (const std::string& wait : waits) {
    EXPECT_LT(std::stoi(wait.substr(7)), 100000);
    EXPECT_TRUE(has(log, "wait " + wait.substr(7) + " mirco seconds"));
  }
}

TEST_F(Locks, NoTwoRunsWaitAlike) {
  ASSERT_EQ(make_lock_dir(), 0);
  fakes::on("fcntl", "lock").returns(-1).error(EAGAIN);
  call([] { return wait_flock(kPath, 3, 100000); });
  const Texts first = fakes::calls({"usleep"});
  call([] { return wait_flock(kPath, 3, 100000); });
  const Texts both = fakes::calls({"usleep"});
  ASSERT_EQ(both.size(), 8u);
  EXPECT_NE(first, Texts(both.begin() + 4, both.end()));
}

TEST_F(Locks, ALockOfTheLastAttemptCountsAsNotHad) {
  ASSERT_EQ(make_lock_dir(), 0);
  fakes::on("fcntl", "lock").returns(-1).error(EACCES).times(4);
  EXPECT_EQ(call([] { return wait_flock(kPath, 3, 100000); }), -1);
  EXPECT_FALSE(is_free(kPath)) << "it stays taken until the process ends";
}

TEST_F(Locks, ALockOfTheFourthAttemptIsHad) {
  ASSERT_EQ(make_lock_dir(), 0);
  fakes::on("fcntl", "lock").returns(-1).error(EACCES).times(3);
  EXPECT_GE(call([] { return wait_flock(kPath, 3, 100000); }), 0);
}

TEST_F(Locks, AnotherErrorIsTriedAgainAtOnceAndTold) {
  ASSERT_EQ(make_lock_dir(), 0);
  fakes::on("fcntl", "lock").returns(-1).error(ENOLCK).times(20);
  EXPECT_EQ(call([] { return wait_flock(kPath, 3, 100000); }), -10) << "although the lock came in the end";
  EXPECT_EQ(fakes::calls({"fcntl"}).size(), 21u);
  EXPECT_TRUE(fakes::calls({"usleep"}).empty());
  fakes::on("fcntl", "lock").returns(-1).error(ENOLCK).times(1);
  fakes::on("fcntl", "lock").returns(-1).error(EAGAIN);
  EXPECT_EQ(call([] { return wait_flock(kPath, 3, 100000); }), -1) << "the retries ran out";
}

TEST_F(Locks, NegativeBoundsCountAsZero) {
  ASSERT_EQ(make_lock_dir(), 0);
  EXPECT_GE(call([] { return wait_flock(kPath, -5, -5); }), 0);
  fakes::on("fcntl", "lock").returns(-1).error(EAGAIN);
  EXPECT_EQ(call([] { return wait_flock(kPath, -5, 100); }), -1);
  EXPECT_EQ(fakes::calls({"usleep"}).size(), 1u);
}

TEST_F(Locks, AFileThatCannotBeOpened) {
  EXPECT_EQ(call([] { return wait_flock(kPath, 3, 100000); }), -108);
  EXPECT_EQ(errors, "");
}
