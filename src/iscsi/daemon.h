// The daemons that the tool starts and stops. All that it has ktree, ktreec and kill(1) do stands here.
#ifndef REMVOL_ISCSI_DAEMON_H
#define REMVOL_ISCSI_DAEMON_H

#include "support/text.h"

namespace remvol {

// Runs `command`, which puts a daemon in the background, in a process group of its own. Returns 0, or
// non-zero when the command failed, which is logged in the innermost scope's name.
[[nodiscard]] int start_daemon(const char* command);

// Starts a configuration tree daemon that listens on `socket`, and gives it a second to do so.
void start_tree_daemon(const char* socket);

// Stops the ktree whose process number stands in `pid_file`; any other process is left alone. Returns whether
// a process was told to stop.
[[nodiscard]] bool stop_tree_daemon(const char* pid_file);

// The command that this takes.
[[nodiscard]] CommandText stop_tree_command(const char* pid_file);

// The command that loads the file into the tree behind `socket`.
[[nodiscard]] CommandText load_tree_command(const char* socket, const char* file);

}  // namespace remvol

#endif
