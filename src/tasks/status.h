// Handler of status.
#ifndef REMVOL_TASKS_STATUS_H
#define REMVOL_TASKS_STATUS_H

namespace remvol {

// Refreshes device names and status texts of every target and removes broken slots. Returns 0, -1 when the
// target count cannot be read, -103 when a tree write failed.
[[nodiscard]] int task_status();

}  // namespace remvol

#endif
