// What a session shows: the device names of the stored LUNs, and the LUNs that a target offers.
#ifndef REMVOL_ISCSI_SESSION_H
#define REMVOL_ISCSI_SESSION_H

#include "support/lun_list.h"
#include "support/result.h"
#include "tree/record.h"

namespace remvol {

// The devices of a fresh session need a moment before they can be mounted.
inline constexpr unsigned kSettleSeconds = 1;

// Results of ktree_update_dev that its callers tell apart.
enum DeviceResult : int {
  kTargetNotListed = -1,
  kNoRunningDisk = -2,
};

// What _wait_sess_lun_ready gives when the time was too short.
inline constexpr int kNoLunReady = 1;

// Empties the stored device names of the target's LUNs, up to the first empty slot. Returns 0; -1 for a null
// entry or an unknown target; -103 when a write failed.
[[nodiscard]] int ktree_clean_target_dev(TargetEntry* entry);

// Stores the device names of the target's LUNs as the session shows them; the last one found stays in the
// entry's dev. Returns 0 (also when there is no session at all: nothing is changed then); a DeviceResult when
// other sessions exist, but none to the target, or its session shows no running disk of a stored LUN; -103 a
// tree write failed; -106 the listing command failed; or the non-zero result of ktree_clean_target_dev.
[[nodiscard]] int ktree_update_dev(TargetEntry* entry);

// Waits until the target shows a usable LUN: wait_seconds * 10 polls of 100 ms, one poll for 0. Returns 0
// ready (also when there is no session at all); kNoLunReady; -1 bad name; -106 the listing
// command failed.
[[nodiscard]] int _wait_sess_lun_ready(const char* name, int wait_seconds);

// Makes the device node of a disk by its kernel name, such as sdb. Returns 0 or -1.
using DeviceNodeMaker = Result (*)(const char* name);

// Stores the usable LUNs of the target's session in `head`, to be freed with lun_node_free_list. A disk gets
// its node by `make_node` before its size is asked for. Returns 0 (`head` is left unchanged when there is no
// session at all); -1 bad arguments; -106 the listing command failed.
[[nodiscard]] int _get_sess_lun_list(LunNode** head, const char* name, DeviceNodeMaker make_node);

// Prints the list for a person; nothing for a null name.
void print_lun_list(const LunNode* head, const char* name);

}  // namespace remvol

#endif
