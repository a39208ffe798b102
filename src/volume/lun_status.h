// The status of a LUN, from its stored state and from what its disk and its mount point show.
#ifndef REMVOL_VOLUME_LUN_STATUS_H
#define REMVOL_VOLUME_LUN_STATUS_H

#include "tree/record.h"
#include "tree/state.h"

namespace remvol {

// Writes the LUN's status text, its file-system type and its size. `formatting` non-zero: the text shows the
// stored progress. Returns 0, -1 when a dbidx is below 1, or -103 when a write failed (the following writes
// still run).
[[nodiscard]] int ktree_update_lun_status(const TargetEntry* entry, int formatting);

}  // namespace remvol

#endif
