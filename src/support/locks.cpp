#include "support/locks.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>

#include "frontend/log.h"
#include "run_files.h"
#include "support/files.h"
#include "support/result.h"
#include "support/text.h"

namespace remvol {

namespace {

// Results of the record-lock operations.
enum LockResult : int { kHeldElsewhere = -1, kBadDescriptor = -2, kLockError = -10 };

// An error that does not go away, such as a lock table that is full, must not keep a run for ever.
constexpr int kMaxLockErrors = 100;

// Sets `type` (F_WRLCK or F_UNLCK) on the whole file without blocking. Returns 0 or a LockResult; errno
// stays.
int set_record_lock(int fd, short type) {
  struct flock lock {};
  lock.l_type = type;
  lock.l_whence = SEEK_SET;
  if (fcntl(fd, F_SETLK, &lock) == 0) return kOk;
  if (errno == EAGAIN || errno == EACCES) return kHeldElsewhere;
  return errno == EBADF ? kBadDescriptor : kLockError;
}

int open_lock_file(const char* path) {
  return open(path, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600);
}

}  // namespace

int make_lock_dir() {
  // Where everybody may make folders (a /var/lock of mode 1777) it may be somebody else's.
  const Text<sizeof kLockDir> folder("%.*s", static_cast<int>(sizeof kLockDir - 2), kLockDir);
  if (make_dir_include_parent(folder, 0700) == 0 && claim_folder(folder)) return kOk;
  begin_line(0, stderr);
  perror(kLockDir);
  return kLockFileFailed;
}

int get_recover_cri_flock() {
  const LogScope scope;
  const int fd = open_lock_file(kRecoverLock);
  if (fd < 0) {
    begin_line(0, stderr);
    perror(kRecoverLock);
    return kLockFileFailed;
  }
  const int result = set_record_lock(fd, F_WRLCK);
  if (result == kOk) {
    LOG(2, "get flock fd = %d", fd);
    return fd;
  }
  // The descriptor stays open: this run is about to end, and closing it would drop a lock that the process
  // holds on the file through another descriptor.
  return result == kHeldElsewhere ? kHeldElsewhere : kLockError;
}

int unlock_recover_cri_flock(int fd) {
  const LogScope scope;
  const int result = set_record_lock(fd, F_UNLCK);
  if (result == kBadDescriptor) LOG(2, "wrong fd");
  close(fd);
  return result;
}

int wait_flock(const char* path, int max_retries, int max_wait_us) {
  const LogScope scope;
  // Of the current time the part that differs between runs which one event started in the same second: with
  // the same waits they would meet again at every try.
  timespec now;
  clock_gettime(CLOCK_REALTIME, &now);
  srand(static_cast<unsigned>(now.tv_nsec));
  if (max_retries < 0) max_retries = 0;
  if (max_wait_us < 0) max_wait_us = 0;
  const int fd = open_lock_file(path);
  if (fd < 0) return kLockFileFailed;
  int retries = 0;
  int errors = 0;
  int error = kOk;
  for (int result; (result = set_record_lock(fd, F_WRLCK)) != kOk && retries <= max_retries;) {
    if (result != kHeldElsewhere) {
      error = kLockError;
      if (++errors == kMaxLockErrors) break;
      continue;
    }
    retries++;
    const int wait = max_wait_us > 0 ? rand() % max_wait_us : 0;
    LOG(2, "wait %d mirco seconds", wait);
    usleep(static_cast<useconds_t>(wait));
  }
  // A lock that came with the last attempt or after an error counts as not had: the caller gives up and ends,
  // which releases it.
  if (retries > max_retries) return kHeldElsewhere;
  if (error != kOk) return error;
  LOG(2, "get flock fd = %d", fd);
  return fd;
}

int unlock_flock(int fd) {
  const LogScope scope;
  const int result = set_record_lock(fd, F_UNLCK);
  if (result == kHeldElsewhere) LOG(2, "access fail");
  if (result == kBadDescriptor) LOG(2, "wrong fd");
  if (result == kLockError) LOG(2, "others fail");
  close(fd);
  return result;
}

}  // namespace remvol
