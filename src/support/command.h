// Running shell commands.
#ifndef REMVOL_SUPPORT_COMMAND_H
#define REMVOL_SUPPORT_COMMAND_H

#include "frontend/log.h"

namespace remvol {

// Runs `command` with system(3). A status other than 0 is logged at level 0 as "system() of cmd '%s' failed"
// in the innermost scope's name; `failure` is kNote where that is no failure of the tool's, such as ending a
// program that does not run. Returns the raw status; see wait(2).
[[nodiscard]] int run_command(const char* command, Weight failure = 0);

// Returns a mark of the commands that this run has waited for: another one once a further command has ended.
[[nodiscard]] long command_mark();

// While it lives, what commands write to standard error goes nowhere: for one whose failure is expected, and
// of which another way is known.
class ErrorsHidden {
 public:
  ErrorsHidden();
  ~ErrorsHidden();
  ErrorsHidden(const ErrorsHidden&) = delete;
  ErrorsHidden& operator=(const ErrorsHidden&) = delete;

 private:
  int kept_;  // the standard error of before; -1 when it could not be kept and is in use
};

// Returns the exit code (bits 8 to 15) of a raw status.
[[nodiscard]] int command_exit_code(int status);

// Logs a raw status at level 2 as "!!!ret=%d, WIFEXITED=%d, WEXITSTATUS=%d" in the innermost scope's name.
void log_command_status(int status);

// Runs `command` up to `cycles` times until it succeeds, with random waits below `max_wait_us` microseconds
// between the tries (none when that is below 2). What fails is the caller's to judge. Returns 0 when one try
// succeeded or `cycles` is below 1, else the raw status of the last try.
[[nodiscard]] int process_system_cmd_mt(const char* command, int cycles, int max_wait_us);

}  // namespace remvol

#endif
