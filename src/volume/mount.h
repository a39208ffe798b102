// Mounting a LUN as a shared folder under "/mnt/VV/".
#ifndef REMVOL_VOLUME_MOUNT_H
#define REMVOL_VOLUME_MOUNT_H

#include "support/result.h"
#include "tree/record.h"
#include "volume/mount_result.h"

namespace remvol {

// Partitions, formats (when `force_format` is non-zero or there is no file system), mounts and records the
// entry's LUN; reloads the share services when `update_share` is non-zero. Where the mount never took hold,
// the result is kMounted and the volume state 3.
MountResult Target_mount(TargetEntry* entry, int force_format, int update_share);

// Mounts every LUN of the target up to the first empty slot and refreshes its status. One that was deleted
// meanwhile is unmounted. Returns 0, or -1 for a null entry or a db_idx below 1.
Result Target_mount_all_lun(TargetEntry* entry, int force_format, int update_share);

}  // namespace remvol

#endif
