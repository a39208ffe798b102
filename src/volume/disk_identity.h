// Whether a disk is the one that a LUN's entry means. Kernel names (sdb) are given anew at every login and
// after a restart, while those in the tree stay: a stored name may be another target's disk by now, or a disk
// of the machine itself.
#ifndef REMVOL_VOLUME_DISK_IDENTITY_H
#define REMVOL_VOLUME_DISK_IDENTITY_H

#include <sys/types.h>

#include "tree/record.h"

namespace remvol {

enum DiskOwner : int {
  kDiskOurs,     // the session of the entry's target, the entry's LUN number
  kDiskForeign,  // another session's, another LUN, or no session's at all: a disk of the machine; also one
                 // that is there and could not be looked at
  kDiskUnknown,  // sysfs tells nothing: no such disk, a virtual one such as a loop device, no target given
};

// Asks sysfs for the disk of `node`, a disk or partition with or without "/dev/" in front.
[[nodiscard]] DiskOwner disk_owner(const TargetEntry* entry, const char* node);

enum class SessionDisk { kNo, kYes, kUnseen };  // kUnseen: it is there and could not be looked at

// Returns whether the disk of `node` is one of a session to the target called `target_name`, or to any when
// that is null.
[[nodiscard]] SessionDisk is_session_disk(const char* node, const char* target_name);

// The same for the disk or partition with this number.
[[nodiscard]] SessionDisk is_session_device(dev_t device, const char* target_name);

// Reads a session's `targetname` of sysfs. Returns whether it has one; a failure leaves its reason in errno.
[[nodiscard]] bool read_session_name(const char* file_path, char (&name)[256]);

// Returns whether sysfs has a disk of `node`, whosever it is.
[[nodiscard]] bool has_disk(const char* node);

// Returns whether the disk of `node` is known to be another one than the entry's; then nothing that changes
// it or ends its users may be done. That is logged at level 0 in the innermost scope's name. A disk that this
// run has seen to be the entry's and that sysfs knows nothing of any more counts as another one: its session
// was closed meanwhile, and the name may be given anew at any moment.
[[nodiscard]] bool is_foreign_disk(const TargetEntry* entry, const char* node);

// Returns whether a disk that is known to be another one than the entry's is mounted on `path`: what is
// mounted there is left alone then, and nothing mounted over it. That is logged at level 0.
[[nodiscard]] bool is_foreign_mount(const TargetEntry* entry, const char* path);

}  // namespace remvol

#endif
