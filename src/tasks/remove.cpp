#include "tasks/remove.h"

#include "frontend/log.h"
#include "iscsi/node.h"
#include "support/result.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "tasks/requested_lun.h"
#include "tasks/whole_target.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/lun_walk.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "tree_layout.h"
#include "volume/share_services.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

constexpr int kDeleteTries = 4;
constexpr int kEveryLun = -1;

// Has the share services look at their shares again before the volume of `entry` goes away. They reload
// everything at once, so the entry is not needed.
void reload_lun_share([[maybe_unused]] const TargetEntry* entry) {
  reload_share_services();
}

// Deletes a slot, or the whole target's when `lun_dbidx` is 0; the tree moves the slots behind it down. What
// another run has deleted meanwhile is deleted, and so is what a try has deleted whose answer was lost:
// another one would take the slot that has moved there. So it would while the tree tells nothing: what was
// asked of it may still be done. Returns 0 or kNotDeleted.
Result delete_stored_slot(int dbidx, int lun_dbidx) {
  const SlotsHeld held(SlotsHeld::kChange);
  for (int tries = 0; tries < kDeleteTries; tries++) {
    const HeldSlot slot(dbidx, lun_dbidx);
    if (!slot) return kOk;
    if (tries > 0 && !slot.is_seen()) break;
    const KeyText key =
        lun_dbidx > 0 ? KeyText(key::kLun, slot.target(), slot.lun()) : KeyText(key::kTarget, slot.target());
    if (delete_slot(key) == kOk) return kOk;
    LOG(0, "ktreec_del() of path '%s' failed", key.c_str());
  }
  return kNotDeleted;
}

// The slot behind the last one is looked at once more: with the target go all of its LUNs.
bool has_at_most(int luns, int dbidx) {
  return ktree_count_target_luns(dbidx) <= luns && has_no_further_lun(dbidx, luns);
}

// Deletes the slot of the target at `dbidx`, of which LUN `lun` was the last one. When another run has stored
// a further one since, that stays, and so does the target. Returns 0 or kNotDeleted.
Result delete_slot_of_last_lun(int dbidx, int lun) {
  const SlotsHeld held(SlotsHeld::kChange);
  int lun_dbidx = ktree_get_dbidx_by_lun(dbidx, lun);
  if (has_at_most(lun_dbidx > 0 ? 1 : 0, dbidx)) return delete_stored_slot(dbidx, 0);
  if (lun_dbidx <= 0 && !tree_is_loaded()) return kNotDeleted;  // nothing can be read
  const Result result = lun_dbidx > 0 ? delete_stored_slot(dbidx, lun_dbidx) : kOk;
  (void)ktree_update_current_luncnt(dbidx);
  return result;
}

// Removes the target in `entry`, volumes, session and node record first; `last_lun` is the LUN with which it
// goes, or kEveryLun. Returns 0 or kNotDeleted.
Result remove_target(TargetEntry* entry, int last_lun) {
  const BriefTargetHold hold(entry->target_name, is_no_lun_formatting);
  TargetEntry lun;
  LunWalk luns(entry->db_idx, LunWalk::kAtUnreadable);
  while (luns.next(&lun)) reload_lun_share(&lun);
  (void)Target_Disconnect(entry);
  (void)delete_node_record(entry);
  if (last_lun == kEveryLun) return delete_stored_slot(entry->db_idx, 0);
  return delete_slot_of_last_lun(entry->db_idx, last_lun);
}

// Removes one of several LUNs. Returns 0, kNotDeleted, or -1 when its entry cannot be read.
Result remove_lun(const TargetEntry& request, int dbidx, int lun_dbidx) {
  TargetEntry lun;
  if (read_requested_lun(request, &lun, dbidx, lun_dbidx) != kOk) return kFailed;
  reload_lun_share(&lun);
  (void)Target_LUN_umount(&lun);
  return delete_stored_slot(dbidx, lun_dbidx);
}

Result remove_named_target(const char* name, int last_lun) {
  LOG(2, "start");
  Result result = kNotStored;
  TargetEntry entry;
  if (ktree_get_entry_by_targetname(name, &entry) == kOk) {
    result = remove_target(&entry, last_lun);
  } else {
    LOG(1, "Can not find: %s", name);
  }
  (void)ktree_update_current_targetcnt();
  LOG(2, "end");
  return result;
}

// Told as the removal of a target is.
Result remove_target_with_last_lun(const TargetEntry& request) {
  const LogScope scope("task_del");
  return remove_named_target(request.target_name, request.lun);
}

}  // namespace

int task_del(const TargetEntry& request) {
  const LogScope scope;
  return remove_named_target(request.target_name, kEveryLun);
}

int task_del_lun(const TargetEntry& request) {
  const LogScope scope;
  LOG(2, "start");
  const BriefTargetHold hold(request.target_name, is_no_lun_formatting);
  int dbidx = 0;
  int lun_dbidx = 0;
  Result result = kFailed;
  bool target_gone = false;
  if (request.lun < 0) {
    LOG(0, "lun is not given");
  } else {
    result = find_requested_lun(request, &dbidx, &lun_dbidx);
  }
  if (result == kOk && has_at_most(1, dbidx)) {
    LOG(2, "removing target %s", request.target_name);
    target_gone = true;
    result = remove_target_with_last_lun(request);
  } else if (result == kOk) {
    result = remove_lun(request, dbidx, lun_dbidx);
    target_gone = result == kOk && has_at_most(0, dbidx);
    // Another run has removed the others meanwhile.
    if (target_gone) result = remove_target_with_last_lun(request);
  }
  if (dbidx >= 1 && !target_gone) (void)ktree_update_current_luncnt(dbidx);
  LOG(2, "end, ret = %d", result);
  return result;
}

}  // namespace remvol
