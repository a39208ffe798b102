// Block-device nodes of a LUN's disk and its partitions.
#ifndef REMVOL_VOLUME_DEVICE_H
#define REMVOL_VOLUME_DEVICE_H

namespace remvol {

struct DeviceId {
  char name[16];
  unsigned major;
  unsigned minor;
};

// Fills `id` (cleared by the caller) for a disk or partition by its kernel name, from sysfs. Returns 0 or -1.
int _get_dev_id(DeviceId* id, const char* name);

// Makes /dev/<name>, and for a disk the nodes of its partitions. Returns 0 when the step ran, even if
// mknod(2) failed; -1 when the name is missing or sysfs does not know the device.
int _create_device_node(const char* name);

}  // namespace remvol

#endif
