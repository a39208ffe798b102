// Slots that a killed run has left half made. Adding is one step for other runs, so a slot that is seen half
// made belongs to nobody.
#ifndef REMVOL_TREE_HALF_MADE_H
#define REMVOL_TREE_HALF_MADE_H

namespace remvol {

// Deletes the LUN slots of stored targets that have a number, but no share.
void drop_half_made_luns();

// The same, and the target slots that have a name, but neither an address nor a LUN. LUNs that a run that
// has ended has stored and not counted are counted.
void drop_half_made_slots();

// Returns whether behind the counted slots is a target that a run has stored and not counted, since it was
// killed in between.
[[nodiscard]] bool has_uncounted_target();

// Returns whether a counted slot holds no target, since a run was killed after it had deleted one.
[[nodiscard]] bool has_counted_gone_target();

}  // namespace remvol

#endif
