// The values that define slots, read from the tree only once while nobody changes slots.
//
// A run asks for the same names and LUN numbers again and again, since it makes sure of a slot before each
// use.
#ifndef REMVOL_TREE_SLOT_READS_H
#define REMVOL_TREE_SLOT_READS_H

#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

constexpr bool is_target_slot(int n) {
  return n >= 1 && n <= kMaxTargets;
}

constexpr bool is_lun_slot(int n, int m) {
  return is_target_slot(n) && m >= 1 && m <= kMaxLunsPerTarget;
}

constexpr long long kUnknownChanges = -1;

// Between these the slots stay as they are but for what this run does to them. `changes` is the count of the
// lock that sees to it: with the same count what was read under it before is still so. kUnknownChanges: there
// is no lock, and nothing is kept.
void begin_slot_reads(long long changes);
void end_slot_reads();

// This run stores, deletes or loads slots until the end: nobody believes any more what was read before.
void doubt_slot_reads();

// What was read before the last command is believed by those who count slots and look for a free one, which
// is looked at again.
enum class Belief { kSinceCommand, kAny };

// The name of the target in a slot, and the number of the LUN in one. Return what tree_get() does.
int get_target_name(int n, TreeValue& name, Belief belief);
int get_lun_number(int n, int m, TreeValue& number, Belief belief);

}  // namespace remvol

#endif
