// Finding volumes that the kernel turned read-only.
#ifndef REMVOL_VOLUME_DEGRADE_H
#define REMVOL_VOLUME_DEGRADE_H

namespace remvol {

// Access right of a device in a mount table.
enum [[nodiscard]] MountRight : int;
enum MountRight : int {
  kMountedRw = 0,
  kMountedRo = 1,
  kMountedUnclear = 2,    // an entry with neither option
  kNotMounted = -1,       // no entry
  kTableUnreadable = -2,  // or an invalid device
};

// Return the MountRight of `device` in the table at `table`, in /etc/mtab (what it was mounted with), in
// /proc/mounts (what the kernel says now).
MountRight get_mnt_ac_right_from_mnt_file(const char* device, const char* table);
MountRight get_mtab_access_right(const char* device);
MountRight get_proc_mount_access_right(const char* device);

enum [[nodiscard]] Degradation : int;
enum Degradation : int {
  kNotDegraded = 0,       // or it was mounted read-only
  kDegraded = 1,          // the volume turned read-only
  kDegradeUnlisted = -1,  // the device is not in one of the tables
  kDegradeUnknown = -2,   // other failures
};

// Tells whether the volume turned read-only. `mount_path` may be empty: no remount is tried then.
Degradation check_mnt_dev_degrade_to_ro(const char* device, const char* mount_path);

// Returns whether the file system mounted on the path refuses a write, whatever the tables say of it.
[[nodiscard]] bool refuses_writes(const char* mount_path);

}  // namespace remvol

#endif
