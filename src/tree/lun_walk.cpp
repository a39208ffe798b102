#include "tree/lun_walk.h"

#include "support/result.h"
#include "tree/entry.h"
#include "tree/slots.h"

namespace remvol {

bool LunWalk::next(TargetEntry* entry) {
  while (true) {
    slot_ = slot_ == 0 ? 1 : lun_slot_after(dbidx_, slot_);
    if (slot_ > kMaxLunsPerTarget) return false;
    if (end_ == kAtEmpty && !is_lun_stored(dbidx_, slot_)) return false;
    const bool read = ktree_get_lun_entry_by_dbidx(entry, dbidx_, slot_) == kOk;
    if (read || end_ == kAtUnreadable) return read;
  }
}

}  // namespace remvol
