#include "support/format_semaphore.h"

#include <sys/ipc.h>
#include <sys/sem.h>
#include <unistd.h>

#include <cerrno>

#include "frontend/log.h"
#include "support/run_lock.h"

namespace remvol {

namespace {

constexpr key_t kFormatSemKey = 90111;
constexpr int kFormatSemMode = 0666;
constexpr int kOwnMode = 0600;    // what a set of ours is left with
constexpr int kMaxReplaced = 16;  // others may be quick to make another one, or to remove it

int held_sem_id = -1;  // the set that this process has taken and not left

// semctl(2) leaves the definition of its fourth argument to the caller.
union semun {
  int val;
  semid_ds* buf;
  unsigned short* array;
};

int change_semaphore(int sem_id, short by) {
  sembuf operation{0, by, SEM_UNDO};
  return semop(sem_id, &operation, 1);
}

bool read_status(int sem_id, semid_ds* status) {
  semun argument{};
  argument.buf = status;
  return semctl(sem_id, 0, IPC_STAT, argument) == 0;
}

// Returns the id of the set, or -1 with errno. The id of a set that is closed to us is told as well, by a
// call that asks for no permission: the units keep CAP_IPC_OWNER from a run, but what it may not use it may
// remove.
int get_set(int flags) {
  const int sem_id = semget(kFormatSemKey, 1, flags);
  if (sem_id != -1 || errno != EACCES) return sem_id;
  const int closed = semget(kFormatSemKey, 0, 0);
  errno = EACCES;
  return closed;
}

// Removes a set that another user made or was given: whoever may change it can keep every format waiting.
// Returns whether it was one.
bool remove_stranger(int sem_id) {
  semid_ds status{};
  if (read_status(sem_id, &status)) {
    if (status.sem_perm.uid == geteuid() && status.sem_perm.cuid == geteuid()) return false;
    LOG(0, "the format semaphore belongs to user %u, it is replaced", status.sem_perm.cuid);
  } else {
    if (errno != EACCES) return false;
    LOG(0, "the format semaphore belongs to another user, it is replaced");
  }
  semctl(sem_id, 0, IPC_RMID);
  return true;
}

// Returns the id of a set that no other user made, or -1 with errno.
int get_own_set(int flags) {
  for (int i = 0; i < kMaxReplaced; i++) {
    const int sem_id = get_set(flags);
    if (sem_id == -1 || !remove_stranger(sem_id)) return sem_id;
  }
  errno = EACCES;
  return -1;
}

// Takes a set of ours from all other users. It has no value yet, so nobody has it.
void close_to_others(int sem_id) {
  semid_ds status{};
  if (!read_status(sem_id, &status)) return;
  status.sem_perm.mode = kOwnMode;
  semun argument{};
  argument.buf = &status;
  semctl(sem_id, 0, IPC_SET, argument);
}

// Returns the id of a new set, or -1 with errno. Whoever waits for it already would have it before us, and
// need never leave: that set is thrown away.
int make_own_set() {
  for (int i = 0; i < kMaxReplaced; i++) {
    const int sem_id = get_own_set(IPC_CREAT | kFormatSemMode);
    if (sem_id == -1) return -1;
    close_to_others(sem_id);
    if (semctl(sem_id, 0, GETNCNT) <= 0) return sem_id;
    semctl(sem_id, 0, IPC_RMID);
  }
  errno = EACCES;
  return -1;
}

// Makes the semaphore set and gives it its value. The create is not exclusive: two runs that found it missing
// at the same moment may both set the value, and both format then. That costs memory and time, not data,
// since they format different volumes.
int create_format_sem(int initial) {
  LOG(2, "try to semget(%d 1, 0666 | IPC_CREATE )", kFormatSemKey);
  const int sem_id = make_own_set();
  if (sem_id == -1) {
    LOG(0, "semget(..., IPC_CREATE ) failed");
    return -1;
  }
  semun value{};
  value.val = initial > 0 ? initial : 1;
  LOG(2, "try to semctl(%d,0,SETVAL, %d )", sem_id, value.val);
  if (semctl(sem_id, 0, SETVAL, value) != -1) return sem_id;
  LOG(0, "semctl() failed, errno = %d", errno);
  semctl(sem_id, 0, IPC_RMID);
  return -1;
}

// A set that nobody has entered yet and that lets nobody in: the run that made it was killed before it gave
// it its value.
bool was_left_without_value(int sem_id) {
  semid_ds status{};
  return read_status(sem_id, &status) && status.sem_otime == 0 && semctl(sem_id, 0, GETVAL) == 0;
}

// Returns the id of the format semaphore, made when missing, or -1. One run at a time.
int find_format_sem(int initial) {
  const int sem_id = get_own_set(kFormatSemMode);
  if (sem_id != -1 && was_left_without_value(sem_id)) return create_format_sem(initial);
  if (sem_id != -1) return sem_id;
  const int error = errno;
  LOG(0, "semget(...) == -1, errno = %d", error);
  if (error == ENOENT || error == EIDRM) return create_format_sem(initial);
  LOG(0, "semget() failed");
  return -1;
}

}  // namespace

int format_sem_P(int* sem_id, int initial) {
  const LogScope scope;
  if (held_sem_id != -1) {  // left by a format that could not write: waiting for it would never end
    *sem_id = held_sem_id;
    LOG(1, "pid = %lu, is in format critical section still", static_cast<unsigned long>(getpid()));
    return 0;
  }
  for (int i = 0; i < kMaxReplaced; i++) {
    RunLock lock;
    lock.take("format-semaphore.lock", LockMode::kExclusive);
    const int found = find_format_sem(initial);
    lock.release();
    if (found == -1) return -1;
    *sem_id = found;
    LOG(2, "get sem_id = %d", found);
    LOG(2, "try to get a sem, sem_id = %d, trying......", found);
    if (change_semaphore(found, -1) == 0) {
      held_sem_id = found;
      LOG(1, "pid = %lu, go into format critical section ...", static_cast<unsigned long>(getpid()));
      return 0;
    }
    // The run that had it saw nobody wait yet, and removed it.
    if (errno != EIDRM && errno != EINVAL) break;
  }
  LOG(0, "set sem failed");
  return -2;
}

int format_sem_V(int* sem_id) {
  const LogScope scope;
  held_sem_id = -1;
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

void format_sem_release_leftover() {
  int sem_id = held_sem_id;
  if (sem_id != -1) (void)format_sem_V(&sem_id);
}

}  // namespace remvol
