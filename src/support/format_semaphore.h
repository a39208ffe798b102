// The semaphore that lets one run at a time format a volume. The kernel undoes a run's change when it dies.
#ifndef REMVOL_SUPPORT_FORMAT_SEMAPHORE_H
#define REMVOL_SUPPORT_FORMAT_SEMAPHORE_H

namespace remvol {

// Makes the format semaphore when missing and waits for it, unless this process has it already. Returns 0; -1
// when it cannot be had, -2 when the wait failed.
[[nodiscard]] int format_sem_P(int* sem_id, int initial);

// Leaves the format semaphore, or removes it when nobody waits (`sem_id` is then -1). Returns 0 or -2.
[[nodiscard]] int format_sem_V(int* sem_id);

// Leaves the semaphore that a format which ended early has left to this process, if there is one. To be
// called before this process waits for a lock that a run waiting for the semaphore may hold.
void format_sem_release_leftover();

}  // namespace remvol

#endif
