// Looks at what is on a disk, for which its node is open a moment. Whoever ends the users of the node would
// end the run that looks as one of them, so each waits for the other; for looks at other disks nobody does.
#ifndef REMVOL_SUPPORT_DISK_LOOK_H
#define REMVOL_SUPPORT_DISK_LOOK_H

#include "support/run_lock.h"

namespace remvol {

// A look at the node, such as "/dev/sdb1". Looks go on beside each other. Users who are being ended are
// waited for, 15 seconds at most. Without a name there is nothing to look at, and nothing is locked.
class DiskLook {
 public:
  explicit DiskLook(const char* node);

 private:
  RunLock lock_;
};

// While it lives no other run looks at the node. Looks that are under way are waited for, 5 seconds at most.
class DiskLooksHeldOff {
 public:
  explicit DiskLooksHeldOff(const char* node);

 private:
  RunLock lock_;
};

}  // namespace remvol

#endif
