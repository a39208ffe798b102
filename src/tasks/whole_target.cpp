#include "tasks/whole_target.h"

#include <unistd.h>

#include "frontend/log.h"
#include "iscsi/iscsiadm.h"
#include "iscsi/node.h"
#include "iscsi/session.h"
#include "iscsi/target_status.h"
#include "support/command.h"
#include "support/files.h"
#include "support/result.h"
#include "support/session_hold.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/entry.h"
#include "tree/lun_walk.h"
#include "tree/settings_file.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "volume/disk_identity.h"
#include "volume/mount.h"
#include "volume/mount_point.h"
#include "volume/session_volumes.h"
#include "volume/share_services.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

// At start-up no target is asked for.
constexpr char kNoRequest[] = "";

constexpr const char* kSessions = "/sys/class/iscsi_session";

// After so long without its target (replacement_timeout of the daemon's settings) the kernel gives a disk up.
constexpr int kTakeOverSeconds = 30;

int log_out(const TargetEntry* entry) {
  return close_sessions(entry->target_name, logout_command(*entry));
}

// The same, but for a session with a disk that is in use. Returns kSessionStays for that.
int log_out_unused(const TargetEntry* entry) {
  const SessionClosing closing(entry->target_name);
  if (!unmount_session_volumes(entry->target_name) || is_session_used(entry->target_name))
    return kSessionStays;
  return log_out(entry);
}

// Returns whether one of the target's volumes is mounted: the appliance is running, and the session was there
// before.
bool has_mounted_volume(int db_idx) {
  TargetEntry volume;
  LunWalk luns(db_idx, LunWalk::kAtUnreadable);
  while (luns.next(&volume)) {
    if (sys_mount_point(mount_point_of(volume.share)) != 0) return true;
  }
  return false;
}

// Stores the devices of a target's session at start-up. Results as ktree_update_dev.
//
// A new iscsid (seen with 2.1.8) takes over the sessions that it finds by connecting each anew, and for some
// seconds they show no running disk. Logging such a session out would pull the disks from under mounted
// volumes.
int update_dev_at_start(TargetEntry* entry) {
  const int result = ktree_update_dev(entry);
  if (result != kNoRunningDisk || !has_mounted_volume(entry->db_idx)) return result;
  if (_wait_sess_lun_ready(entry->target_name, kTakeOverSeconds) != kOk) return result;
  return ktree_update_dev(entry);
}

// Logs in to one stored target and mounts its volumes. Returns whether it came to the mounting.
bool load_connected_target(TargetEntry* entry, int* result) {
  *result = Target_Connect(entry, kNoRequest);
  if (*result != 0) {
    (void)ktree_set_connect_state(entry->db_idx, kConnectError);
    return false;
  }
  *result = update_dev_at_start(entry);
  if (*result != 0) {
    if (*result == kTreeFailed) LOG(0, "ktree failed");
    give_up_session(entry, *result, kVolumeLost);
    *result = kFailed;
    return false;
  }
  sleep(kSettleSeconds);
  (void)Target_mount_all_lun(entry, 0, 0);
  log_out_if_deleted(entry);
  return true;
}

// Brings up what is stored of the target at slot `n`. Returns whether it came to the mounting.
bool load_target(int n, int* result) {
  TargetEntry entry;
  bool mounted = false;
  // By slot, not by name: the search for a name would stop at an empty slot before this one.
  if (ktree_get_entry_by_dbidx(n, &entry) == kOk) {
    const TargetHold hold(entry.target_name);
    if (hold.waited() && ktree_get_entry_by_dbidx(n, &entry) != kOk) return false;
    (void)Target_Config_Gen(&entry);
    mounted = entry.conn_set != 0 && load_connected_target(&entry, result);
  }
  (void)ktree_update_status(&entry);
  return mounted;
}

// Returns whether a volume is mounted from the target's session, after logging so: a listing of the sessions
// that failed, or a disk that does not run just now, is no reason to pull it from under a volume.
bool is_session_needed(const char* target_name) {
  if (!has_session_volume(target_name)) return false;
  LOG(0, "the session of target %s stays, a volume is mounted from it", target_name);
  return true;
}

}  // namespace

int Target_Logout(TargetEntry* entry) {
  const LogScope scope;
  const int result = log_out(entry);
  entry->conn_set = 0;
  (void)ktree_set_connect_state(entry->db_idx, kDisconnected);
  return result;
}

int log_out_all() {
  const SessionClosing closing(nullptr);
  if (!unmount_session_volumes(nullptr)) return 1;
  if (!is_session_used(nullptr)) return run_command(logout_all_command()) == 0 ? 0 : 1;
  const Directory sessions(opendir(kSessions));
  int result = sessions ? 0 : 1;
  while (const dirent* session = sessions ? readdir(sessions.get()) : nullptr) {
    TargetEntry entry = {};
    const PathText name("%s/%s/%s", kSessions, session->d_name, "targetname");
    if (!read_session_name(name, entry.target_name)) continue;
    const bool failed = is_session_used(entry.target_name)
                            ? ktree_get_dbidx_by_targetname(entry.target_name) >= 1
                            : run_command(logout_command(entry)) != 0;
    if (failed) result = 1;
  }
  return result;
}

void log_out_if_deleted(TargetEntry* entry) {
  if (unloaded_settings() == nullptr && !HeldSlot(entry->db_idx)) (void)Target_Logout(entry);
}

void give_up_session(TargetEntry* entry, int reason, VolumeState state) {
  if (reason == kTargetNotListed) {
    LOG(1, "Can not find Target: %s on iscsiadm -m session", entry->target_name);
  } else if (reason == kNoRunningDisk) {
    LOG(1, "Can not find Device for Target: %s on iscsiadm -m session", entry->target_name);
  }
  if (is_session_needed(entry->target_name)) return;
  // Written after a logout that worked; readers of the log know it so.
  if (Target_Logout(entry) == kOk) LOG(1, "Logout Fail on Target: %s ", entry->target_name);
  (void)ktree_record_connect_set(entry);
  (void)ktree_update_all_volume_state(entry, state);
}

int _target_disconnect(const TargetEntry* entry) {
  const LogScope scope;
  if (entry->target_name[0] == '\0') {
    LOG(0, "parameter error");
    return kFailed;
  }
  return is_session_needed(entry->target_name) ? kOk : log_out(entry);
}

int Target_Disconnect(TargetEntry* entry) {
  const LogScope scope;
  LOG(2, "start");
  if (entry->db_idx < 1) entry->db_idx = ktree_get_dbidx_by_targetname(entry->target_name);
  if (entry->db_idx < 1) {
    LOG(0, "target : %s  does not exist in ktree", entry->target_name);
    return kFailed;
  }
  (void)Target_umount_all_lun(entry->db_idx);
  LOG(1, "update share folder status");
  reload_share_services();
  LOG(1, "finish share folder status");
  LOG(2, "logout start");
  const int result = log_out_unused(entry);
  LOG(2, "logout end ");
  (void)ktree_set_connect_state(entry->db_idx, kDisconnected);
  entry->conn_set = 0;
  (void)ktree_record_connect_set(entry);
  (void)ktree_update_dev(entry);
  LOG(2, "end");
  return result;
}

int Target_load_all() {
  const LogScope scope;
  LOG(2, "start");
  int mounted = 0;
  int result = 0;
  remember_all_targets();
  for (int n = 1; n <= kMaxTargets; n++) {
    if (is_target_stored(n) && load_target(n, &result)) mounted++;
  }
  if (mounted > 0) reload_share_services();
  (void)ktree_update_current_targetcnt();
  LOG(2, "end");
  return result;
}

}  // namespace remvol
