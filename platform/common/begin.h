// How a program of the platform begins.
#ifndef PLATFORM_COMMON_BEGIN_H
#define PLATFORM_COMMON_BEGIN_H

#include <sys/prctl.h>

#include <csignal>

namespace platform {

// Comes first in main(). The end of a child is heard of: a caller that ignores it passes that on. No core is
// left, which would hold the passwords of the tree; the programs that are started may leave one.
inline void begin() {
  signal(SIGCHLD, SIG_DFL);
  prctl(PR_SET_DUMPABLE, 0);
}

}  // namespace platform

#endif
