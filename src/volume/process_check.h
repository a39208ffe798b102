// Whether a command works on a disk just now, started by whichever run: by ps(1), of which the only text
// stands here, and by what the kernel tells.
#ifndef REMVOL_VOLUME_PROCESS_CHECK_H
#define REMVOL_VOLUME_PROCESS_CHECK_H

namespace remvol {

// Returns whether a process whose line in the process list matches `name` (for grep) has `device` in it.
// Every line looked at is logged at level 2 in the innermost scope's name.
[[nodiscard]] bool is_command_running_on(const char* name, const char* device);

// Returns whether a process called `name` has `device` in its arguments, by its own files; see
// proc_pid_comm(5) and proc_pid_cmdline(5).
[[nodiscard]] bool has_process(const char* name, const char* device);

}  // namespace remvol

#endif
