// Putting right what a killed run has left in the tree: states of work that nobody does.
#ifndef REMVOL_TASKS_REPAIR_H
#define REMVOL_TASKS_REPAIR_H

#include "tree/record.h"
#include "tree/state.h"

namespace remvol {

// Ends a "connecting" that no run stands behind: one has held the target, and none does now. Returns the
// connect state that is stored then, -1 when there is none.
[[nodiscard]] int repair_target_state(const TargetEntry* target);

// The same for the formatting, the waiting for it and the creating of the LUN in `lun`, of which `state` was
// just read; a mke2fs that outlived its run is work too.
void repair_lun_state(const TargetEntry* lun, LunState* state);

// Returns whether the target's status text, or that of a LUN of it, tells of work that has ended, however it
// ended: a run has held the target, and none does now.
[[nodiscard]] bool shows_ended_work(const TargetEntry* target);

}  // namespace remvol

#endif
