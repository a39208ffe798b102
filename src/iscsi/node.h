// Node records, login and logout. A login is judged by the session listing alone, never by an exit status.
#ifndef REMVOL_ISCSI_NODE_H
#define REMVOL_ISCSI_NODE_H

#include "frontend/log.h"
#include "tree/record.h"
#include "tree/state.h"

namespace remvol {

// Builds the target's node record from scratch, CHAP settings included. Returns 0; -1 when the entry is null
// or no interface could be chosen. Failed commands are logged and ignored.
int Target_Config_Gen(TargetEntry* entry);

// Deletes the target's node record for the entry's portal. Returns 0, also when the command failed (there may
// be no record); -1 when the entry is null or no interface could be chosen.
int _target_record_delete(TargetEntry* entry);

// Logs in. Returns 0; 1 when the login was not confirmed or the command did not start; -1 when no interface
// could be chosen or the port is out of range.
int _target_login(TargetEntry* entry);

// Sets the connect state "connecting" and logs in. Returns 0 or -1. The caller writes the state that follows.
int Target_Connect(TargetEntry* entry);

// Logs out, clears conn_set in the entry and sets the connect state "disconnected". Returns 0, or 1 when the
// command failed.
int Target_Logout(TargetEntry* entry);

// Gives up a login whose session shows no disk that could be mounted: logs out, stores that the target stays
// disconnected and `state` for all its LUNs. `reason` is the result of ktree_update_dev; it and the outcome
// are logged in the caller's name.
void give_up_session(TargetEntry* entry, int reason, VolumeState state);

// Logs out and changes nothing else. Returns 0, 1 when the command failed, -1 for an empty target name.
int _target_disconnect(const TargetEntry* entry);

// Unmounts all volumes of the target, reloads the shares, logs out and stores that the target stays
// disconnected. Returns 0, 1 when the logout command failed, -1 when the target is unknown.
int Target_Disconnect(TargetEntry* entry);

// Start-up: builds the node record of every stored target, logs in to those that are set to connect and
// mounts their volumes. Returns the result of the last target handled.
int Target_load_all();

}  // namespace remvol

#endif
