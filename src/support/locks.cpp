#include "support/locks.h"

#include <fcntl.h>
#include <sys/ipc.h>
#include <sys/sem.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>

#include "frontend/log.h"
#include "support/files.h"
#include "support/result.h"

namespace remvol {

namespace {

// Results of the record-lock operations.
enum LockResult : int { kHeldElsewhere = -1, kBadDescriptor = -2, kLockError = -10 };

constexpr key_t kFormatSemKey = 90111;
constexpr int kFormatSemMode = 0666;

// semctl(2) leaves the definition of its fourth argument to the caller.
union semun {
  int val;
  semid_ds* buf;
  unsigned short* array;
};

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
  return open(path, O_RDWR | O_CREAT | O_CLOEXEC, 0600);
}

int change_semaphore(int sem_id, short by) {
  sembuf operation{0, by, SEM_UNDO};
  return semop(sem_id, &operation, 1);
}

// Makes the semaphore set and gives it its value. The create is not exclusive: two runs that found it missing
// at the same moment may both set the value, and both format then. That costs memory and time, not data,
// since they format different volumes.
int create_format_sem(int initial, Caller caller) {
  LOG_AT(caller, 2, "try to semget(%d 1, 0666 | IPC_CREATE )", kFormatSemKey);
  const int sem_id = semget(kFormatSemKey, 1, IPC_CREAT | kFormatSemMode);
  if (sem_id == -1) {
    LOG_AT(caller, 0, "semget(..., IPC_CREATE ) failed");
    return -1;
  }
  semun value{};
  value.val = initial > 0 ? initial : 1;
  LOG_AT(caller, 2, "try to semctl(%d,0,SETVAL, %d )", sem_id, value.val);
  if (semctl(sem_id, 0, SETVAL, value) != -1) return sem_id;
  LOG_AT(caller, 0, "semctl() failed, errno = %d", errno);
  semctl(sem_id, 0, IPC_RMID);
  return -1;
}

// Returns the id of the format semaphore, made when missing, or -1.
int find_format_sem(int initial, Caller caller) {
  const int sem_id = semget(kFormatSemKey, 1, kFormatSemMode);
  if (sem_id != -1) return sem_id;
  const int error = errno;
  LOG_AT(caller, 0, "semget(...) == -1, errno = %d", error);
  if (error == ENOENT || error == EIDRM) return create_format_sem(initial, caller);
  LOG_AT(caller, 0, "semget() failed");
  return -1;
}

}  // namespace

int make_lock_dir() {
  if (make_dir_include_parent(kLockDir, 0700) == 0) return kOk;
  perror(kLockDir);
  return kLockFileFailed;
}

int get_recover_cri_flock() {
  const int fd = open_lock_file(kRecoverLock);
  if (fd < 0) {
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
  const int result = set_record_lock(fd, F_UNLCK);
  if (result == kBadDescriptor) LOG(2, "wrong fd");
  close(fd);
  return result;
}

int wait_flock(const char* path, int max_retries, int max_wait_us) {
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
  int error = kOk;
  for (int result; (result = set_record_lock(fd, F_WRLCK)) != kOk && retries <= max_retries;) {
    if (result != kHeldElsewhere) {
      error = kLockError;
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
  const int result = set_record_lock(fd, F_UNLCK);
  if (result == kHeldElsewhere) LOG(2, "access fail");
  if (result == kBadDescriptor) LOG(2, "wrong fd");
  if (result == kLockError) LOG(2, "others fail");
  close(fd);
  return result;
}

int format_sem_P(int* sem_id, int initial) {
  const int found = find_format_sem(initial, Caller());
  if (found == -1) return -1;
  *sem_id = found;
  LOG(2, "get sem_id = %d", found);
  LOG(2, "try to get a sem, sem_id = %d, trying......", found);
  if (change_semaphore(found, -1) != 0) {
    LOG(0, "set sem failed");
    return -2;
  }
  LOG(1, "pid = %lu, go into format critical section ...", static_cast<unsigned long>(getpid()));
  return 0;
}

int format_sem_V(int* sem_id) {
  const int waiting = semctl(*sem_id, 0, GETNCNT);
  LOG(2, "fmt_semncnt = %d", waiting);
  if (waiting < 1) {
    LOG(2, "try to remove a sem,sem_key = %d, using sem_id = %d, trying......", kFormatSemKey, *sem_id);
    if (semctl(*sem_id, 0, IPC_RMID) == 0) {
      *sem_id = -1;
      return 0;
    }
    LOG(0, "remove sem_id failed, errno = %d", errno);
  }
  LOG(2, "try to RELEASE a sem, sem_id = %d, trying......", *sem_id);
  if (change_semaphore(*sem_id, 1) == 0) return 0;
  LOG(0, "release sem failed");
  return -2;
}

}  // namespace remvol
