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

#include "common/fd.h"
#include "sysaux.h"

namespace {

enum class KernelAnswer { kNo, kYes, kUnknown };

KernelAnswer ask_kernel(int directory, const char* path, int flags) {
  struct statx info;
  if (statx(directory, path, flags | AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC, 0, &info) != 0) {
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

bool is_mount_root(int directory, const char* path, int flags, const char* name) {
  const KernelAnswer answer = ask_kernel(directory, path, flags);
  return answer == KernelAnswer::kUnknown ? listed(name) : answer == KernelAnswer::kYes;
}

}  // namespace

extern "C" {

int sys_mount_point(const char* path) {
  if (path == nullptr || path[0] == '\0') return 0;
  return is_mount_root(AT_FDCWD, path, 0, path) ? 1 : 0;
}

// One descriptor serves both questions, so the numbers are never those of the file system below a volume that
// was unmounted in between.
int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                    unsigned long long* available) {
  if (path == nullptr || path[0] == '\0') return -1;
  const platform::Fd place(open(path, O_PATH | O_CLOEXEC));
  struct statvfs space;
  if (!place.ok() || !is_mount_root(place.get(), "", AT_EMPTY_PATH, path)) return -1;
  if (fstatvfs(place.get(), &space) != 0) return -1;
  const unsigned long long unit = space.f_frsize;
  *total = space.f_blocks * unit;
  *used = (space.f_blocks - space.f_bfree) * unit;
  *available = space.f_bavail * unit;
  return 0;
}

}  // extern "C"
