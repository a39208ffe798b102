#include "tree/slots.h"

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "frontend/log.h"
#include "support/command.h"
#include "support/run_lock.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr char kSlotsLock[] = "slots.lock";
constexpr int kNoLun = -1;
constexpr int kGone = INT_MIN;  // not 0, which an entry without a slot has

using TargetName = TreeValue;

// What this run knows of one target slot.
struct KnownSlot {
  TargetName target = "";                // empty: nothing was read from it
  int luns[kMaxLunsPerTarget + 1] = {};  // LUN numbers by slot, plus 1; 0: nothing was read from it
};

KnownSlot known_slots[kMaxTargets + 1];

RunLock slots_lock;  // open for as long as the run lives
int holders = 0;
bool are_locked = false;  // false also while they are held without a lock, since none can be had
bool are_moved = false;   // this run stores or deletes a slot since they are held

// What the tree has answered for a value that defines a slot.
template <size_t N>
struct Seen {
  enum { kNothing, kMissing, kValue } what;
  int commands;  // how many had been noticed
  char value[N];
};

// What was read from a target slot since then nobody has changed slots.
struct SeenSlot {
  Seen<sizeof(TargetName)> target;
  Seen<16> luns[kMaxLunsPerTarget + 1];
};

SeenSlot seen_slots[kMaxTargets + 1];

// By what it is known that nobody has: the lock's count, and that it is the same tree. For a second only,
// since a person at ktreec asks for no lock.
struct SeenWhen {
  long long changes = -1;
  TreeInstance tree = {};
  time_t second = 0;
};

SeenWhen seen_when;

// What a slot holds is looked at after a command to see what has become of it meanwhile, by whomever.
int commands_noticed = 0;

void notice_commands() {
  static long last_mark = 0;
  const long mark = command_mark();
  if (mark != last_mark) commands_noticed++;
  last_mark = mark;
}

void forget_seen_slots() {
  memset(seen_slots, 0, sizeof seen_slots);
}

void forget_changed_slots() {
  timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  const SeenWhen present = {slots_lock.changes(), tree_instance(), now.tv_sec};
  const bool unchanged = are_locked && present.changes == seen_when.changes &&
                         present.second == seen_when.second && present.tree == seen_when.tree;
  if (!unchanged) forget_seen_slots();
  seen_when = present;
}

// What was read before the last command is believed by those who count slots and look for a free one, which
// is looked at again.
enum class Belief { kSinceCommand, kAny };

// Reads the value at key(), which defines a slot, or takes it from `seen` while the slots are held; null:
// nothing is kept of it. Returns what tree_get() does.
template <size_t N, typename Key>
int get_slot_value(Key key, Seen<N>* seen, TreeValue& value, Belief belief) {
  if (!are_locked) seen = nullptr;
  if (seen != nullptr && seen->what != seen->kNothing &&
      (belief == Belief::kAny || seen->commands == commands_noticed)) {
    memcpy(value, seen->value, N);
    return seen->what == seen->kMissing ? -1 : static_cast<int>(strlen(value));
  }
  const int length = tree_get(key(), value, sizeof value);
  if (seen == nullptr) return length;
  *seen = {};
  seen->commands = commands_noticed;
  if (length == -1 && errno == ENODATA && !are_moved) seen->what = seen->kMissing;
  if (length <= 0 || strlen(value) >= N) return length;
  seen->what = seen->kValue;
  copy_text(seen->value, value);
  return length;
}

bool is_target_slot(int n) {
  return n >= 1 && n <= kMaxTargets;
}

bool is_lun_slot(int n, int m) {
  return is_target_slot(n) && m >= 1 && m <= kMaxLunsPerTarget;
}

int known_lun(int n, int m) {
  return known_slots[n].luns[m] - 1;
}

int get_target_name(int n, TargetName& name, Belief belief) {
  auto* const seen = is_target_slot(n) ? &seen_slots[n].target : nullptr;
  return get_slot_value([n] { return KeyText(key::kTargetName, n); }, seen, name, belief);
}

int get_lun_number(int n, int m, TreeValue& number, Belief belief) {
  auto* const seen = is_lun_slot(n, m) ? &seen_slots[n].luns[m] : nullptr;
  return get_slot_value([n, m] { return KeyText(key::kLunNumber, n, m); }, seen, number, belief);
}

bool holds_target(int n, const char* target_name) {
  TargetName stored;
  return read_target_name(n, stored) && strcmp(stored, target_name) == 0;
}

bool holds_lun(int n, int m, int lun) {
  int stored = 0;
  return read_lun_number(n, m, &stored) && stored == lun;
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

int find_target(int n) {
  if (!is_target_slot(n) || known_slots[n].target[0] == '\0') return n;
  const char* name = known_slots[n].target;
  const int now = find_slot(n, kMaxTargets, [name](int slot) { return holds_target(slot, name); });
  if (now == kGone) LOG(1, "target %s is stored no more", name);
  return now;
}

int find_lun(int n, int m, int target) {
  if (!is_lun_slot(n, m) || known_lun(n, m) == kNoLun) return m;
  const int lun = known_lun(n, m);
  const int now =
      find_slot(m, kMaxLunsPerTarget, [target, lun](int slot) { return holds_lun(target, slot, lun); });
  if (now == kGone) LOG(1, "lun %d of target %s is stored no more", lun, known_slots[n].target);
  return now;
}

}  // namespace

void SlotsHeld::take() {
  held_ = true;
  if (holders++ > 0) return;
  const LockMode mode = purpose_ == kChange ? LockMode::kExclusive : LockMode::kShared;
  are_locked = slots_lock.take_again(kSlotsLock, mode) == LockTry::kTaken;
  forget_changed_slots();
  notice_commands();
}

void SlotsHeld::let_go() {
  held_ = false;
  if (--holders > 0) return;
  if (are_moved) forget_seen_slots();
  are_locked = are_moved = false;
  slots_lock.pause();
}

HeldSlot::HeldSlot(int n, int m)
    : target_(find_target(n)), lun_(target_ != kGone ? find_lun(n, m, target_) : kGone) {
  found_ = lun_ != kGone;
}

bool read_target_name(int n, TargetName& name) {
  return get_target_name(n, name, Belief::kSinceCommand) > 0 && name[0] != '\0';
}

bool read_lun_number(int n, int m, int* lun) {
  TreeValue number;
  if (get_lun_number(n, m, number, Belief::kSinceCommand) <= 0 || number[0] == '\0') return false;
  *lun = atoi(number);
  return true;
}

bool is_target_stored_at(int n) {
  TargetName name;
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
  TargetName name;
  return get_target_name(n, name, Belief::kAny) == -1 || name[0] == '\0';
}

bool is_lun_slot_free(int n, int m) {
  TreeValue number;
  return get_lun_number(n, m, number, Belief::kAny) == -1 || number[0] == '\0';
}

void slots_move() {
  slots_lock.count_change();
  are_moved = true;
  forget_seen_slots();
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
    TargetName name;
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
