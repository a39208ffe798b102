// What the slot numbers of this run stand for.
//
// Deleting a slot moves the later ones down, so a number that a run has read may stand for another target or
// LUN a moment later. Each run therefore remembers which target and LUN it found in a slot, and whoever reads
// or writes by a number asks where they are now: a HeldSlot finds them again, or says that they are stored no
// more, and keeps every slot in its place while it lives. So a number stands for what it stood for when this
// run last read it.
#ifndef REMVOL_TREE_SLOTS_H
#define REMVOL_TREE_SLOTS_H

#include "tree/access.h"

namespace remvol {

// Keeps the slots as they are while it lives. Runs that use them share this; one that adds or deletes slots
// has it alone. It may be taken again inside of itself, but not changed from using to changing. Held for some
// reads and writes of the tree, never while a command runs but that which loads the tree.
class SlotsHeld {
 public:
  enum Purpose { kUse, kChange };

  explicit SlotsHeld(Purpose purpose = kUse) : purpose_(purpose) { take(); }
  SlotsHeld(const SlotsHeld&) = delete;
  SlotsHeld& operator=(const SlotsHeld&) = delete;
  ~SlotsHeld() {
    if (held_) let_go();
  }

  // Lets go of the slots for a while, and takes them again.
  void let_go();
  void take();

 private:
  Purpose purpose_;
  bool held_ = false;
};

// A slot of a target, or of one of its LUNs, by the number that this run knows it by.
class HeldSlot {
 public:
  // `m` 0: the target's slot alone. A slot that is stored no more is logged at level 1 in the innermost
  // scope's name.
  explicit HeldSlot(int n, int m = 0);

  // False when what the slot stood for is stored no more. A number that this run has read nothing from, and
  // one in a tree that does not answer, is taken as it is.
  explicit operator bool() const { return found_; }
  bool is_seen() const { return seen_; }  // false when the tree was asked for it and told nothing
  int target() const { return target_; }  // where the target is now
  int lun() const { return lun_; }        // where the LUN is now

 private:
  SlotsHeld held_;
  bool found_;
  bool seen_ = true;
  int target_;
  int lun_;
};

// What defines a slot: the name of the target in it, the number of the LUN. Read from the tree, but only once
// as long as no run moves slots and no command runs. Return whether it is there.
[[nodiscard]] bool read_target_name(int n, TreeValue& name);
[[nodiscard]] bool read_lun_number(int n, int m, int* lun);

// Return whether it is there.
[[nodiscard]] bool is_target_stored_at(int n);
[[nodiscard]] bool is_lun_stored_at(int n, int m);

// The same by the numbers that this run knows the slots by. The LUN is remembered.
[[nodiscard]] bool is_target_stored(int dbidx);
[[nodiscard]] bool is_lun_stored(int dbidx, int lun_dbidx);

// The same by the looser rule of the free-slot searches (tree_slot_is_free), also by what was read before a
// command ran.
[[nodiscard]] bool is_target_slot_free(int n);
[[nodiscard]] bool is_lun_slot_free(int n, int m);

// With the slots held for a change, and before this run stores, deletes or loads one: nobody believes any
// more what was read before.
void slots_move();

// Deletes the slot of a target or a LUN at `path`, with the slots held for a change: those behind it move
// down. Returns 0 or -103 (not logged).
[[nodiscard]] int delete_slot(const char* path);

// Remember what a slot holds, as this run has just read or written it.
void remember_target(int n, const char* target_name);
void remember_lun(int n, int m, int lun);

// Remembers the target of each of the eight slots, for a walk over all of them.
void remember_all_targets();

// Returns the slot to visit after slot `n`: the one behind the target that was read there, or, when that has
// been deleted meanwhile, the one that has taken its place.
[[nodiscard]] int target_slot_after(int n);

// Returns the LUN slot to visit after slot `m` of the target at `n`: the one behind the LUN that was read
// there, or, when that has been deleted meanwhile, the one that has taken its place.
[[nodiscard]] int lun_slot_after(int n, int m);

}  // namespace remvol

#endif
