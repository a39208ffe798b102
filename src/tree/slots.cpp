#include "tree/slots.h"

#include <cstdlib>
#include <cstring>

#include "support/run_lock.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/keys.h"
#include "tree/record.h"

namespace remvol {

namespace {

constexpr char kSlotsLock[] = "slots.lock";
constexpr int kNoLun = -1;
constexpr int kGone = 0;

using TargetName = char[256];

// What this run knows of one target slot.
struct KnownSlot {
  TargetName target = "";                // empty: nothing was read from it
  int luns[kMaxLunsPerTarget + 1] = {};  // LUN numbers by slot, plus 1; 0: nothing was read from it
};

KnownSlot known_slots[kMaxTargets + 1];

RunLock slots_lock;  // open for as long as the run lives
int holders = 0;

bool is_target_slot(int n) {
  return n >= 1 && n <= kMaxTargets;
}

bool is_lun_slot(int n, int m) {
  return is_target_slot(n) && m >= 1 && m <= kMaxLunsPerTarget;
}

int known_lun(int n, int m) {
  return known_slots[n].luns[m] - 1;
}

bool holds_target(int n, const char* target_name) {
  TargetName stored;
  return tree_read(KeyText(key::kTargetName, n), stored) && strcmp(stored, target_name) == 0;
}

bool holds_lun(int n, int m, int lun) {
  char stored[256];
  return tree_read(KeyText(key::kLunNumber, n, m), stored) && atoi(stored) == lun;
}

// Returns the slot of 1 to `last` that `holds` tells, asked for `slot` first; `slot` in a tree that does not
// answer, and kGone when none does. One that was silent during the first look, since its daemon was started
// anew, answers the second.
template <typename Holds>
int find_slot(int slot, int last, Holds holds) {
  for (int looks = 0; looks < 2; looks++) {
    if (holds(slot)) return slot;
    for (int other = 1; other <= last; other++) {
      if (holds(other)) return other;
    }
    if (!tree_is_loaded()) return slot;
  }
  return kGone;
}

int find_target(int n, Caller caller) {
  if (!is_target_slot(n) || known_slots[n].target[0] == '\0') return n;
  const char* name = known_slots[n].target;
  const int now = find_slot(n, kMaxTargets, [name](int slot) { return holds_target(slot, name); });
  if (now == kGone) LOG_AT(caller, 1, "target %s is stored no more", name);
  return now;
}

int find_lun(int n, int m, int target, Caller caller) {
  if (!is_lun_slot(n, m) || known_lun(n, m) == kNoLun) return m;
  const int lun = known_lun(n, m);
  const int now =
      find_slot(m, kMaxLunsPerTarget, [target, lun](int slot) { return holds_lun(target, slot, lun); });
  if (now == kGone) LOG_AT(caller, 1, "lun %d of target %s is stored no more", lun, known_slots[n].target);
  return now;
}

}  // namespace

SlotsHeld::SlotsHeld(Purpose purpose) {
  if (holders++ > 0) return;
  slots_lock.take_again(kSlotsLock, purpose == kChange ? LockMode::kExclusive : LockMode::kShared);
}

SlotsHeld::~SlotsHeld() {
  if (--holders == 0) slots_lock.pause();
}

HeldSlot::HeldSlot(int n, int m, Caller caller)
    : target_(find_target(n, caller)), lun_(target_ != kGone ? find_lun(n, m, target_, caller) : kGone) {
  found_ = target_ != kGone && (m == 0 || lun_ != kGone);
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
    TargetName name;
    if (tree_read(KeyText(key::kTargetName, n), name)) remember_target(n, name);
  }
}

int target_slot_after(int n) {
  const HeldSlot slot(n);
  return slot ? slot.target() + 1 : n;
}

int lun_slot_after(int n, int m) {
  const HeldSlot slot(n, m);
  return slot ? slot.lun() + 1 : m;
}

}  // namespace remvol
