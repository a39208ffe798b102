// The partitions of a disk as the kernel knows them, and telling it about new and grown ones.
//
// Kernels exist that read no partition tables by themselves, and BLKRRPART succeeds there without effect; so
// partitions are announced one by one (BLKPG, as partx(8) does), and what came of it is read back from sysfs.
#ifndef PLATFORM_SYSAUX_PARTITIONS_H
#define PLATFORM_SYSAUX_PARTITIONS_H

#include <sys/types.h>

#include <cstddef>

namespace sysaux {

constexpr int kMaxPartitions = 256;  // DISK_MAX_PARTS of the kernel

// Start and size in units of 512 bytes.
struct Extent {
  int number;
  long long start;
  long long size;
};

struct Partition {
  Extent extent;
  char name[32];  // DISK_NAME_LEN of the kernel
};

struct DiskPartitions {
  int count;
  Partition at[kMaxPartitions];
};

// Reads the partitions that the kernel has for the disk whose sysfs directory is `block_dir`, in the order of
// their numbers. Returns false when the directory cannot be read.
bool read_partitions(int block_dir, DiskPartitions* list);

// Makes the kernel's view of one partition what `extent` says: adds it when it is not there, grows it when it
// starts there. `disk` is an open descriptor of the whole disk. Returns true when sysfs then shows just that,
// which is put into `shown`.
bool announce_partition(int disk, int block_dir, const Extent& extent, Partition* shown);

// Waits until /dev has the partition's node, at most 5 seconds, and not at all where /dev has not even the
// node of the disk: nothing fills such a /dev. `disk` and `partition` are kernel names. Returns true when the
// node is there.
bool wait_for_node(int block_dir, const char* disk, const char* partition);

}  // namespace sysaux

#endif
