// Mounting what is mounted anew, in place.
#ifndef REMVOL_VOLUME_REMOUNT_H
#define REMVOL_VOLUME_REMOUNT_H

#include "support/result.h"

namespace remvol {

// Remounts a mount point in place and waits. `wait_seconds` 0: no wait; below 4: 3 seconds. Returns 0, also
// when `path` is no mount point; -1 for a null path or a failed remount.
Result remount_mnt_path(const char* path, int wait_seconds);

}  // namespace remvol

#endif
