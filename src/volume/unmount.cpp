#include "volume/unmount.h"

#include <mntent.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/command.h"
#include "support/coreutils.h"
#include "support/files.h"
#include "support/fuser.h"
#include "support/result.h"
#include "support/run_lock.h"
#include "support/session_hold.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/lun_walk.h"
#include "tree/settings_file.h"
#include "tree/slots.h"
#include "volume/bare_folder.h"
#include "volume/disk_identity.h"
#include "volume/disk_use.h"
#include "volume/lun_status.h"
#include "volume/mount_command.h"
#include "volume/mount_point.h"
#include "volume/mount_table.h"
#include "volume/remount.h"
#include "volume/share_services.h"

namespace remvol {

namespace {

constexpr int kRounds = 4;
constexpr int kKillTries = 3;
constexpr int kKillMaxWait = 200000;  // microseconds
constexpr const char* kPublicFtp = "/home/Public";
constexpr size_t kFtpPathSize = 512;

// Ends the users of the node that was mounted, unless its name belongs to another disk by now. A name that is
// no disk's becomes none's until then.
void kill_node_users(const TargetEntry* entry) {
  const SessionKept kept(entry->target_name);
  LoginsHeldOff logins;
  if (!has_disk(entry->mnt_dev)) logins.begin();
  const NodeLeftAlone alone(entry->mnt_dev);
  if (is_foreign_disk(entry, entry->mnt_dev)) return;
  System("%s", end_node_users_command(entry->mnt_dev).c_str());
}

void kill_users(const char* mount_point) {
  LOG(2, "start fuser");
  const CommandText command = end_users_command(mount_point);
  const int status = process_system_cmd_mt(command, kKillTries, kKillMaxWait);
  if (status != 0) LOG(1, "cmd '%s' return code = %d", command.c_str(), status);
}

bool force_umount(const char* mount_point) {
  LOG(2, "start umount");
  const CommandText command = umount_command(mount_point);
  if (system(command) == 0) return true;
  LOG(0, "cmd '%s' failed", command.c_str());
  return false;
}

// Unmounts the path with its users killed. A round starts only while something is mounted there: on a path
// that was unmounted meanwhile, the kill would hit every process that uses the system's own disk. A link that
// was planted meanwhile ends it: the users and the mount would be others. Returns whether one mount is gone.
bool umount_with_rounds(const char* mount_point) {
  bool done = false;
  for (int round = 0; !done && round < kRounds && sys_mount_point(mount_point) != 0; round++) {
    if (leads_through_link(mount_point)) break;
    kill_users(mount_point);
    if (round == 0) sleep(1);
    done = leads_through_link(mount_point) || force_umount(mount_point);
  }
  LOG(2, "end umount");
  return done || sys_mount_point(mount_point) == 0;
}

// Removes the mount point, whether or not the unmount worked. What is still mounted is detached first, so
// that the removal never deletes a volume's files; when that cannot be had, nothing is removed.
Result remove_mount_point(const char* mount_point) {
  if (is_removal_unsafe(mount_point)) return kFailed;
  drop_bare_folder(mount_point);
  const CommandText command = remove_folder_command(mount_point);
  if (system(command) == 0) return kOk;
  LOG(0, "cmd '%s' failed", command.c_str());
  return kFailed;
}

bool is_stored(const TargetEntry* entry) {
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  return slot && is_lun_stored_at(slot.target(), slot.lun());
}

// A tree that was started anew is waited for: a volume that its settings do not know would be nobody's.
bool is_deleted(const TargetEntry* entry) {
  return !is_stored(entry) && await_loaded_settings() && !HeldSlot(entry->db_idx, entry->lun_db_idx);
}

// The volumes that unmount_if_deleted() has left where they are. A command that changes settings brings up
// those of one target.
TargetEntry brought_up[kMaxLunsPerTarget];
int number_brought_up = 0;

// Unmounts every LUN of the target up to the first empty slot.
void umount_luns(int dbidx) {
  TargetEntry lun;
  LunWalk luns(dbidx, LunWalk::kAtEmpty);
  while (luns.next(&lun)) {
    (void)Target_LUN_umount(&lun);
    (void)ktree_update_lun_status(&lun, 0);
  }
}

}  // namespace

Result Target_LUN_umount(const TargetEntry* entry) {
  const LogScope scope;
  LOG(2, "start");
  if (entry == nullptr || entry->share[0] == '\0' || !is_share_inside_root(entry->share)) {
    LOG(2, "end");
    return kFailed;
  }
  kill_node_users(entry);
  const MountPointText mount_point = mount_point_of(entry->share);
  // Between the look and the kill another run could unmount, and the kill would then hit the users of the
  // system's own disk; between the look and the removal another run could mount.
  const MountPointHold hold(mount_point);
  if (leads_through_link(mount_point)) return kFailed;
  if (check_path_exist(mount_point) != 0) return kOk;
  if (hold.is_anothers(mount_point) || is_foreign_mount(entry, mount_point)) return kFailed;
  if (sys_mount_point(mount_point) != 0) {
    (void)remount_mnt_path(mount_point, 0);
    (void)umount_with_rounds(mount_point);
    if (leads_through_link(mount_point)) return kFailed;
    detach_mounts(mount_point);
  }
  const Result result = remove_mount_point(mount_point);
  LOG(2, "end");
  return result;
}

void unmount_if_deleted(const TargetEntry* entry) {
  const LogScope scope;
  if (is_deleted(entry)) {
    (void)Target_LUN_umount(entry);
  } else if (number_brought_up < kMaxLunsPerTarget) {
    brought_up[number_brought_up++] = *entry;
  }
}

void unmount_lost_volumes() {
  for (int i = 0; i < number_brought_up; i++) {
    const TargetHold hold(brought_up[i].target_name, brought_up[i].lun);
    if (!is_deleted(&brought_up[i])) continue;
    (void)Target_LUN_umount(&brought_up[i]);
    reload_share_services();
  }
}

Result Target_umount_all_lun(int dbidx) {
  if (!is_target_stored(dbidx)) return kFailed;
  umount_luns(dbidx);
  return kOk;
}

// What is deleted meanwhile moves the targets behind it down; the walk meets each of them all the same.
void Target_umount_all() {
  const LogScope scope;
  LOG(2, "start");
  SlotsHeld held;
  TreeValue name;
  for (int slot = 1; slot <= kMaxTargets && read_target_name(slot, name); slot = target_slot_after(slot)) {
    remember_target(slot, name);
    held.let_go();
    umount_luns(slot);
    held.take();
  }
  LOG(2, "end");
}

bool unmount_second_mount(const char* path) {
  RunLock lock;
  lock.take_in_time(hashed_lock_name("volume", path), LockMode::kExclusive, kLongestHold);
  return umount_with_rounds(path);
}

Result get_ftp_share_path(const TargetEntry* entry, char* path) {
  const LogScope scope;
  if (is_foreign_disk(entry, entry->mnt_dev)) {  // a mount of that node is another volume's
    path[0] = '\0';
    return kNoFtpShare;
  }
  FILE* table = setmntent(kProcMounts, "re");
  if (table == nullptr) {
    LOG(0, "Can not open %s", kProcMounts);
    return kMountTableUnreadable;
  }
  path[0] = '\0';
  mntent mount;
  char line[512];
  while (getmntent_r(table, &mount, line, sizeof line) != nullptr) {
    if (strcmp(mount.mnt_dir, "/") == 0 || strcmp(mount.mnt_fsname, entry->mnt_dev) != 0) continue;
    LOG(2, "found pMntInfo->mnt_fsname = %s", mount.mnt_fsname);
    LOG(2, "--> pMntInfo->mnt_dir = %s", mount.mnt_dir);
    if (strstr(mount.mnt_dir, kPublicFtp) == nullptr) continue;
    snprintf(path, kFtpPathSize, "%s", mount.mnt_dir);
    break;
  }
  endmntent(table);
  return path[0] != '\0' ? kOk : kNoFtpShare;
}

Result Target_umount_ftp(const TargetEntry*, const char* path) {
  const LogScope scope;
  LOG(1, "start umount ftp");
  const CommandText kill = end_users_command(path);
  const int status = system(kill);
  if (status != 0) LOG(1, "system() of cmd '%s' return code = %d", kill.c_str(), status);
  const CommandText umount = umount_command(path);
  if (system(umount) != 0) {
    LOG(0, "system() of cmd '%s' failed", umount.c_str());
    return kFailed;
  }
  LOG(1, "end umount ftp");
  return kOk;
}

Result Target_remount_ftp(const TargetEntry*, const char* path) {
  const LogScope scope;
  LOG(1, "start mount ftp");
  if (path[0] == '\0') return kFailed;
  reload_share_services();
  LOG(1, "end mount ftp");
  return kOk;
}

}  // namespace remvol
