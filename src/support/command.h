// Running shell commands.
#ifndef REMVOL_SUPPORT_COMMAND_H
#define REMVOL_SUPPORT_COMMAND_H

#include "frontend/log.h"

namespace remvol {

// Runs `command` with system(3). A status other than 0 is logged at level 0 as "system() of cmd '%s' failed"
// in the caller's name. Returns the raw status; see wait(2).
int run_command(const char* command, Caller caller = Caller());

// Returns the exit code (bits 8 to 15) of a raw status.
int command_exit_code(int status);

// Logs a raw status at level 2 as "!!!ret=%d, WIFEXITED=%d, WEXITSTATUS=%d" in the caller's name.
void log_command_status(int status, Caller caller = Caller());

// Runs `command` up to `cycles` times until it succeeds, with random waits below `max_wait_us` microseconds
// between the tries (none when that is below 2). Returns 0 when one try succeeded or `cycles` is below 1,
// else the raw status of the last try.
int process_system_cmd_mt(const char* command, int cycles, int max_wait_us);

}  // namespace remvol

#endif
