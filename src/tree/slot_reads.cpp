#include "tree/slot_reads.h"

#include <cerrno>
#include <cstring>
#include <ctime>

#include "support/command.h"
#include "support/text.h"

namespace remvol {

namespace {

// What the tree has answered for a value that defines a slot.
template <size_t N>
struct Seen {
  enum { kNothing, kMissing, kValue } what;
  int commands;  // how many had been noticed
  char value[N];
};

// What was read from a target slot since nobody has changed slots.
struct SeenSlot {
  Seen<sizeof(TreeValue)> target;
  Seen<16> luns[kMaxLunsPerTarget + 1];
};

SeenSlot seen_slots[kMaxTargets + 1];

// By what it is known that nobody has: the lock's count, and that it is the same tree. For a second only,
// since a person at ktreec asks for no lock.
struct SeenWhen {
  long long changes = kUnknownChanges;
  TreeInstance tree = {};
  time_t second = 0;
};

SeenWhen seen_when;

bool are_kept = false;     // what is read from now on
bool are_doubted = false;  // this run changes slots

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

// Reads the value at key(), which defines a slot, or takes it from `seen`; null: nothing is kept of it.
// Returns what tree_get() does.
template <size_t N, typename Key>
int get_slot_value(Key key, Seen<N>* seen, TreeValue& value, Belief belief) {
  if (!are_kept) seen = nullptr;
  if (seen != nullptr && seen->what != seen->kNothing &&
      (belief == Belief::kAny || seen->commands == commands_noticed)) {
    memcpy(value, seen->value, N);
    return seen->what == seen->kMissing ? -1 : static_cast<int>(strlen(value));
  }
  const int length = tree_get(key(), value, sizeof value);
  if (seen == nullptr) return length;
  *seen = {};
  seen->commands = commands_noticed;
  if (length == -1 && errno == ENODATA && !are_doubted) seen->what = seen->kMissing;
  if (length <= 0 || strlen(value) >= N) return length;
  seen->what = seen->kValue;
  copy_text(seen->value, value);
  return length;
}

}  // namespace

void begin_slot_reads(long long changes) {
  timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  const SeenWhen present = {changes, tree_instance(), now.tv_sec};
  are_kept = changes != kUnknownChanges;
  const bool unchanged = are_kept && present.changes == seen_when.changes &&
                         present.second == seen_when.second && present.tree == seen_when.tree;
  if (!unchanged) forget_seen_slots();
  seen_when = present;
  notice_commands();
}

void end_slot_reads() {
  if (are_doubted) forget_seen_slots();
  are_kept = are_doubted = false;
}

void doubt_slot_reads() {
  are_doubted = true;
  forget_seen_slots();
}

int get_target_name(int n, TreeValue& name, Belief belief) {
  auto* const seen = is_target_slot(n) ? &seen_slots[n].target : nullptr;
  return get_slot_value([n] { return KeyText(key::kTargetName, n); }, seen, name, belief);
}

int get_lun_number(int n, int m, TreeValue& number, Belief belief) {
  auto* const seen = is_lun_slot(n, m) ? &seen_slots[n].luns[m] : nullptr;
  return get_slot_value([n, m] { return KeyText(key::kLunNumber, n, m); }, seen, number, belief);
}

}  // namespace remvol
