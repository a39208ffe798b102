// The one partition of a LUN's disk.
#ifndef REMVOL_VOLUME_PARTITION_H
#define REMVOL_VOLUME_PARTITION_H

#include "tree/record.h"
#include "volume/mount_result.h"

namespace remvol {

// Kernel names of a disk's partitions, separated by commas or blanks.
using PartitionList = char[1024];

enum [[nodiscard]] PartitionFit : int;
enum PartitionFit : int {
  kPartitionFits = 0,    // or there is not exactly one
  kPartitionShort = 1,   // it ends more than 100,000,000 bytes before the disk does
  kPartitionError = -1,  // a bad argument
};

// Returns how the only partition of the disk at path `device` fills it.
PartitionFit check_1part_disk_need_to_expand(const char* device);

// Makes the entry's disk ready: an empty one gets one partition (`force_format` is then set to 1), a single
// partition that falls well short of the disk's end is grown, several are left as they are. Lists the
// partitions and makes the disk's node when missing. Keeps the volume state meanwhile. Returns kMounted
// for ready, kMountTooSmall (also for a disk that is not the entry's: the LUN is offline then),
// kMountNoPartition, or kMountFailed when the node could not be made.
MountResult prepare_partitions(const TargetEntry* entry, PartitionList& partitions, int* force_format);

}  // namespace remvol

#endif
