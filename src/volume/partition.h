// The one partition of a LUN's disk.
#ifndef REMVOL_VOLUME_PARTITION_H
#define REMVOL_VOLUME_PARTITION_H

#include "tree/record.h"

namespace remvol {

// Returns 1 when the only partition of the disk at path `device` falls more than 100,000,000 bytes short of
// the disk's end, 0 when it does not or there is not exactly one, -1 on a bad argument.
int check_1part_disk_need_to_expand(const char* device);

}  // namespace remvol

#endif
