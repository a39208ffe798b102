// Programs that a daemon starts and that outlive it.
#ifndef PLATFORM_COMMON_START_H
#define PLATFORM_COMMON_START_H

#include <sys/types.h>

namespace platform {

// The tool, found through PATH.
inline constexpr char kTool[] = "remvol";

// Starts the program `file` (found through PATH when it has no slash) with the arguments `argv`, ended by a
// null, with the signals as usual and in a process group of its own: it goes on when the caller is stopped.
// Returns its process number, or -1 with errno.
pid_t start(const char* file, const char* const* argv);

}  // namespace platform

#endif
