// Handlers of del and del_lun.
#ifndef REMVOL_TASKS_REMOVE_H
#define REMVOL_TASKS_REMOVE_H

#include "tree/record.h"

namespace remvol {

// Disconnects and deletes the requested target. Returns 0, 1 unknown target, 2 its slot could not be deleted.
[[nodiscard]] int task_del(const TargetEntry& request);

// Deletes one LUN, and with the last one its target. Returns 0, -1, 1 unknown target or LUN, 2 its slot could
// not be deleted.
[[nodiscard]] int task_del_lun(const TargetEntry& request);

}  // namespace remvol

#endif
