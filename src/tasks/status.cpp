#include "tasks/status.h"

#include <algorithm>
#include <cstdlib>

#include "frontend/log.h"
#include "iscsi/session.h"
#include "iscsi/target_status.h"
#include "support/result.h"
#include "support/text.h"
#include "tasks/repair.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/half_made.h"
#include "tree/lun_walk.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "tree_layout.h"
#include "volume/lun_status.h"

namespace remvol {

namespace {

// Writes the status text of a LUN that is being formatted, unless that has ended since. Returns whether it
// did.
bool write_progress(const TargetEntry* entry) {
  const SlotsHeld held(SlotsHeld::kChange);
  if (read_lun_state(entry->db_idx, entry->lun_db_idx).format != kFormatting) return false;
  (void)ktree_update_lun_status(entry, 1);
  return true;
}

// Refreshes the status texts of the LUNs of the target in `entry`, which is the record for each. The slots
// are let go of while disks are looked at.
void refresh_luns(TargetEntry* entry, SlotsHeld* held) {
  LunWalk luns(entry->db_idx, LunWalk::kAtUnreadable);
  while (luns.next_of_target(entry)) {
    LunState state = read_lun_state(entry->db_idx, entry->lun_db_idx);
    held->let_go();
    repair_lun_state(entry, &state);
    if (state.format != kFormatting || !write_progress(entry)) (void)ktree_update_lun_status(entry, 0);
    held->take();
  }
  (void)ktree_refresh_total_luncnt();
}

// Refreshes the target in `entry`. The slots are let go of while the sessions are listed. Returns 0, also
// when it had to be skipped, or -103.
int refresh_target(TargetEntry* entry, SlotsHeld* held) {
  held->let_go();
  const int found = ktree_update_dev(entry);
  if (found == kTreeFailed) {
    LOG(0, "set value to ktree failed. Exit.");
    return kTreeFailed;
  }
  if (found == kListingFailed) {
    LOG(2, "iscsiadm -m session failed. Skip this target.");
    held->take();
    return kOk;
  }
  (void)ktree_update_status(entry, repair_target_state(entry));
  held->take();
  refresh_luns(entry, held);
  return kOk;
}

// Returns whether the slot was nameless and is gone. The tree is asked for the name anew: what this run has
// read before is believed although a person at ktreec may have stored a target since.
bool delete_nameless_slot(int slot) {
  const SlotsHeld held(SlotsHeld::kChange);
  if (!tree_is_missing(KeyText(key::kTargetName, slot), key::kTargetCount)) return false;
  const KeyText path(key::kTarget, slot);
  if (delete_slot(path) == kOk) return true;
  LOG(0, "ktreec_del() of path '%s' failed", path.c_str());
  return false;
}

// Refreshes the targets and deletes slots without a name, garbage of an interrupted add or delete. The slot
// that moves into a deleted one's place is visited next; no more slots are visited than were counted. Returns
// 0 or -103.
int refresh_targets(int count) {
  SlotsHeld held;
  int slot = 1;
  for (int visited = 0; visited < count; visited++) {
    TargetEntry entry;
    char name[sizeof entry.target_name];
    if (!read_target_name(slot, name)) {
      held.let_go();
      if (!delete_nameless_slot(slot)) slot++;
      held.take();
      continue;
    }
    remember_target(slot, name);
    const bool found = ktree_get_entry_by_targetname(name, &entry) == kOk;
    if (found && refresh_target(&entry, &held) != kOk) return kTreeFailed;
    slot = target_slot_after(slot);
  }
  return kOk;
}

// The targets behind the counted ones, such as one whose add was refused, stay as they are, unless they show
// work that nobody does any more. Returns 0 or -103.
int refresh_ended_work_behind(int count) {
  SlotsHeld held;
  for (int slot = count + 1; slot <= kMaxTargets && is_target_stored(slot); slot++) {
    TargetEntry entry;
    if (ktree_get_entry_by_dbidx(slot, &entry) != kOk || !shows_ended_work(&entry)) continue;
    if (refresh_target(&entry, &held) != kOk) return kTreeFailed;
  }
  return kOk;
}

// Deletes the nameless slots behind the counted ones, up to the first without a status.
void prune_slots_behind(int count) {
  const SlotsHeld held(SlotsHeld::kChange);
  int slot = count + 1;
  for (int visited = count; visited < kMaxTargets; visited++) {
    const KeyText status(key::kTargetStatus, slot);
    const KeyText name(key::kTargetName, slot);
    if (!tree_present(status)) return;
    if (!tree_slot_is_free(name) || !tree_is_missing(name, status)) {  // asked for anew, as above
      slot++;
      continue;
    }
    const KeyText path(key::kTarget, slot);
    LOG(0, "ktreec_del() of path '%s'", path.c_str());
    if (delete_slot(path) != kOk) slot++;
  }
}

}  // namespace

int task_status() {
  const LogScope scope;
  LOG(2, "start");
  drop_half_made_slots();
  if (has_uncounted_target()) (void)ktree_update_current_targetcnt();
  StateValue text;
  if (!tree_read(key::kTargetCount, text)) return kFailed;
  const int count = std::min(atoi(text), kMaxTargets);
  if (refresh_targets(count) != kOk || refresh_ended_work_behind(count) != kOk) return kTreeFailed;
  prune_slots_behind(count);
  if (has_counted_gone_target()) (void)ktree_update_current_targetcnt();
  LOG(2, "end");
  return kOk;
}

}  // namespace remvol
