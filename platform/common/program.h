// Programs that another one starts, and the wait for their end.
#ifndef PLATFORM_COMMON_PROGRAM_H
#define PLATFORM_COMMON_PROGRAM_H

#include <sys/types.h>
#include <unistd.h>

#include <string>
#include <vector>

namespace platform {

// The tool, found through PATH.
inline constexpr char kTool[] = "remvol";

// What a program gets as its standard streams: files of the caller, or /dev/null for kNowhere.
constexpr int kNowhere = -1;
struct Streams {
  int input = STDIN_FILENO;
  int output = STDOUT_FILENO;
  int error = STDERR_FILENO;
};

// Starts the program `file` (found through PATH when it has no slash) with the arguments `argv`, ended by a
// null, and no signal held back. Returns its process number, or -1 with errno.
pid_t start(const char* file, const char* const* argv, const Streams& streams);

// The same with the caller's streams and in a process group of its own: it goes on when the caller is
// stopped.
pid_t start_apart(const char* file, const char* const* argv);

// The words as arguments for the above; they are not copied.
std::vector<const char*> arguments_of(const std::vector<std::string>& words);

// Returns whether the child ends within the time.
bool ends_within(pid_t child, int milliseconds);

// Waits for the end of the child. Returns its status (see wait(2)), or -1 when there is no such child.
int end_of(pid_t child);

// The exit status of one that ended with `status`; -1 when a signal ended it, or when `status` is -1.
int exit_status(int status);

}  // namespace platform

#endif
