// Formatting a partition, with progress published in the tree, one format at a time on the machine.
#ifndef REMVOL_VOLUME_FORMAT_H
#define REMVOL_VOLUME_FORMAT_H

#include "tree/record.h"

namespace remvol {

// Formats the partition node `partition` for the entry's LUN. Returns 0 (also when mke2fs itself failed); -1
// bad arguments or the wait for the semaphore failed; -2 the partition cannot be written; -103 a state could
// not be stored; or the result of leaving the semaphore.
int Target_format(TargetEntry* entry, const char* partition);

// Returns 0 when a mke2fs on a SCSI disk is running, else 1.
int check_mkfs_process_existing();

// Returns 0 when a resize2fs whose command line contains `device` is running, else 1.
int check_resizing_fs(const char* device);

}  // namespace remvol

#endif
