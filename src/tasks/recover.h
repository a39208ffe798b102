// Handlers of the connection events.
#ifndef REMVOL_TASKS_RECOVER_H
#define REMVOL_TASKS_RECOVER_H

namespace remvol {

// Connection lost: marks a target that is set to connect as recovering. Returns 0, or 1 for an unknown
// target.
[[nodiscard]] int task_oiscsi_evt_reopen(const char* target_name);

// Connection back: recovers the target, and whatever is queued, or queues it when another run is at it. Waits
// `wait_seconds` first. Returns the result of the last target, or of queueing, or -1 without its locks.
[[nodiscard]] int task_oiscsi_evt_recover(const char* target_name, int wait_seconds);

}  // namespace remvol

#endif
