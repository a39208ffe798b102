// Mount points and the space below them.
//
// The kernel tells by statx(2), since Linux 5.8, whether a path is the root of a mount: one call, no table
// read, and no I/O to the volume. Older kernels and paths that cannot be looked up (a mount that lost its
// server) are answered from /proc/self/mounts by the C library, which decodes the octal escapes there.

#include <fcntl.h>
#include <mntent.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "sysaux.h"

namespace {

enum class KernelAnswer { kNo, kYes, kUnknown };

KernelAnswer ask_kernel(const char* path) {
  struct statx info;
  if (statx(AT_FDCWD, path, AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC, 0, &info) != 0) {
    return errno == ENOENT || errno == ENOTDIR || errno == ENAMETOOLONG ? KernelAnswer::kNo
                                                                        : KernelAnswer::kUnknown;
  }
  if ((info.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) == 0) return KernelAnswer::kUnknown;
  return (info.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0 ? KernelAnswer::kYes : KernelAnswer::kNo;
}

bool listed_once(const char* path) {
  FILE* table = setmntent("/proc/self/mounts", "re");
  if (table == nullptr) return false;
  mntent entry;
  char line[2 * PATH_MAX];
  bool found = false;
  while (!found && getmntent_r(table, &entry, line, sizeof line) != nullptr) {
    found = strcmp(entry.mnt_dir, path) == 0;
  }
  endmntent(table);
  return found;
}

// A table read may miss lines while another process unmounts (until kernel 5.8): "not there" counts only when
// two reads agree.
bool listed(const char* path) {
  char absolute[PATH_MAX];
  const char* name = realpath(path, absolute) != nullptr ? absolute : path;
  return listed_once(name) || listed_once(name);
}

}  // namespace

extern "C" {

int sys_mount_point(const char* path) {
  if (path == nullptr || path[0] == '\0') return 0;
  const KernelAnswer answer = ask_kernel(path);
  return answer == KernelAnswer::kYes || (answer == KernelAnswer::kUnknown && listed(path)) ? 1 : 0;
}

// Without a descriptor, which would make the caller a user of the volume: an unmount would fail, or end the
// caller. Asked before and after, since the numbers are those of the file system below a volume that was
// unmounted in between.
int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                    unsigned long long* available) {
  struct statvfs space;
  if (sys_mount_point(path) == 0 || statvfs(path, &space) != 0 || sys_mount_point(path) == 0) return -1;
  const unsigned long long unit = space.f_frsize;
  *total = space.f_blocks * unit;
  *used = (space.f_blocks - space.f_bfree) * unit;
  *available = space.f_bavail * unit;
  return 0;
}

}  // extern "C"
