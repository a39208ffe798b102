// Walks over the LUN slots of a target, for whoever holds the slots (SlotsHeld) for as long as the walk
// lasts:
//
//   for (const int m : stored_luns_at(n)) ...
//
// A slot is looked at when the walk comes to it, so after what was done with the one before. Each walk ends
// before the slot that its rule names, or behind the last one. LunWalk (tree/lun_walk.h) goes over entries
// instead, and lets the slots be let go of on the way. Whoever wants every slot, also those behind an empty
// one, counts from 1 to kMaxLunsPerTarget.
#ifndef REMVOL_TREE_LUN_SLOTS_H
#define REMVOL_TREE_LUN_SLOTS_H

#include "tree_layout.h"

namespace remvol {

// The slots that such a walk meets, for a loop over them.
class LunSlots {
 public:
  using HoldsLun = bool (*)(int n, int m);
  struct End {};

  LunSlots(int n, HoldsLun holds_lun) : n_(n), holds_lun_(holds_lun) {}

  [[nodiscard]] LunSlots begin() const { return *this; }
  [[nodiscard]] End end() const { return {}; }

  int operator*() const { return m_; }
  void operator++() { m_++; }
  bool operator!=(End) const { return m_ <= kMaxLunsPerTarget && holds_lun_(n_, m_); }

 private:
  int n_;
  HoldsLun holds_lun_;
  int m_ = 1;
};

// Those of the target that this run knows by the number `dbidx`, up to the first without a LUN number. What
// each holds is remembered, so that it may be read and written by its number.
[[nodiscard]] LunSlots stored_luns(int dbidx);

// By the same rule those of the slot `n` as it is now. Nothing is remembered.
[[nodiscard]] LunSlots stored_luns_at(int n);

// Those of the slot `n` as it is now, up to the first that is free by the looser rule of the counts and of
// the search for a free slot (is_lun_slot_free).
[[nodiscard]] LunSlots taken_luns_at(int n);

}  // namespace remvol

#endif
