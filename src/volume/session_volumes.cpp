#include "volume/session_volumes.h"

#include <cerrno>
#include <cstring>

#include "frontend/log.h"
#include "support/command.h"
#include "support/files.h"
#include "support/result.h"
#include "support/session_hold.h"
#include "support/text.h"
#include "tree/record.h"
#include "volume/disk_identity.h"
#include "volume/mount_point.h"
#include "volume/mount_table.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

constexpr int kMaxVolumes = 64;
constexpr char kDisks[] = "/sys/class/block";

bool is_volume(const MountLine& mount) {
  return strncmp(mount.path, kMountRoot, strlen(kMountRoot)) == 0;
}

bool is_session_volume(const MountLine& mount, const void* target_name) {
  return is_volume(mount) &&
         is_session_disk(mount.source, static_cast<const char*>(target_name)) != SessionDisk::kNo;
}

bool is_session_mount_of_others(const MountLine& mount, const void* /*what*/) {
  return !is_volume(mount) && is_session_disk(mount.source, nullptr) != SessionDisk::kNo;
}

// Returns whether there is something in the folder besides itself and the one above.
bool has_entries(const char* folder) {
  const Directory directory(opendir(folder));
  int entries = 0;
  while (directory && readdir(directory.get()) != nullptr) entries++;
  return entries > 2;
}

void log_use(const char* disk, const char* place) {
  LOG(0, "the session of %s stays, it is in use at %s", disk, place);
}

// Returns whether none is left. A table that is there and cannot be read may show one.
bool unmount_session_volumes(const char* target_name) {
  MountLine mount;
  for (int volumes = 0;; volumes++) {
    const Mounted found = find_mount(is_session_volume, target_name, &mount);
    if (found == Mounted::kNo || (found == Mounted::kUnknown && errno == ENOENT)) return true;
    if (found == Mounted::kUnknown) {
      LOG(0, "%s cannot be read: %s, no session is closed", kMountInfo, strerror(errno));
      return false;
    }
    TargetEntry entry = {};
    copy_text(entry.share, mount.path + strlen(kMountRoot));
    copy_text(entry.mnt_dev, mount.source);
    if (volumes < kMaxVolumes && is_session_disk(mount.source, target_name) == SessionDisk::kYes &&
        Target_LUN_umount(&entry) == kOk) {
      continue;
    }
    log_use(mount.source, mount.path);
    return false;
  }
}

}  // namespace

bool is_session_used_by_others() {
  MountLine mount;
  if (find_mount(is_session_mount_of_others, nullptr, &mount) == Mounted::kYes) {
    log_use(mount.source, mount.path);
    return true;
  }
  // The folder has a link for each disk and partition.
  const Directory disks(opendir(kDisks));
  while (const dirent* disk = disks ? readdir(disks.get()) : nullptr) {
    const PathText holders("%s/%s/holders", kDisks, disk->d_name);
    if (is_session_disk(disk->d_name, nullptr) == SessionDisk::kNo || !has_entries(holders)) continue;
    log_use(disk->d_name, holders);
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
