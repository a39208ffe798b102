// Exclusion between runs of the tool: record locks on files. The kernel releases them when a process dies.
#ifndef REMVOL_SUPPORT_LOCKS_H
#define REMVOL_SUPPORT_LOCKS_H

namespace remvol {

inline constexpr char kLockDir[] = "/var/lock/virtual_volume/";
inline constexpr char kRecoverQueueLock[] = "/var/lock/virtual_volume/remvol_recover_queue.lock";

// Makes the lock directory when missing. Returns 0, or -108 after printing the system error.
[[nodiscard]] int make_lock_dir();

// Tries the recover lock once. Returns the descriptor; -1 when another process holds it, -10 on another
// error, -108 when the file cannot be opened.
[[nodiscard]] int get_recover_cri_flock();

// Releases the recover lock and closes `fd` in every case. Returns 0, -1, -2 (bad descriptor) or -10.
[[nodiscard]] int unlock_recover_cri_flock(int fd);

// Takes a write lock on the file at `path`, with random waits below `max_wait_us` (above 0) microseconds
// between tries. Returns the descriptor; -1 when the retries ran out, -10 on another error, -108 when the
// file cannot be opened.
[[nodiscard]] int wait_flock(const char* path, int max_retries, int max_wait_us);

// Releases a lock of wait_flock and closes `fd` in every case. Returns 0, -1, -2 or -10.
[[nodiscard]] int unlock_flock(int fd);

}  // namespace remvol

#endif
