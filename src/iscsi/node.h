// Node records, login and logout. A login is judged by the session listing alone, never by an exit status.
#ifndef REMVOL_ISCSI_NODE_H
#define REMVOL_ISCSI_NODE_H

#include "tree/record.h"

namespace remvol {

// Builds the target's node record from scratch, CHAP settings included. Returns 0; -1 when the entry is null
// or no interface could be chosen. Failed commands are logged and ignored.
[[nodiscard]] int Target_Config_Gen(TargetEntry* entry);

// Deletes the target's node record for the entry's portal, and logs as the step of Target_Config_Gen() that
// it is. Returns 0, also when the command failed (there may be no record); -1 when the entry is null or no
// interface could be chosen.
[[nodiscard]] int delete_node_record(TargetEntry* entry);

// What _target_login gives for a login that did not start, or that no session confirmed.
inline constexpr int kNotConfirmed = 1;

// Logs in. The message that the session is not there names `requested`, the target that the command is for:
// none at start-up. Returns 0; kNotConfirmed; -1 when no interface could be chosen or the port is out of
// range.
[[nodiscard]] int _target_login(TargetEntry* entry, const char* requested);

// Sets the connect state "connecting" and logs in, with `requested` as above. Returns 0 or -1. The caller
// writes the state that follows.
[[nodiscard]] int Target_Connect(TargetEntry* entry, const char* requested);

}  // namespace remvol

#endif
