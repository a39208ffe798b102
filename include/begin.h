// How the tool and the programs of the platform begin.
#ifndef REMVOL_BEGIN_H
#define REMVOL_BEGIN_H

#include <fcntl.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <csignal>

namespace remvol {

// Comes first in main(). The end of a child is heard of: a caller that ignores it passes that on. No core is
// left, which would hold the passwords of the tree; the programs that are started may leave one. A standard
// stream that is missing gives and takes nothing: else the next file that is opened would stand in its place,
// and programs that are started would have it.
inline void begin() {
  signal(SIGCHLD, SIG_DFL);
  prctl(PR_SET_DUMPABLE, 0);
  int stream = -1;
  do stream = open("/dev/null", O_RDONLY | O_NOCTTY);  // what is written to it fails, as before
  while (stream >= 0 && stream <= STDERR_FILENO);
  if (stream > STDERR_FILENO) close(stream);
}

}  // namespace remvol

#endif
