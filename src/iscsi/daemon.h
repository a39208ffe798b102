// The daemons that the tool starts and stops.
#ifndef REMVOL_ISCSI_DAEMON_H
#define REMVOL_ISCSI_DAEMON_H

#include "frontend/log.h"

namespace remvol {

// Runs `command`, which puts a daemon in the background, in a process group of its own. Returns 0, or
// non-zero when the command failed, which is logged in the caller's name.
int start_daemon(const char* command);

// Starts a configuration tree daemon that listens on `socket`, and gives it a second to do so.
void start_tree_daemon(const char* socket);

// Stops the ktree whose process number stands in `pid_file`; any other process is left alone. Returns whether
// a process was told to stop.
bool stop_tree_daemon(const char* pid_file);

}  // namespace remvol

#endif
