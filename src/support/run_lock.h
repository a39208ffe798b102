// Locks between runs of the tool: flock(2) on files in a folder that only root may enter, so that no stranger
// can hold one. The kernel lets go of a lock when its run ends, however it ends.
//
// They come on top of the record locks and the semaphore of support/locks.h. Where the folder cannot be had
// (a run without root's rights, a /run that cannot be written) nothing is locked and the work goes on.
#ifndef REMVOL_SUPPORT_RUN_LOCK_H
#define REMVOL_SUPPORT_RUN_LOCK_H

#include "run_files.h"
#include "support/text.h"

namespace remvol {

// Seconds. For longer no run waits for one that keeps a session open, closes it, or works on a mount point.
inline constexpr int kLongestHold = 60;

enum class LockMode { kShared, kExclusive };

enum class LockTry {
  kTaken,
  kBusy,  // another run holds it
  kNone,  // there is no such lock, and none could be made
};

// A lock's name for something that has a name of any form.
using LockName = Text<64>;
[[nodiscard]] LockName hashed_lock_name(const char* kind, const char* name);

class RunLock {
 public:
  RunLock() = default;
  RunLock(const RunLock&) = delete;
  RunLock& operator=(const RunLock&) = delete;
  ~RunLock() { release(); }

  // Takes the lock called `name` (a file name), waiting for as long as others hold it. One that is held
  // already is let go before. Returns kTaken or kNone.
  LockTry take(const char* name, LockMode mode);

  // The same without waiting.
  [[nodiscard]] LockTry try_take(const char* name, LockMode mode);

  // The same as take, but waits `seconds` at most: kBusy when it is not had by then.
  LockTry take_in_time(const char* name, LockMode mode, int seconds);

  // The same for a lock that some run has taken before: without one, kNone, and none is made.
  [[nodiscard]] LockTry try_existing(const char* name, LockMode mode);

  // Takes a lock again that was paused, or takes it for the first time: for one that is held many times.
  // Returns kTaken or kNone.
  [[nodiscard]] LockTry take_again(const char* name, LockMode mode);

  // Lets the lock go, and keeps its file open.
  void pause();

  // For what a lock keeps in place: how often count_change() was called, by whatever run, since the lock's
  // file was made. With the lock held, and not changed since, all that was read under it before is still so.
  // The file's length is the number, since a length takes no room on a full disk.
  [[nodiscard]] long long changes() const;

  // With the lock held alone: what it keeps in place is about to change.
  void count_change();

  void release();

 private:
  [[nodiscard]] LockTry open_and_lock(const char* name, int open_flags, int operation);

  int fd_ = -1;
};

}  // namespace remvol

#endif
