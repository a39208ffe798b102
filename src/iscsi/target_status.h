// The status of a target, from its session and its connect state.
#ifndef REMVOL_ISCSI_TARGET_STATUS_H
#define REMVOL_ISCSI_TARGET_STATUS_H

#include "tree/record.h"

namespace remvol {

// Writes the target's status text and the connect state that goes with it. Returns 0 or -103; the result of
// the connect-state write, when one was made, hides an earlier failed status write.
[[nodiscard]] int ktree_update_status(const TargetEntry* entry);

// The same for a target whose connect state was just read.
[[nodiscard]] int ktree_update_status(const TargetEntry* entry, int state);

}  // namespace remvol

#endif
