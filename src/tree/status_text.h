// The two composers that turn state numbers into the status texts which the user interface shows.
#ifndef REMVOL_TREE_STATUS_TEXT_H
#define REMVOL_TREE_STATUS_TEXT_H

#include "tree/record.h"

namespace remvol {

// Writes the target's status text and the connect state that goes with it. Returns 0 or -103; the result of
// the connect-state write, when one was made, hides an earlier failed status write.
int ktree_update_status(const TargetEntry* entry);

// Writes the LUN's status text, its file-system type and its size. `formatting` non-zero: the text shows the
// stored progress. Returns 0, -1 when a dbidx is below 1, or -103 when a write failed (the following writes
// still run).
int ktree_update_lun_status(const TargetEntry* entry, int formatting);

}  // namespace remvol

#endif
