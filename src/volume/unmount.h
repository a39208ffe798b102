// Taking volumes away, and the second mount of a volume in the public FTP area.
#ifndef REMVOL_VOLUME_UNMOUNT_H
#define REMVOL_VOLUME_UNMOUNT_H

#include "support/result.h"
#include "tree/record.h"

namespace remvol {

// Kills the volume's users, unmounts it and removes its mount point. Returns 0, also when there is no mount
// point; -1 for a bad entry or when the mount point could not be removed.
Result Target_LUN_umount(const TargetEntry* entry);

// Unmounts a volume whose LUN was deleted from the tree while this run mounted it, or is unknown to a tree
// that was started anew meanwhile.
void unmount_if_deleted(const TargetEntry* entry);

// Does that again for every volume of which it was asked and that stayed: the tree's daemon may have died
// since, and what was added last is not in the settings that a new one has loaded. The volume would be
// nobody's, and its share name given again. The share services reload then.
void unmount_lost_volumes();

// Unmounts every LUN of the target up to the first empty slot. Returns 0, or -1 when the slot is empty.
Result Target_umount_all_lun(int dbidx);

// Unmounts every LUN of every target; both walks stop at the first empty slot.
void Target_umount_all();

// Kills the users of a mount outside "/mnt/VV/" and unmounts it, as often as it takes, up to four times,
// while it is one. Returns whether it is gone, or one of several that lay there. Logs in the innermost
// scope's name.
[[nodiscard]] bool unmount_second_mount(const char* path);

// Finds the entry's second mount, below "/home/Public", and puts its path into `path` (512 bytes). Returns 0,
// -104 when there is none, -105 when /proc/mounts cannot be opened.
Result get_ftp_share_path(const TargetEntry* entry, char* path);

// Unmounts the FTP mount. Returns 0 or -1.
Result Target_umount_ftp(const TargetEntry* entry, const char* path);

// Has the share services bring the FTP view back. Returns 0, or -1 for an empty path.
Result Target_remount_ftp(const TargetEntry* entry, const char* path);

}  // namespace remvol

#endif
