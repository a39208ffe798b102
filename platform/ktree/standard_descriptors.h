// The descriptors 0 to 2 of a process that was started without some of them.
#ifndef PLATFORM_KTREE_STANDARD_DESCRIPTORS_H
#define PLATFORM_KTREE_STANDARD_DESCRIPTORS_H

#include <fcntl.h>
#include <unistd.h>

namespace ktree {

// Fills those that are closed, so that no file or socket gets their numbers and, with them, what the process
// prints. Writing to a filled one fails.
inline void fill_standard_descriptors() {
  int fd = 0;
  do {
    fd = open("/dev/null", O_RDONLY);
  } while (fd >= 0 && fd <= STDERR_FILENO);
  if (fd >= 0) close(fd);
}

}  // namespace ktree

#endif
