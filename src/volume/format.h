// Formatting a partition, with progress published in the tree, one format at a time on the machine.
#ifndef REMVOL_VOLUME_FORMAT_H
#define REMVOL_VOLUME_FORMAT_H

#include "tree/record.h"
#include "volume/disk_use.h"

namespace remvol {

enum [[nodiscard]] FormatResult : int;
enum FormatResult : int {
  kFormatted = 0,        // also when mke2fs could not be started, failed, or a state could not be stored
  kFormatLeftAlone = 1,  // the partition is mounted, or carries what was not seen on it
  kFormatRefused = -1,   // bad arguments, no semaphore, another disk than the entry's or one that is in use
  kFormatNotWritable = -2,  // the partition; this run keeps the semaphore until it ends
  kFormatNotStarted = -3,   // mke2fs could not be started: of a step alone, not told
};

// What a partition carried when its format was decided.
struct SeenContent {
  const char* fs_type;  // empty unless an earlier partition left it in the place of this new one
  ContentMark mark;
};

// Formats the partition node `partition` for the entry's LUN, with the ext2, ext3 or ext4 found on it, else
// with ext4. `seen` is null when the user asked for a format, whatever is there. The result is that of
// leaving the semaphore, whatever happened before (0, or -2 as if the partition could not be written), unless
// it is told above.
FormatResult Target_format(TargetEntry* entry, const char* partition, const SeenContent* seen = nullptr);

enum [[nodiscard]] ProcessState : int;
enum ProcessState : int { kRunning = 0, kNotRunning = 1 };

// Asks for a mke2fs on a SCSI disk.
ProcessState check_mkfs_process_existing();

// Asks for a resize2fs whose command line contains `device`.
ProcessState check_resizing_fs(const char* device);

}  // namespace remvol

#endif
