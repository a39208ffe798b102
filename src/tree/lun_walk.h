// A walk over the LUNs of a target, in the order of their slots. What is deleted meanwhile moves those behind
// it down; the walk meets each of them all the same.
//
// Of the three rules by which a walk ends, two are here. The third, the looser one of the counts, goes by the
// slots as they are now and reads no entries: taken_luns_at() (tree/lun_slots.h).
#ifndef REMVOL_TREE_LUN_WALK_H
#define REMVOL_TREE_LUN_WALK_H

#include "tree/record.h"

namespace remvol {

class LunWalk {
 public:
  // Which slot ends the walk before the last one of the target does.
  enum End {
    kAtUnreadable,  // one whose entry cannot be read: an empty one, or one that the tree does not give just
                    // now
    kAtEmpty,       // one without a LUN number; one that has a number but cannot be read is passed over
  };

  // Over the LUNs of the target in slot `dbidx`.
  LunWalk(int dbidx, End end) : dbidx_(dbidx), end_(end) {}

  // Fills `entry` with the target and its next LUN. Returns false at the end.
  [[nodiscard]] bool next(TargetEntry* entry);

  // The same for an `entry` that holds the target already: what was read of the target stays.
  [[nodiscard]] bool next_of_target(TargetEntry* entry);

 private:
  using ReadLun = int (*)(TargetEntry* entry, int dbidx, int lun_dbidx);

  bool next(TargetEntry* entry, ReadLun read_lun);

  int dbidx_;
  End end_;
  int slot_ = 0;  // of the LUN met last; 0: none yet
};

}  // namespace remvol

#endif
