// What is mounted where, by the kernel's own table /proc/self/mountinfo; see proc_pid_mountinfo(5).
// (/proc/mounts is no such table: a file system without a source shifts its columns.)
#ifndef REMVOL_VOLUME_MOUNT_TABLE_H
#define REMVOL_VOLUME_MOUNT_TABLE_H

#include <sys/types.h>

#include <climits>

namespace remvol {

inline constexpr char kMountInfo[] = "/proc/self/mountinfo";
inline constexpr char kProcMounts[] = "/proc/mounts";

// One mount, its texts with the table's escapes undone and cut to their fields.
struct MountLine {
  dev_t device;         // of the file system
  char path[PATH_MAX];  // where it is mounted
  char type[32];
  char source[PATH_MAX];
};

enum class Mounted { kNo, kYes, kUnknown };  // kUnknown: the table cannot be read

// Looks for a mount on `path`, which is absolute and without links, or below it, and puts the first into
// `mount`.
[[nodiscard]] Mounted find_mount_below(const char* path, MountLine* mount);

// Looks for the first mount that `fits(mount, what)`.
[[nodiscard]] Mounted find_mount(bool (*fits)(const MountLine& mount, const void* what), const void* what,
                                 MountLine* mount);

// Looks for a mount of the file system on `device` at `path`, which is absolute and without links; anywhere
// when it is null.
[[nodiscard]] Mounted find_mount_of(dev_t device, const char* path, MountLine* mount);

}  // namespace remvol

#endif
