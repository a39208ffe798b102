// Handlers of format and modify.
#ifndef REMVOL_TASKS_FORMAT_H
#define REMVOL_TASKS_FORMAT_H

#include "tree/record.h"

namespace remvol {

// Makes a fresh file system on the requested LUN and mounts it again. Returns 0, -1, 1 unknown target or LUN,
// or the result of the mount.
[[nodiscard]] int task_format(const TargetEntry& request);

// Changes the target's CHAP settings and reconnects it when it was set to connect. Returns 0, also when the
// reconnection failed (connect state 4 tells), or -1 for an unknown target.
[[nodiscard]] int task_modify(const TargetEntry& request);

}  // namespace remvol

#endif
