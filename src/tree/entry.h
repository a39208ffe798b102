// Target and LUN entries in the configuration tree: filling the record, adding, looking up, counting. Every
// filling operation clears the whole record first. A result of -103 says that the tree refused a write or
// that no slot is free.
#ifndef REMVOL_TREE_ENTRY_H
#define REMVOL_TREE_ENTRY_H

#include "tree/record.h"

namespace remvol {

// Returns the slot of the target called exactly `target_name`, or -1. The search stops at the first empty
// slot.
[[nodiscard]] int ktree_get_dbidx_by_targetname(const char* target_name);

// Returns the first free target slot (1 to 8), or -103 when all are used.
[[nodiscard]] int ktree_get_free_dbidx();

// Fills `entry` with the target called `target_name`; missing settings stay zero. Returns 0, or -1 for a null
// entry or an unknown target.
[[nodiscard]] int ktree_get_entry_by_targetname(const char* target_name, TargetEntry* entry);

// Fills `entry` with the target at `dbidx`, whatever the slots before it hold; missing settings stay zero.
// Returns 0, or -1 for an empty slot.
[[nodiscard]] int ktree_get_entry_by_dbidx(int dbidx, TargetEntry* entry);

// Fills `entry` with the target at `dbidx` and its LUN at `lun_dbidx`. Returns 0, or -1 when an argument is
// bad (null, below 1) or one of the two slots is empty.
[[nodiscard]] int ktree_get_lun_entry_by_dbidx(TargetEntry* entry, int dbidx, int lun_dbidx);

// The same for a LUN of the target that `entry` holds already: what was read of the target stays.
[[nodiscard]] int ktree_get_lun_of_target(TargetEntry* entry, int lun_dbidx);

// The same as ktree_get_lun_entry_by_dbidx() for the LUN with number `lun`, which this run has found or
// stored at `lun_dbidx`, wherever it is now; -1 also when it is stored no more. What has taken its place is
// another LUN.
[[nodiscard]] int ktree_get_found_lun_entry(TargetEntry* entry, int dbidx, int lun_dbidx, int lun);

// Rewrites the count of targets: every filled slot of the eight, gaps or not. Returns 0 or -103.
[[nodiscard]] int ktree_update_current_targetcnt();

// Returns the number of LUNs over all targets; the walk stops at the first empty slot of either kind.
[[nodiscard]] int ktree_get_total_luncnt();

// Returns the number of LUNs of the target at `dbidx` up to its first empty slot; -1 for a dbidx below 1.
[[nodiscard]] int ktree_count_target_luns(int dbidx);

// Returns whether the target in a slot has no LUN but the first `most`, for certain: one that could not be
// read is not taken for one that is not there.
[[nodiscard]] bool has_no_further_lun(int dbidx, int most);

// Rewrites the count of LUNs over all targets. Returns 0 or -103.
[[nodiscard]] int ktree_refresh_total_luncnt();

// Rewrites the target's count of LUNs (every filled slot, gaps or not), then the total. Returns 0 or -103.
[[nodiscard]] int ktree_update_current_luncnt(int dbidx);

// Reads whether the LUN is enabled: `enable` becomes 1 for any non-zero value, else 0. Returns 0; -103 with
// `enable` 0 when the value is missing or empty (-1 when the read reported failure yet left text in the
// buffer); -1 for a null `enable` or a dbidx below 1.
[[nodiscard]] int ktree_get_lun_enable(int* enable, int dbidx, int lun_dbidx);

// Returns the target's first free LUN slot (1 to 8); -1 when the system already holds 8 LUNs; -103 when all
// of the target's slots are used.
[[nodiscard]] int ktree_get_free_lun_dbidx(int dbidx);

// Returns the slot of the LUN with number `lun` in the target at `dbidx`, or -1. The search stops at the
// first empty slot.
[[nodiscard]] int ktree_get_dbidx_by_lun(int dbidx, int lun);

// Stores the LUN fields of `entry` in a free slot of its target (db_idx, or looked up by name) and sets
// lun_db_idx. Returns the slot; -1 when the target is unknown, the LUN number has a slot already or none is
// free; -103 when a write failed (the writes before it stay).
[[nodiscard]] int ktree_add_lun_entry(TargetEntry* entry);

// Gives a stored LUN what a killed run has left out, when its share is the one of `entry`: whether it is
// enabled, its access right, and its place in the target's count.
void ktree_complete_lun_entry(const TargetEntry* entry, int lun_dbidx);

// Stores the target fields of `entry` in the slot of its name, or in a free one, and sets db_idx. Returns the
// slot; -1 when the name or address is empty, the port negative, CHAP is on without user or secret, no slot
// is free, or a write failed (the other writes still run).
[[nodiscard]] int ktree_add_entry(TargetEntry* entry);

}  // namespace remvol

#endif
