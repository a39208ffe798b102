// Handlers of connect and disconnect.
#ifndef REMVOL_TASKS_CONNECT_H
#define REMVOL_TASKS_CONNECT_H

#include "tree/record.h"

namespace remvol {

// Logs the target of the request in and mounts its enabled LUNs. A message that it is not logged in names it.
// Returns 0; -103 unknown target; the result of a failed login; -1 when its disks cannot be found.
[[nodiscard]] int task_connect(const TargetEntry& request);

// Takes a target offline, or every target for null. Returns 0; 1 when logging out of all
// nodes failed; -1 for an unknown target.
[[nodiscard]] int task_disconnect(const char* target_name);

}  // namespace remvol

#endif
