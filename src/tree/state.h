// The states of targets and LUNs: their readers and writers. Writers of single values try up to 3 times where
// not said otherwise, and return -103 after the third failure.
#ifndef REMVOL_TREE_STATE_H
#define REMVOL_TREE_STATE_H

#include "tree/record.h"
#include "tree_layout.h"

namespace remvol {

// Writes the target's connect state in one try. Returns 0 or -103.
[[nodiscard]] int ktree_set_connect_state(int dbidx, int state);

// Read one state number into `value`. Return 0; -103 when the key is missing, `value` is then -1 (format,
// volume and connect state) or 0 (progress).
[[nodiscard]] int ktree_get_lun_format_state(int dbidx, int lun_dbidx, int* value);
[[nodiscard]] int ktree_get_lun_format_progress(int dbidx, int lun_dbidx, int* value);
[[nodiscard]] int ktree_get_lun_volume_state(int dbidx, int lun_dbidx, int* value);
[[nodiscard]] int ktree_get_connect_state(int dbidx, int* value);

// Writes the LUN's access right. Returns 0; -1 for a right that is neither VOL_AC_RW nor VOL_AC_RO or a dbidx
// below 1; -103.
[[nodiscard]] int ktree_update_lun_vol_access_right(int right, int dbidx, int lun_dbidx);

// Reads the LUN's access right into `right`: VOL_AC_RO only when the key holds 0, else VOL_AC_RW. Returns 0,
// or -1 for a null `right` or a dbidx below 1.
[[nodiscard]] int ktree_get_lun_vol_access_right(int* right, int dbidx, int lun_dbidx);

// Writes the format state of the entry's LUN. Returns 0 or -103.
[[nodiscard]] int ktree_update_formatting_state(const TargetEntry* entry, int state);

// Returns whether no LUN of the target is being formatted or waits for that, by the stored states.
[[nodiscard]] bool is_no_lun_formatting(const char* target_name);

// Writes the format progress in percent. Returns 0, -1 for a dbidx below 1, or -103.
[[nodiscard]] int ktree_update_format_progress(int dbidx, int lun_dbidx, int percent);

// Writes the volume state of the entry's LUN. Returns 0 or -103.
[[nodiscard]] int ktree_update_volume_state(const TargetEntry* entry, int state);

// Writes one volume state to every LUN of the entry's target, up to the first empty slot, and leaves the last
// slot in lun_db_idx. Returns 0, -1 for a null entry or an unknown target, or the first failing result.
[[nodiscard]] int ktree_update_all_volume_state(TargetEntry* entry, int state);

// Records a mount: copies the node and the mount point into the entry and writes both and the file-system
// type to the tree, in one try each. Returns 0; write failures are ignored.
[[nodiscard]] int ktree_update_mount_info(TargetEntry* entry, const char* node, const char* mount_point,
                                          const char* fs_type);

// Writes the initiator's iSCSI name. Returns 0 or -103.
[[nodiscard]] int ktree_update_initiator_iqn(const char* name);

// Stores the entry's conn_set, in one try. Returns 0 or -103.
[[nodiscard]] int ktree_record_connect_set(const TargetEntry* entry);

// What is stored of the work on a LUN that is not mounted.
struct LunState {
  int format;  // FormatState, -1 when missing
  int volume;  // VolumeState, -1 when missing
};

[[nodiscard]] LunState read_lun_state(int dbidx, int lun_dbidx);

}  // namespace remvol

#endif
