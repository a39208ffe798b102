#include "tree/slots.h"

#include <climits>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "run_files.h"
#include "support/run_lock.h"
#include "support/text.h"
#include "tree/slot_reads.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr int kNoLun = -1;
constexpr int kGone = INT_MIN;  // not 0, which an entry without a slot has

// What this run knows of one target slot.
struct KnownSlot {
  TreeValue target = "";                 // empty: nothing was read from it
  int luns[kMaxLunsPerTarget + 1] = {};  // LUN numbers by slot, plus 1; 0: nothing was read from it
};

KnownSlot known_slots[kMaxTargets + 1];

RunLock slots_lock;  // open for as long as the run lives
int holders = 0;

int known_lun(int n, int m) {
  return known_slots[n].luns[m] - 1;
}

bool holds_target(int n, const char* target_name) {
  TreeValue stored;
  return read_target_name(n, stored) && strcmp(stored, target_name) == 0;
}

bool holds_lun(int n, int m, int lun) {
  int stored = 0;
  return read_lun_number(n, m, &stored) && stored == lun;
}

// Returns the slot of 1 to `last` that `holds` tells, asked for `slot` first; `slot` in a tree that does not
// answer, and kGone when none does. One that was silent during the first look, since its daemon was started
// anew, answers the second. `seen` becomes false where the tree tells nothing.
template <typename Holds>
int find_slot(int slot, int last, bool* seen, Holds holds) {
  for (int looks = 0; looks < 2; looks++) {
    if (holds(slot)) return slot;
    for (int other = 1; other <= last; other++) {
      if (holds(other)) return other;
    }
    if (tree_is_loaded()) continue;
    *seen = false;
    return slot;
  }
  return kGone;
}

int find_target(int n, bool* seen) {
  if (!is_target_slot(n) || known_slots[n].target[0] == '\0') return n;
  const char* name = known_slots[n].target;
  const int now = find_slot(n, kMaxTargets, seen, [name](int slot) { return holds_target(slot, name); });
  if (now == kGone) LOG(1, "target %s is stored no more", name);
  return now;
}

int find_lun(int n, int m, int target, bool* seen) {
  if (!is_lun_slot(n, m) || known_lun(n, m) == kNoLun) return m;
  const int lun = known_lun(n, m);
  const int now =
      find_slot(m, kMaxLunsPerTarget, seen, [target, lun](int slot) { return holds_lun(target, slot, lun); });
  if (now == kGone) LOG(1, "lun %d of target %s is stored no more", lun, known_slots[n].target);
  return now;
}

}  // namespace

void SlotsHeld::take() {
  held_ = true;
  if (holders++ > 0) return;
  const LockMode mode = purpose_ == kChange ? LockMode::kExclusive : LockMode::kShared;
  // A machine on which no lock can be had works without.
  const bool is_locked = slots_lock.take_again(kSlotsLock, mode) == LockTry::kTaken;
  begin_slot_reads(is_locked ? slots_lock.changes() : kUnknownChanges);
}

void SlotsHeld::let_go() {
  held_ = false;
  if (--holders > 0) return;
  end_slot_reads();
  slots_lock.pause();
}

HeldSlot::HeldSlot(int n, int m)
    : target_(find_target(n, &seen_)), lun_(target_ != kGone ? find_lun(n, m, target_, &seen_) : kGone) {
  found_ = lun_ != kGone;
}

bool read_target_name(int n, TreeValue& name) {
  return get_target_name(n, name, Belief::kSinceCommand) > 0 && name[0] != '\0';
}

bool read_lun_number(int n, int m, int* lun) {
  TreeValue number;
  if (get_lun_number(n, m, number, Belief::kSinceCommand) <= 0 || number[0] == '\0') return false;
  *lun = atoi(number);
  return true;
}

bool is_target_stored_at(int n) {
  TreeValue name;
  return read_target_name(n, name);
}

bool is_lun_stored_at(int n, int m) {
  int lun = 0;
  return read_lun_number(n, m, &lun);
}

bool is_target_stored(int dbidx) {
  const LogScope scope;
  const HeldSlot slot(dbidx);
  return slot && is_target_stored_at(slot.target());
}

bool is_lun_stored(int dbidx, int lun_dbidx) {
  const LogScope scope;
  const HeldSlot slot(dbidx);
  int lun = 0;
  if (!slot || !read_lun_number(slot.target(), lun_dbidx, &lun)) return false;
  remember_lun(dbidx, lun_dbidx, lun);
  return true;
}

bool is_target_slot_free(int n) {
  TreeValue name;
  return get_target_name(n, name, Belief::kAny) == -1 || name[0] == '\0';
}

bool is_lun_slot_free(int n, int m) {
  TreeValue number;
  return get_lun_number(n, m, number, Belief::kAny) == -1 || number[0] == '\0';
}

void slots_move() {
  slots_lock.count_change();
  doubt_slot_reads();
}

int delete_slot(const char* path) {
  slots_move();
  return tree_delete(path);
}

void remember_target(int n, const char* target_name) {
  if (!is_target_slot(n)) return;
  if (strcmp(known_slots[n].target, target_name) == 0) return;
  known_slots[n] = KnownSlot();
  copy_text(known_slots[n].target, target_name);
}

void remember_lun(int n, int m, int lun) {
  if (is_lun_slot(n, m)) known_slots[n].luns[m] = lun + 1;
}

void remember_all_targets() {
  const SlotsHeld held;
  for (int n = 1; n <= kMaxTargets; n++) {
    known_slots[n] = KnownSlot();
    TreeValue name;
    if (read_target_name(n, name)) remember_target(n, name);
  }
}

int target_slot_after(int n) {
  const LogScope scope;
  const HeldSlot slot(n);
  return slot ? slot.target() + 1 : n;
}

int lun_slot_after(int n, int m) {
  const LogScope scope;
  const HeldSlot slot(n, m);
  return slot ? slot.lun() + 1 : m;
}

}  // namespace remvol
