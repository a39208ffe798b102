// Whether a target is logged in.
#ifndef REMVOL_ISCSI_SESSION_CHECK_H
#define REMVOL_ISCSI_SESSION_CHECK_H

namespace remvol {

// Returns 1 when a session to the target called `name` exists; 0 when not (also when there is no session at
// all, or the listing could not be read); -1 for a null or empty name; -106 when the listing command failed.
[[nodiscard]] int check_target_connected(const char* name);

// Runs `command`, which lists the sessions. Returns 0; 1 when there is no session at all; -106 when the
// command failed, which is logged in the innermost scope's name.
[[nodiscard]] int list_sessions(const char* command);

}  // namespace remvol

#endif
