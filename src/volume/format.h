// Formatting a partition, with progress published in the tree, one format at a time on the machine.
#ifndef REMVOL_VOLUME_FORMAT_H
#define REMVOL_VOLUME_FORMAT_H

#include "tree/record.h"
#include "volume/disk_use.h"

namespace remvol {

// Result of a format for a partition that was put to use while the run waited for its turn.
inline constexpr int kFormatLeftAlone = 1;

// Formats the partition node `partition` for the entry's LUN, with the ext2, ext3 or ext4 found on it, else
// with ext4. `seen_empty` is the partition's mark from when nothing was recognised on it; kNoMark when the
// user asked for a format, whatever is on it. Returns -1 for bad arguments, when the wait for the semaphore
// failed, for another disk than the entry's or one that is in use; -2 when the partition cannot be written
// (this run then keeps the semaphore until it ends); kFormatLeftAlone when it is mounted, or no longer as it
// was seen and recognised; else the result of leaving the semaphore, whatever happened before: 0 also when
// mke2fs could not be started, failed, or a state could not be stored.
int Target_format(TargetEntry* entry, const char* partition, ContentMark seen_empty = kNoMark);

// Returns 0 when a mke2fs on a SCSI disk is running, else 1.
int check_mkfs_process_existing();

// Returns 0 when a resize2fs whose command line contains `device` is running, else 1.
int check_resizing_fs(const char* device);

}  // namespace remvol

#endif
