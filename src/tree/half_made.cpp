#include "tree/half_made.h"

#include "frontend/log.h"
#include "support/result.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/lun_slots.h"
#include "tree/slots.h"
#include "tree_layout.h"

namespace remvol {

namespace {

bool is_half_made_lun(int n, int m) {
  const KeyText number(key::kLunNumber, n, m);
  return is_lun_stored_at(n, m) && tree_is_missing(KeyText(key::kLunShare, n, m), number);
}

bool is_half_made_target(int n) {
  const KeyText name(key::kTargetName, n);
  return is_target_stored_at(n) && !is_lun_stored_at(n, 1) &&
         tree_is_missing(KeyText(key::kTargetIp, n), name) &&
         tree_is_missing(KeyText(key::kLunNumber, n, 1), name);
}

void drop(const char* path) {
  const LogScope scope;
  LOG(0, "half made slot '%s' is deleted", path);
  if (delete_slot(path) != kOk) LOG(0, "ktreec_del() of path '%s' failed", path);
}

// Adding takes the first slot without a number, so behind it is none. Returns the last slot with one.
int last_lun_at(int n) {
  int last = 0;
  for (const int m : stored_luns_at(n)) last = m;
  return last;
}

void drop_half_made_luns_of(int n) {
  if (!is_target_stored_at(n)) return;
  const int last = last_lun_at(n);
  for (int m = last; m >= 1; m--) {
    if (is_half_made_lun(n, m)) drop(KeyText(key::kLun, n, m));
  }
}

// A LUN is counted right after it was stored; a run that was killed in between has not counted it. A count
// that no run is known to have left so stays.
void count_luns_of(int n) {
  TreeValue name;
  if (read_target_name(n, name) && tree_read_number(KeyText(key::kTargetLunCount, n), 0) < last_lun_at(n) &&
      IdleTarget(name)) {
    (void)ktree_update_current_luncnt(n);
  }
}

// A target whose mount failed is not counted, as those who read the tree know it.
bool is_uncounted(int n) {
  TreeValue name;
  return read_target_name(n, name) && tree_present(KeyText(key::kLunShare, n, 1)) &&
         tree_read_number(KeyText(key::kLunVolumeState, n, 1), kVolumeNormal) != kVolumeFailed &&
         IdleTarget(name);
}

}  // namespace

bool has_uncounted_target() {
  const SlotsHeld held;
  const int count = tree_read_number(key::kTargetCount, 0);
  for (int n = 1; n <= kMaxTargets; n++) {
    if (n > count && is_uncounted(n)) return true;
  }
  return false;
}

bool has_counted_gone_target() {
  const SlotsHeld held;
  const int count = tree_read_number(key::kTargetCount, 0);
  return count >= 1 && count <= kMaxTargets &&
         tree_is_missing(KeyText(key::kTargetName, count), key::kTargetCount);
}

void drop_half_made_luns() {
  const SlotsHeld held(SlotsHeld::kChange);
  for (int n = 1; n <= kMaxTargets; n++) drop_half_made_luns_of(n);
}

void drop_half_made_slots() {
  const SlotsHeld held(SlotsHeld::kChange);
  for (int n = kMaxTargets; n >= 1; n--) {
    drop_half_made_luns_of(n);
    count_luns_of(n);
    if (!is_half_made_target(n)) continue;
    drop(KeyText(key::kTarget, n));
    (void)ktree_update_current_targetcnt();
  }
}

}  // namespace remvol
