// The two composers that turn state numbers into the status texts which the user interface shows.
#ifndef REMVOL_TREE_STATUS_TEXT_H
#define REMVOL_TREE_STATUS_TEXT_H

#include "tree/record.h"
#include "tree/state.h"

namespace remvol {

// Writes the target's status text and the connect state that goes with it. Returns 0 or -103; the result of
// the connect-state write, when one was made, hides an earlier failed status write.
int ktree_update_status(const TargetEntry* entry);

// The same for a target whose connect state was just read.
int ktree_update_status(const TargetEntry* entry, int state);

// Writes the LUN's status text, its file-system type and its size. `formatting` non-zero: the text shows the
// stored progress. Returns 0, -1 when a dbidx is below 1, or -103 when a write failed (the following writes
// still run).
int ktree_update_lun_status(const TargetEntry* entry, int formatting);

// What is stored of a LUN that its status text is made of.
struct LunState {
  int right = VOL_AC_RW;  // AccessRight
  bool enabled = false;
  int format = -1;  // FormatState, -1 when missing
  int volume = -1;  // VolumeState, -1 when missing
};

// Reads it. Returns 0, or -1 for a dbidx below 1.
int read_lun_state(int dbidx, int lun_dbidx, LunState* state);

// Writes the status of a LUN whose state was just read, as formatting when the state says so. Returns 0 or
// -103.
int ktree_update_lun_status(const TargetEntry* entry, const LunState& state);

}  // namespace remvol

#endif
