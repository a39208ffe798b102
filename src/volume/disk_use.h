// What others do with a disk just now: mount it, fill it, partition it, look at it. Asked of the kernel, so
// that a disk that has come into use since it was chosen is left as it is.
#ifndef REMVOL_VOLUME_DISK_USE_H
#define REMVOL_VOLUME_DISK_USE_H

#include <cstdint>

#include "support/disk_look.h"

namespace remvol {

// Stands for the beginning of a partition; two that differ tell that it was written in between.
using ContentMark = uint64_t;
inline constexpr ContentMark kNoMark = 0;  // it cannot be read

// Keeps the disk of a partition's node open. For so long the kernel gives the disk's name to no other,
// whatever becomes of its session. A node that is the disk itself is not opened: whoever ends its users would
// end this run.
class DiskHeld {
 public:
  explicit DiskHeld(const char* partition);
  ~DiskHeld();
  DiskHeld(const DiskHeld&) = delete;
  DiskHeld& operator=(const DiskHeld&) = delete;

 private:
  int fd_ = -1;
};

// Returns the mark of the first 4 KiB, where every file system that the tool makes notes its last mount.
[[nodiscard]] ContentMark content_mark(const char* node);

// Returns whether the mount table has the block device `node`; not when that cannot be told.
[[nodiscard]] bool is_node_mounted(const char* node);

// Returns whether the kernel has the block device `node` claimed: mounted anywhere, also where this process
// cannot see it, or part of an array. A mount that goes away just now is waited for, a second at most.
[[nodiscard]] bool is_node_claimed(const char* node);

// Returns whether the kernel knows a partition of the disk `name`, such as sdb.
[[nodiscard]] bool has_partition(const char* name);

// While it lives no other run looks at the node. Before that, and again if events came while a look was
// waited for, udev is waited for, 5 seconds at most, while it has events pending or holds the lock on the
// disk; not where there is no udev. Whoever kills the users of a node that udev looks at leaves /dev/disk
// without links.
class NodeLeftAlone {
 public:
  explicit NodeLeftAlone(const char* node);

 private:
  bool udev_is_idle_;
  DiskLooksHeldOff looks_;
};

}  // namespace remvol

#endif
