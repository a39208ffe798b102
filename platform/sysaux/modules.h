// The private modules of the library. What a call on disks needs beyond the C library (libblkid, libfdisk,
// libext2fs) is loaded when such a call is first made, so that a program which makes none does not pay for it
// at its start. The modules lie beside libsysaux.so and export only these functions; the contracts are those
// of the public calls of the same name in sysaux.h.
#ifndef PLATFORM_SYSAUX_MODULES_H
#define PLATFORM_SYSAUX_MODULES_H

#define SYSAUX_EXPORT __attribute__((visibility("default")))

extern "C" {

// libsysaux_probe.so: recognises, by libblkid. The node of the first is a block device.
SYSAUX_EXPORT int sysaux_probe_fs_type(char* out, const char* node);
SYSAUX_EXPORT int sysaux_probe_partition_list(char* out, const char* device);

// libsysaux_disk.so: changes partition tables, by libfdisk.
SYSAUX_EXPORT int sysaux_disk_create_1_partition(const char* device);
SYSAUX_EXPORT int sysaux_disk_expand_1_partition(const char* device);

// libsysaux_state.so: reads the state of a file system, by libext2fs.
SYSAUX_EXPORT int sysaux_state_check_fs_state(const char* node);

}  // extern "C"

#endif
