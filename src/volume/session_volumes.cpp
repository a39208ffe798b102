#include "volume/session_volumes.h"

#include <cerrno>
#include <cstring>

#include "frontend/log.h"
#include "support/command.h"
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

bool is_session_volume(const MountLine& mount, const void* target_name) {
  return strncmp(mount.path, kMountRoot, strlen(kMountRoot)) == 0 &&
         is_session_disk(mount.source, static_cast<const char*>(target_name)) != SessionDisk::kNo;
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
    LOG(0, "the session of %s stays, it is mounted on %s", mount.source, mount.path);
    return false;
  }
}

}  // namespace

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
