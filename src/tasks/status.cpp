#include "tasks/status.h"

#include <algorithm>
#include <cstdlib>

#include "frontend/log.h"
#include "iscsi/session.h"
#include "support/result.h"
#include "support/text.h"
#include "tasks/repair.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/half_made.h"
#include "tree/keys.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "tree/status_text.h"

namespace remvol {

namespace {

// Refreshes the status texts of the LUNs of the target at `dbidx`, with `entry` as the record for each.
void _refresh_luns(TargetEntry* entry, int dbidx) {
  for (int slot = 1; slot <= kMaxLunsPerTarget; slot = lun_slot_after(dbidx, slot)) {
    if (ktree_get_lun_entry_by_dbidx(entry, dbidx, slot) != kOk) break;
    repair_lun_state(entry);
    int format_state = kFormatIdle;
    ktree_get_lun_format_state(dbidx, slot, &format_state);
    ktree_update_lun_status(entry, format_state == kFormatting ? 1 : 0);
  }
  ktree_refresh_total_luncnt();
}

// Refreshes the target called `name`. Returns 0, also when it had to be skipped, or -103.
int _refresh_target(const char* name, Caller caller) {
  TargetEntry entry;
  if (ktree_get_entry_by_targetname(name, &entry) != kOk) return kOk;
  const int found = ktree_update_dev(&entry);
  if (found == kListingFailed) {
    LOG_AT(caller, 2, "iscsiadm -m session failed. Skip this target.");
    return kOk;
  }
  if (found == kTreeFailed) {
    LOG_AT(caller, 0, "set value to ktree failed. Exit.");
    return kTreeFailed;
  }
  repair_target_state(&entry);
  ktree_update_status(&entry);
  _refresh_luns(&entry, entry.db_idx);
  return kOk;
}

// Returns whether the slot was nameless and is gone.
bool _delete_nameless_slot(int slot, Caller caller) {
  const SlotsHeld held(SlotsHeld::kChange);
  if (tree_present(KeyText(key::kTargetName, slot))) return false;
  const KeyText path(key::kTarget, slot);
  if (tree_delete(path) == kOk) return true;
  LOG_AT(caller, 0, "ktreec_del() of path '%s' failed", path.c_str());
  return false;
}

// Refreshes the targets and deletes slots without a name, garbage of an interrupted add or delete. The slot
// that moves into a deleted one's place is visited next; no more slots are visited than were counted. Returns
// 0 or -103.
int _refresh_targets(int count, Caller caller = Caller()) {
  int slot = 1;
  for (int visited = 0; visited < count; visited++) {
    char name[sizeof TargetEntry::target_name];
    if (tree_read(KeyText(key::kTargetName, slot), name)) {
      remember_target(slot, name);
      if (_refresh_target(name, caller) != kOk) return kTreeFailed;
      slot = target_slot_after(slot);
      continue;
    }
    if (!_delete_nameless_slot(slot, caller)) slot++;
  }
  return kOk;
}

// The targets behind the counted ones, such as one whose add was refused, stay as they are, unless they show
// work that nobody does any more. Returns 0 or -103.
int _refresh_ended_work_behind(int count, Caller caller = Caller()) {
  for (int slot = count + 1; slot <= kMaxTargets && is_target_stored(slot); slot++) {
    TargetEntry entry;
    if (ktree_get_entry_by_dbidx(slot, &entry) != kOk || !shows_ended_work(&entry)) continue;
    if (_refresh_target(entry.target_name, caller) != kOk) return kTreeFailed;
  }
  return kOk;
}

// Deletes the nameless slots behind the counted ones, up to the first without a status.
void _prune_slots_behind(int count, Caller caller = Caller()) {
  const SlotsHeld held(SlotsHeld::kChange);
  int slot = count + 1;
  for (int visited = count; visited < kMaxTargets; visited++) {
    if (!tree_present(KeyText(key::kTargetStatus, slot))) return;
    if (!tree_slot_is_free(KeyText(key::kTargetName, slot))) {
      slot++;
      continue;
    }
    const KeyText path(key::kTarget, slot);
    LOG_AT(caller, 0, "ktreec_del() of path '%s'", path.c_str());
    if (tree_delete(path) != kOk) slot++;
  }
}

}  // namespace

int task_status() {
  LOG(2, "start");
  drop_half_made_slots();
  if (has_uncounted_target()) ktree_update_current_targetcnt();
  char text[128];
  if (!tree_read(key::kTargetCount, text)) return kFailed;
  const int count = std::min(atoi(text), kMaxTargets);
  if (_refresh_targets(count) != kOk || _refresh_ended_work_behind(count) != kOk) return kTreeFailed;
  _prune_slots_behind(count);
  LOG(2, "end");
  return kOk;
}

}  // namespace remvol
