// The one partition of a LUN's disk.
#ifndef REMVOL_VOLUME_PARTITION_H
#define REMVOL_VOLUME_PARTITION_H

#include "frontend/log.h"
#include "tree/record.h"

namespace remvol {

// Kernel names of a disk's partitions, separated by commas or blanks.
using PartitionList = char[1024];

// Returns 1 when the only partition of the disk at path `device` falls more than 100,000,000 bytes short of
// the disk's end, 0 when it does not or there is not exactly one, -1 on a bad argument.
int check_1part_disk_need_to_expand(const char* device);

// Makes the entry's disk ready: an empty one gets one partition (`force_format` is then set to 1), a single
// partition that falls well short of the disk's end is grown, several are left as they are. Lists the
// partitions and makes the disk's node when missing. Keeps the volume state meanwhile. Returns 0,
// kMountTooSmall (also for a disk that is not the entry's: the LUN is offline then), kMountNoPartition, or -1
// when the node could not be made.
int prepare_partitions(const TargetEntry* entry, PartitionList& partitions, int* force_format);

}  // namespace remvol

#endif
