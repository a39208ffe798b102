// Whether a target is logged in.
#ifndef REMVOL_ISCSI_SESSION_CHECK_H
#define REMVOL_ISCSI_SESSION_CHECK_H

namespace remvol {

// Returns 1 when a session to the target called `name` exists; 0 when not (also when there is no session at
// all, or the listing could not be read); -1 for a null or empty name; -106 when the listing command failed.
int check_target_connected(const char* name);

}  // namespace remvol

#endif
