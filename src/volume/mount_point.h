// Mount points of volumes: their paths, and what keeps their removal from reaching a volume.
#ifndef REMVOL_VOLUME_MOUNT_POINT_H
#define REMVOL_VOLUME_MOUNT_POINT_H

#include "support/run_lock.h"
#include "support/text.h"
#include "tree_layout.h"
#include "volume/mount_table.h"

namespace remvol {

// The mount root and a share name.
using MountPointText = Text<sizeof kMountRoot + 128>;

// Mounting there, unmounting and removing it, one run after another. Held with it is all below the same first
// folder of the mount root, however the path is written, since one share may lie below another. A run that
// does not come to an end is waited for a minute.
class MountPointHold {
 public:
  explicit MountPointHold(const char* path);

  // Returns whether another run has it still: the mount point is then neither made, since that run may be
  // removing it, nor removed, since that run may be mounting there. Logged at level 0 in the innermost
  // scope's name.
  [[nodiscard]] bool is_anothers(const char* path) const;

 private:
  RunLock lock_;
  LockTry tried_;
};

// Returns the mount point of the share.
[[nodiscard]] MountPointText mount_point_of(const char* share);

// Returns whether the share's mount point lies below the mount root. It does not when the name has a
// component "..", or none besides empty ones and ".", or when the mount point leads through a link; that is
// logged at level 0 in the innermost scope's name.
[[nodiscard]] bool is_share_inside_root(const char* share);

// Returns whether a component of the path below the mount root is a symbolic link: whoever planted it would
// choose what is mounted over and what is removed. Inside a volume that is open to everybody anybody can
// plant one at any moment. Logged at level 0 in the innermost scope's name.
[[nodiscard]] bool leads_through_link(const char* path);

// Returns whether the kernel's table shows the block device `node`, by its number and whatever its name, as
// mounted on `path`, and nothing else covers it there; `mount` is the table's line then.
[[nodiscard]] bool is_mounted_from(const char* node, const char* path, MountLine* mount);

// Detaches what is mounted on `path`, layer by layer, each synced before; see umount2(2), MNT_DETACH.
// Processes that use a layer keep it until they end. Stops at the first layer that cannot be detached.
void detach_mounts(const char* path);

// Returns whether "rm -rf" of `path`, which is below the mount root, would leave the root through a link or
// run into a mounted file system: one is mounted on the path or below it, or the path lies inside another
// volume. Where the kernel's table cannot be read, the path itself is asked. Logged at level 0 in the
// innermost scope's name.
[[nodiscard]] bool is_removal_unsafe(const char* path);

}  // namespace remvol

#endif
