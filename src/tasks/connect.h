// Handlers of connect and disconnect.
#ifndef REMVOL_TASKS_CONNECT_H
#define REMVOL_TASKS_CONNECT_H

namespace remvol {

// Logs the requested target in and mounts its enabled LUNs. Returns 0; -103 unknown target; the result of a
// failed login; -1 when its disks cannot be found.
int task_connect();

// Takes the requested target offline, or with `all` non-zero every target. Returns 0; 1 when logging out of
// all nodes failed; -1 for an unknown target.
int task_disconnect(int all);

}  // namespace remvol

#endif
