#include "volume/session_volumes.h"

#include <cerrno>
#include <cstring>

#include "frontend/log.h"
#include "support/command.h"
#include "support/files.h"
#include "support/result.h"
#include "support/session_hold.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/record.h"
#include "volume/disk_identity.h"
#include "volume/disk_use.h"
#include "volume/e2fsprogs.h"
#include "volume/mount_point.h"
#include "volume/mount_table.h"
#include "volume/process_check.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

constexpr int kMaxVolumes = 64;
constexpr const char* kPublicFtp = "/home/Public";
constexpr const char* kDisks = "/sys/class/block";

bool is_volume(const MountLine& mount) {
  return strncmp(mount.path, kMountRoot, strlen(kMountRoot)) == 0;
}

bool is_from_session(const MountLine& mount, const void* target_name) {
  return is_session_disk(mount.source, static_cast<const char*>(target_name)) != SessionDisk::kNo;
}

bool is_session_volume(const MountLine& mount, const void* target_name) {
  return is_volume(mount) && is_from_session(mount, target_name);
}

// The volumes of a target, or of all, and their second mounts, but for so many of these that stay.
struct MountsToEnd {
  const char* target_name;
  int staying;
  mutable int passed;
};

bool is_to_be_ended(const MountLine& mount, const void* what) {
  const auto* mounts = static_cast<const MountsToEnd*>(what);
  if (is_session_volume(mount, mounts->target_name)) return true;
  const size_t length = strlen(kPublicFtp);
  return strncmp(mount.path, kPublicFtp, length) == 0 && mount.path[length] == '/' &&
         is_from_session(mount, mounts->target_name) && mounts->passed++ >= mounts->staying;
}

bool is_session_mount(const MountLine& mount, const void* target_name) {
  const auto* name = static_cast<const char*>(target_name);
  return is_session_device(mount.device, name) != SessionDisk::kNo ||
         is_session_disk(mount.source, name) != SessionDisk::kNo;  // btrfs has a number of its own
}

// Returns whether there is something in the folder besides itself and the one above.
bool has_entries(const char* folder) {
  const Directory directory(opendir(folder));
  int entries = 0;
  while (directory && readdir(directory.get()) != nullptr) entries++;
  return entries > 2;
}

// Returns whether the kernel says that somebody has the disk to himself: another mount namespace, swap, a
// file system of several disks. Whoever formats is ended with the session. A disk that has lost its target is
// not opened, which could take until the kernel gives it up.
bool is_claimed(const char* disk, const char* node) {
  char state[sizeof "running"] = "";
  const File file(fopen(PathText("%s/%s/%s", kDisks, disk, "device/state"), "re"));
  return file && fgets(state, sizeof state, file.get()) != nullptr && strcmp(state, "running") == 0 &&
         is_node_claimed(node) && !has_process(kMke2fs, node);
}

bool unmount(const MountLine& mount) {
  TargetEntry entry = {};
  copy_text(entry.share, mount.path + strlen(kMountRoot));
  copy_text(entry.mnt_dev, mount.source);
  return Target_LUN_umount(&entry) == kOk;
}

void log_use(const char* disk, const char* place) {
  LOG(0, "the session of %s stays, it is in use at %s", disk, place);
}

}  // namespace

bool unmount_session_volumes(const char* target_name) {
  MountLine mount;
  MountsToEnd mounts = {target_name, 0, 0};
  for (int volumes = 0;; volumes++) {
    mounts.passed = 0;
    const Mounted found = find_mount(is_to_be_ended, &mounts, &mount);
    if (found == Mounted::kNo || (found == Mounted::kUnknown && errno == ENOENT)) return true;
    if (found == Mounted::kUnknown) {
      LOG(0, "%s cannot be read: %s, no session is closed", kMountInfo, strerror(errno));
      return false;
    }
    const bool sure =
        volumes < kMaxVolumes && is_session_disk(mount.source, target_name) == SessionDisk::kYes;
    if (!is_volume(mount)) {
      if (!sure || !unmount_second_mount(mount.path)) mounts.staying++;
    } else if (!sure || !unmount(mount)) {
      log_use(mount.source, mount.path);
      return false;
    }
  }
}

bool is_session_used(const char* target_name) {
  MountLine mount;
  if (find_mount(is_session_mount, target_name, &mount) == Mounted::kYes) {
    if (target_name != nullptr) log_use(mount.source, mount.path);
    return true;
  }
  // The folder has a link for each disk and partition.
  const Directory disks(opendir(kDisks));
  while (const dirent* disk = disks ? readdir(disks.get()) : nullptr) {
    if (is_session_disk(disk->d_name, target_name) == SessionDisk::kNo) continue;
    const PathText holders("%s/%s/%s", kDisks, disk->d_name, "holders");
    const PathText node("/dev/%s", disk->d_name);
    const bool held = has_entries(holders);
    if (!held && !is_claimed(disk->d_name, node)) continue;
    if (target_name != nullptr) log_use(disk->d_name, held ? holders : node);
    return true;
  }
  return false;
}

bool has_session_volume(const char* target_name) {
  MountLine mount;
  const Mounted found = find_mount(is_session_volume, target_name, &mount);
  return found == Mounted::kYes || (found == Mounted::kUnknown && errno != ENOENT);
}

int close_sessions(const char* target_name, const char* logout) {
  const SessionClosing closing(target_name);
  if (!unmount_session_volumes(target_name)) return 1;
  return run_command(logout) == 0 ? 0 : 1;
}

}  // namespace remvol
