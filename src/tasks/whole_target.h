// A whole target brought up or given up: its session together with the volumes on it and their shares.
#ifndef REMVOL_TASKS_WHOLE_TARGET_H
#define REMVOL_TASKS_WHOLE_TARGET_H

#include "tree/record.h"
#include "tree_layout.h"

namespace remvol {

// Logs out, clears conn_set in the entry and sets the connect state "disconnected". Returns 0, or 1 when the
// command failed.
[[nodiscard]] int Target_Logout(TargetEntry* entry);

// Logs out of all targets, whosever they are, but of those with a disk that is in use by then, once all
// volumes are unmounted. Returns 0; 1 when a command failed, a volume or the session of a stored target
// stays, or there was nothing to log out of.
[[nodiscard]] int log_out_all();

// Logs out a target that was deleted while this run brought it up: the run that deleted it may have found no
// session yet.
void log_out_if_deleted(TargetEntry* entry);

// Gives up a login whose session shows no disk that could be mounted: logs out, stores that the target stays
// disconnected and `state` for all its LUNs. `reason` is the result of ktree_update_dev; it and the outcome
// are logged in the innermost scope's name.
void give_up_session(TargetEntry* entry, int reason, VolumeState state);

// Logs out and changes nothing else, unless a volume is mounted from the session, which is logged. Returns 0,
// 1 when the command failed, -1 for an empty target name.
[[nodiscard]] int _target_disconnect(const TargetEntry* entry);

// Unmounts all volumes of the target, reloads the shares, logs out and stores that the target stays
// disconnected. While a disk of the session is in use all the same, that stays. Returns 0, 1 when the logout
// command failed, kSessionStays, or -1 when the target is unknown.
[[nodiscard]] int Target_Disconnect(TargetEntry* entry);

// Start-up: builds the node record of every stored target, logs in to those that are set to connect and
// mounts their volumes. Returns the result of the last target handled.
[[nodiscard]] int Target_load_all();

}  // namespace remvol

#endif
