// Formatting a partition, with progress published in the tree, one format at a time on the machine.
#ifndef REMVOL_VOLUME_FORMAT_H
#define REMVOL_VOLUME_FORMAT_H

#include "tree/record.h"

namespace remvol {

// Formats the partition node `partition` for the entry's LUN, with the ext2, ext3 or ext4 found on it, else
// with ext4. Returns -1 for bad arguments or when the wait for the semaphore failed; -2 when the partition
// cannot be written (this run then keeps the semaphore until it ends); else the result of leaving the
// semaphore, whatever happened before: 0 also when mke2fs could not be started, failed, or a state could not
// be stored.
int Target_format(TargetEntry* entry, const char* partition);

// Returns 0 when a mke2fs on a SCSI disk is running, else 1.
int check_mkfs_process_existing();

// Returns 0 when a resize2fs whose command line contains `device` is running, else 1.
int check_resizing_fs(const char* device);

}  // namespace remvol

#endif
