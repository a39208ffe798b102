#include "tree/half_made.h"

#include "frontend/log.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/keys.h"
#include "tree/record.h"
#include "tree/slots.h"

namespace remvol {

namespace {

bool is_half_made_lun(int n, int m) {
  return tree_present(KeyText(key::kLunNumber, n, m)) && !tree_present(KeyText(key::kLunShare, n, m));
}

bool is_half_made_target(int n) {
  return tree_present(KeyText(key::kTargetName, n)) && !tree_present(KeyText(key::kTargetIp, n)) &&
         !tree_present(KeyText(key::kLunNumber, n, 1));
}

bool drop(const char* path) {
  LOG(0, "half made slot '%s' is deleted", path);
  if (tree_delete(path) == kOk) return true;
  LOG(0, "ktreec_del() of path '%s' failed", path);
  return false;
}

void drop_half_made_luns_of(int n) {
  if (!tree_present(KeyText(key::kTargetName, n))) return;
  for (int m = kMaxLunsPerTarget; m >= 1; m--) {
    if (is_half_made_lun(n, m)) drop(KeyText(key::kLun, n, m));
  }
}

}  // namespace

void drop_half_made_luns() {
  const SlotsHeld held(SlotsHeld::kChange);
  for (int n = 1; n <= kMaxTargets; n++) drop_half_made_luns_of(n);
}

bool drop_half_made_slots() {
  const SlotsHeld held(SlotsHeld::kChange);
  bool dropped = false;
  for (int n = kMaxTargets; n >= 1; n--) {
    drop_half_made_luns_of(n);
    if (is_half_made_target(n)) dropped |= drop(KeyText(key::kTarget, n));
  }
  return dropped;
}

}  // namespace remvol
