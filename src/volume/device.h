// Block-device nodes of a LUN's disk and its partitions.
#ifndef REMVOL_VOLUME_DEVICE_H
#define REMVOL_VOLUME_DEVICE_H

#include "support/result.h"
#include "support/text.h"

namespace remvol {

struct DeviceId {
  char name[16];  // cut to 15 characters
  unsigned major;
  unsigned minor;
};

// Puts the disk's name into `parent` when `name` is a partition: the text before its first digit, the first
// two characters not looked at (sdb1 is a partition of sdb; md127 counts as one of md). Returns whether it is
// one.
[[nodiscard]] bool get_parent_disk(char (&parent)[256], const char* name);

// Returns the name of the disk of `node`, a disk or partition with or without "/dev/" in front.
[[nodiscard]] Text<256> disk_of_node(const char* node);

// Fills `id` (cleared by the caller) for a disk or partition by its kernel name, from sysfs. Returns 0 or -1.
Result _get_dev_id(DeviceId* id, const char* name);

// Makes /dev/<name> unless it is a block device already; anything else there is removed. Returns 0 when the
// step ran, even if mknod(2) failed; -1 when the name is missing or sysfs does not know the device.
Result _create_device_node(const char* name);

}  // namespace remvol

#endif
