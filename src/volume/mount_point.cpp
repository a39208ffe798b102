#include "volume/mount_point.h"

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "sysaux.h"

namespace remvol {

namespace {

constexpr int kMaxLayers = 32;

// Writes out what the file system mounted on `path` holds. A path that cannot be opened is left to the
// kernel, which syncs a detached file system when its last user ends.
void sync_mount(const char* path) {
  const int fd = open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return;
  syncfs(fd);
  close(fd);
}

// Returns whether the path lies on the file system of the mount root, or either is missing.
bool is_on_root_file_system(const char* path) {
  struct stat root;
  struct stat own;
  if (stat(kMountRoot, &root) == 0 && lstat(path, &own) == 0) return own.st_dev == root.st_dev;
  return errno == ENOENT || errno == ENOTDIR;
}

// Returns whether a component of the share's name is ".." or every one is "." or empty.
bool leaves_root(const char* share) {
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
  return climbs || !named;
}

// Returns whether the first `length` characters of the path name a symbolic link.
bool is_link(const char* path, size_t length) {
  const Text<PATH_MAX> prefix("%.*s", static_cast<int>(length), path);
  struct stat found;
  return lstat(prefix, &found) == 0 && S_ISLNK(found.st_mode);
}

// Returns the first folder below the mount root that the path leads into.
MountPointText first_folder(const char* path) {
  const char* component = path + strlen(kMountRoot);
  while (*component == '/' || strncmp(component, "./", 2) == 0) component++;
  return MountPointText("%.*s", static_cast<int>(strcspn(component, "/")), component);
}

}  // namespace

MountPointHold::MountPointHold(const char* path)
    : tried_(lock_.take_in_time(hashed_lock_name("volume", first_folder(path)), LockMode::kExclusive,
                                kLongestHold)) {}

bool MountPointHold::is_anothers(const char* path) const {
  if (tried_ != LockTry::kBusy) return false;
  LOG(0, "%s is neither made nor removed, another run is at work there", path);
  return true;
}

MountPointText mount_point_of(const char* share) {
  return MountPointText("%s%s", kMountRoot, share);
}

bool is_share_inside_root(const char* share) {
  if (leaves_root(share)) {
    LOG(0, "share name %s leaves %s", share, kMountRoot);
    return false;
  }
  return !leads_through_link(mount_point_of(share));
}

bool leads_through_link(const char* path) {
  const char* const share = path + strlen(kMountRoot);
  for (const char* end = share; *end != '\0'; end += strspn(end, "/")) {
    end += strcspn(end, "/");
    if (!is_link(path, static_cast<size_t>(end - path))) continue;
    LOG(0, "share name %s leads through a symbolic link below %s", share, kMountRoot);
    return true;
  }
  return false;
}

bool is_mounted_from(const char* node, const char* path, MountLine* mount) {
  struct stat device;
  struct stat folder;
  char real[PATH_MAX];
  if (stat(node, &device) != 0 || !S_ISBLK(device.st_mode)) return false;
  if (stat(path, &folder) != 0 || folder.st_dev != device.st_rdev) return false;
  return realpath(path, real) != nullptr && find_mount_of(device.st_rdev, real, mount) == Mounted::kYes;
}

void detach_mounts(const char* path) {
  for (int layer = 0; layer < kMaxLayers && sys_mount_point(path) != 0; layer++) {
    sync_mount(path);
    if (umount2(path, MNT_DETACH | UMOUNT_NOFOLLOW) != 0) return;
  }
}

bool is_removal_unsafe(const char* path) {
  if (leads_through_link(path)) return true;
  char real[PATH_MAX];
  const char* name = realpath(path, real) != nullptr ? real : path;
  MountLine mount;
  const Mounted mounted = find_mount_below(name, &mount);
  if (mounted == Mounted::kYes) {
    LOG(0, "%s is not removed, %s is mounted on %s", path, mount.source, mount.path);
    return true;
  }
  if (mounted == Mounted::kUnknown && sys_mount_point(path) != 0) {
    LOG(0, "%s is not removed, it is a mount point", path);
    return true;
  }
  if (!is_on_root_file_system(name)) {
    LOG(0, "%s is not removed, it is not on the file system of %s", path, kMountRoot);
    return true;
  }
  return false;
}

}  // namespace remvol
