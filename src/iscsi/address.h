// Moving a stored target to another portal.
#ifndef REMVOL_ISCSI_ADDRESS_H
#define REMVOL_ISCSI_ADDRESS_H

#include "tree/record.h"

namespace remvol {

// Handler of modify_address. Returns 0 done, and also 0 when the target is logged in or not offered at the
// new portal (a printed message tells); -1 missing or bad parameters or unknown target; 1 the portal check
// failed; -103 a tree write failed.
[[nodiscard]] int task_modify_target_address(const TargetEntry& request);

}  // namespace remvol

#endif
