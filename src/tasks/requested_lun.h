// The LUN that a request names, by target name and LUN number.
#ifndef REMVOL_TASKS_REQUESTED_LUN_H
#define REMVOL_TASKS_REQUESTED_LUN_H

#include "support/result.h"
#include "tree/record.h"

namespace remvol {

// Looks the requested target and LUN up. Returns 0 with both slots; kNotStored, logged in the innermost
// scope's name, when one of them is unknown: `dbidx` is below 1 when that is the target.
Result find_requested_lun(const TargetEntry& request, int* dbidx, int* lun_dbidx);

// Fills `entry` with the requested LUN, found in these slots. Returns 0, or -1, logged in the innermost
// scope's name.
Result read_requested_lun(const TargetEntry& request, TargetEntry* entry, int dbidx, int lun_dbidx);

}  // namespace remvol

#endif
