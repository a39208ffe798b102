// Finding volumes that the kernel turned read-only.
#ifndef REMVOL_VOLUME_DEGRADE_H
#define REMVOL_VOLUME_DEGRADE_H

namespace remvol {

// Access right of a device in a mount table.
enum MountRight : int {
  kMountedRw = 0,
  kMountedRo = 1,
  kMountedUnclear = 2,    // an entry with neither option
  kNotMounted = -1,       // no entry
  kTableUnreadable = -2,  // or an invalid device
};

// Return the MountRight of `device` in the table at `table`, in /etc/mtab (what it was mounted with), in
// /proc/mounts (what the kernel says now).
int get_mnt_ac_right_from_mnt_file(const char* device, const char* table);
int get_mtab_access_right(const char* device);
int get_proc_mount_access_right(const char* device);

// Returns 1 when the volume turned read-only, 0 when not (or it was mounted so), -1 when the device is not in
// one of the tables, -2 on other failures. `mount_path` may be empty: no remount is tried then.
int check_mnt_dev_degrade_to_ro(const char* device, const char* mount_path);

// Returns whether the file system mounted on the path refuses a write, whatever the tables say of it.
bool refuses_writes(const char* mount_path);

}  // namespace remvol

#endif
