#include "support/run_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "support/files.h"
#include "support/text.h"

namespace remvol {

namespace {

// cmake/options.cmake sees to it on 32-bit processors: disks are large, and the year 2038 is near.
static_assert(sizeof(off_t) == 8 && sizeof(time_t) == 8);

constexpr int kPollsPerSecond = 50;
constexpr useconds_t kPoll = 1'000'000 / kPollsPerSecond;

int operation_of(LockMode mode) {
  return mode == LockMode::kShared ? LOCK_SH : LOCK_EX;
}

// Locks, however often a signal comes in between.
bool lock_file(int fd, int operation) {
  while (flock(fd, operation) != 0) {
    if (errno != EINTR) return false;
  }
  return true;
}

}  // namespace

LockName hashed_lock_name(const char* kind, const char* name) {
  return LockName(kLockFormat, kind, name_hash(name));
}

LockTry RunLock::open_and_lock(const char* name, int open_flags, int operation) {
  release();
  if ((open_flags & O_CREAT) != 0 && !claim_folder(kRunDir)) return LockTry::kNone;
  const Text<256> path("%s/%s", kRunDir, name);
  fd_ = open(path, O_RDWR | O_NOFOLLOW | O_CLOEXEC | open_flags, 0600);
  if (fd_ < 0) return LockTry::kNone;
  if (lock_file(fd_, operation)) return LockTry::kTaken;
  const bool busy = errno == EWOULDBLOCK;
  release();
  return busy ? LockTry::kBusy : LockTry::kNone;
}

LockTry RunLock::take(const char* name, LockMode mode) {
  return open_and_lock(name, O_CREAT, operation_of(mode));
}

LockTry RunLock::try_take(const char* name, LockMode mode) {
  return open_and_lock(name, O_CREAT, operation_of(mode) | LOCK_NB);
}

LockTry RunLock::take_in_time(const char* name, LockMode mode, int seconds) {
  LockTry tried = try_take(name, mode);
  for (int polls = 0; tried == LockTry::kBusy && polls < seconds * kPollsPerSecond; polls++) {
    usleep(kPoll);
    tried = try_take(name, mode);
  }
  return tried;
}

LockTry RunLock::try_existing(const char* name, LockMode mode) {
  return open_and_lock(name, 0, operation_of(mode) | LOCK_NB);
}

LockTry RunLock::take_again(const char* name, LockMode mode) {
  return fd_ >= 0 && lock_file(fd_, operation_of(mode)) ? LockTry::kTaken : take(name, mode);
}

// Unlocked by name, not by closing alone: a child that was forked meanwhile shares the open file.
void RunLock::pause() {
  if (fd_ >= 0) flock(fd_, LOCK_UN);
}

long long RunLock::changes() const {
  struct stat info {};
  return fd_ >= 0 && fstat(fd_, &info) == 0 ? info.st_size : 0;
}

void RunLock::count_change() {
  if (fd_ >= 0 && ftruncate(fd_, changes() + 1) != 0) perror(kRunDir);
}

void RunLock::release() {
  if (fd_ < 0) return;
  pause();
  close(fd_);
  fd_ = -1;
}

}  // namespace remvol
