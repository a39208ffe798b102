#include "tree/lun_walk.h"

#include "support/result.h"
#include "tree/entry.h"
#include "tree/slots.h"

namespace remvol {

namespace {

int read_lun_of_target(TargetEntry* entry, int, int lun_dbidx) {
  return ktree_get_lun_of_target(entry, lun_dbidx);
}

}  // namespace

bool LunWalk::next(TargetEntry* entry) {
  return next(entry, ktree_get_lun_entry_by_dbidx);
}

bool LunWalk::next_of_target(TargetEntry* entry) {
  return next(entry, read_lun_of_target);
}

bool LunWalk::next(TargetEntry* entry, ReadLun read_lun) {
  while (true) {
    slot_ = slot_ == 0 ? 1 : lun_slot_after(dbidx_, slot_);
    if (slot_ > kMaxLunsPerTarget) return false;
    if (end_ == kAtEmpty && !is_lun_stored(dbidx_, slot_)) return false;
    const bool read = read_lun(entry, dbidx_, slot_) == kOk;
    if (read || end_ == kAtUnreadable) return read;
  }
}

}  // namespace remvol
