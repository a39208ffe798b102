// Handlers of add and check_share_name.
#ifndef REMVOL_TASKS_ADD_H
#define REMVOL_TASKS_ADD_H

#include "tree/record.h"

namespace remvol {

// Stores the requested LUN as a new volume and mounts it when its target is connected. Returns 0, -1, or the
// result of the mount (-6, -7); what was stored stays.
[[nodiscard]] int task_add(const TargetEntry& request);

// Returns 1 when a LUN uses the share name, else 0.
[[nodiscard]] int task_share(const char* share);

}  // namespace remvol

#endif
