// The table of mounts, as the kernel shows it.
#ifndef PLATFORM_COMMON_MOUNTS_H
#define PLATFORM_COMMON_MOUNTS_H

#include <sys/types.h>

#include <string>
#include <string_view>
#include <vector>

namespace platform {

struct Mount {
  std::string point;
  dev_t device = 0;
  std::string options;  // those of the mount and of its file system, such as "ro,relatime,errors=remount-ro"
};

// The mounts of a text as /proc/self/mountinfo has it, in its order; a line that is none is left out.
std::vector<Mount> mounts_of(std::string_view text);

// Those of this process; none when they cannot be read.
std::vector<Mount> read_mounts();

// What is mounted on `point`: the last one, which hides the others. Null when nothing is.
const Mount* mount_on(const std::vector<Mount>& mounts, std::string_view point);

}  // namespace platform

#endif
