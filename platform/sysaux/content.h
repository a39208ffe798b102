// What a block device carries, recognised by libblkid's low-level probing. The library's cache, which may be
// old, is never asked.
#ifndef PLATFORM_SYSAUX_CONTENT_H
#define PLATFORM_SYSAUX_CONTENT_H

#include "sysaux/partitions.h"

namespace sysaux {

enum class Content {
  kNothing,     // no signature that libblkid knows
  kSignature,   // a file system, LVM, RAID, encryption, swap ... or several that contradict each other
  kEmptyTable,  // a partition table without partitions, and nothing else
  kPartitions,  // a partition table with partitions
  kUnreadable,  // a read failed, so nothing is known
};

// Recognises what the open device carries. A signature whose checksum is wrong counts: it marks data that
// somebody may want to save. The name goes into `name`, which holds 16 characters, cut when longer: that of
// the file system or other signature, "ambivalent" when several contradict each other, "damaged_..." when
// only copies of a file system's first sectors are left, the table's name for a table; empty otherwise. A
// table that libblkid tells of only when asked for partitions, a BSD disk label, is a signature: the kernel
// has no disks for its partitions.
Content recognise(int device, char name[16]);

// The partitions that the partition table of the open disk has, in the order of their numbers, at most `max`.
// Returns their number, 0 also when there is no table, -1 when they are not known: a read failed, or only the
// protective MBR of a GPT is left. A table that is left in the backup GPT alone counts.
int read_table(int disk, Extent* extents, int max);

}  // namespace sysaux

#endif
