#include "volume/mount_point.h"

#include <fcntl.h>
#include <mntent.h>
#include <sys/mount.h>
#include <unistd.h>

#include <climits>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "sysaux.h"

namespace remvol {

namespace {

constexpr char kMountTable[] = "/proc/self/mounts";
constexpr int kMaxLayers = 32;

struct TableCloser {
  void operator()(FILE* table) const { endmntent(table); }
};

// Writes out what the file system mounted on `path` holds. A path that cannot be opened is left to the
// kernel, which syncs a detached file system when its last user ends.
void sync_mount(const char* path) {
  const int fd = open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return;
  syncfs(fd);
  close(fd);
}

bool is_at_or_below(const char* path, const char* root) {
  const size_t length = strlen(root);
  return strncmp(path, root, length) == 0 && (path[length] == '\0' || path[length] == '/');
}

}  // namespace

MountPointText mount_point_of(const char* share) {
  return MountPointText("%s%s", kMountRoot, share);
}

bool is_share_inside_root(const char* share, Caller caller) {
  bool named = false;
  bool climbs = false;
  for (const char* component = share; *component != '\0';) {
    const size_t length = strcspn(component, "/");
    const bool dots = strspn(component, ".") == length && length <= 2;
    climbs = climbs || (dots && length == 2);
    named = named || !dots;
    component += length;
    component += strspn(component, "/");
  }
  if (named && !climbs) return true;
  LOG_AT(caller, 0, "share name %s leaves %s", share, kMountRoot);
  return false;
}

CommandText command_on_path(const char* verb, const char* path) {
  char escaped[CommandText::size() / 2];
  if (str_insert_back_slash(escaped, sizeof escaped, path) != 0) return CommandText("false");
  return CommandText("%s \"%s\"", verb, escaped);
}

void detach_mounts(const char* path) {
  for (int layer = 0; layer < kMaxLayers && sys_mount_point(path) != 0; layer++) {
    sync_mount(path);
    if (umount2(path, MNT_DETACH) != 0) return;
  }
}

bool is_removal_unsafe(const char* path, Caller caller) {
  char real[PATH_MAX];
  const char* root = realpath(path, real) != nullptr ? real : path;
  const std::unique_ptr<FILE, TableCloser> table(setmntent(kMountTable, "re"));
  if (!table) {
    LOG_AT(caller, 0, "%s is not removed, Can not open %s", path, kMountTable);
    return true;
  }
  mntent entry;
  char line[3 * PATH_MAX];
  while (getmntent_r(table.get(), &entry, line, sizeof line) != nullptr) {
    if (!is_at_or_below(entry.mnt_dir, root)) continue;
    LOG_AT(caller, 0, "%s is not removed, %s is mounted on %s", path, entry.mnt_fsname, entry.mnt_dir);
    return true;
  }
  return false;
}

}  // namespace remvol
