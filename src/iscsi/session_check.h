// Whether a target is logged in.
#ifndef REMVOL_ISCSI_SESSION_CHECK_H
#define REMVOL_ISCSI_SESSION_CHECK_H

namespace remvol {

// Results of the two below that their callers tell apart.
enum SessionCheck : int {
  kNotLoggedIn = 0,
  kLoggedIn = 1,
};
enum SessionsListed : int {
  kSessionsListed = 0,
  kNoSessionAtAll = 1,
};

// Returns kLoggedIn when a session to the target called `name` exists; kNotLoggedIn when not (also when there
// is no session at all, or the listing could not be read); -1 for a null or empty name; -106 when the listing
// command failed.
[[nodiscard]] int check_target_connected(const char* name);

// Runs `command`, which lists the sessions. Returns a SessionsListed; -106 when the command failed, which is
// logged in the innermost scope's name.
[[nodiscard]] int list_sessions(const char* command);

}  // namespace remvol

#endif
