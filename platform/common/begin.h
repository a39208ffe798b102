// How a program of the platform begins.
#ifndef PLATFORM_COMMON_BEGIN_H
#define PLATFORM_COMMON_BEGIN_H

#include <sys/prctl.h>

namespace platform {

// Comes first in main(). No core is left, which would hold the passwords of the tree; the programs that are
// started may leave one.
inline void begin() {
  prctl(PR_SET_DUMPABLE, 0);
}

}  // namespace platform

#endif
