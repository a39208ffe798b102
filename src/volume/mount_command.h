// mount(8): the command of every file system that a volume may carry.
#ifndef REMVOL_VOLUME_MOUNT_COMMAND_H
#define REMVOL_VOLUME_MOUNT_COMMAND_H

#include "frontend/log.h"

namespace remvol {

// Returns whether there is a command for the file system.
bool is_mountable(const char* fs_type);

// Mounts the node, which carries `fs_type`, on the mount point, in up to four tries half a second apart. On a
// kernel without the driver that the command names, the stock kernel's own driver for that file system is
// tried once after them. Requires is_mountable(fs_type). Failures are logged in the caller's name; whether
// the mount took hold is for the caller to ask.
void run_mount(const char* fs_type, const char* node, const char* mount_point);

}  // namespace remvol

#endif
