#include "tasks/connect.h"

#include <unistd.h>

#include "frontend/log.h"
#include "iscsi/node.h"
#include "iscsi/session.h"
#include "iscsi/target_status.h"
#include "support/result.h"
#include "support/target_hold.h"
#include "tasks/whole_target.h"
#include "tree/entry.h"
#include "tree/lun_walk.h"
#include "tree/state.h"
#include "volume/lun_status.h"
#include "volume/mount.h"
#include "volume/share_services.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

// A mount that was refused for its entry (-1) or that found the volume read-only leaves the state "normal".
VolumeState state_after_mount(MountResult mounted) {
  switch (mounted) {
    case kMounted:
    case kMountFailed:
    case kMountReadOnly:
      return kVolumeNormal;
    case kMountUnsupported:
      return kVolumeUnsupported;
    case kMountTooSmall:
      return kVolumeOffline;
    default:
      return kVolumeFailed;
  }
}

// Mounts the LUN in `entry` and stores what became of it; a failure shows in the volume state alone.
void mount_connected_lun(TargetEntry* entry) {
  (void)ktree_update_volume_state(entry, kVolumeCreating);
  VolumeState state = kVolumeOffline;
  if (entry->dev[0] != '\0') state = state_after_mount(Target_mount(entry, 0, 0));
  (void)ktree_update_volume_state(entry, state);
  (void)ktree_update_lun_status(entry, 0);
  unmount_if_deleted(entry);
}

// Mounts the enabled LUNs of the target in `entry`. Returns 0, or why the last LUN visited could not be asked
// whether it is enabled.
//
// The target's wish to be connected is that of the last record read, and the one behind the last LUN has
// none: a loss during the mounts is not shown as "Reconnecting" by the status that follows.
int mount_enabled_luns(TargetEntry* entry) {
  int result = kOk;
  TargetEntry volume = {};
  LunWalk luns(entry->db_idx, LunWalk::kAtUnreadable);
  while (luns.next(&volume)) {
    int enable = 0;
    result = ktree_get_lun_enable(&enable, entry->db_idx, volume.lun_db_idx);
    if (result == kOk && enable == 1) mount_connected_lun(&volume);
  }
  entry->conn_set = volume.conn_set;
  return result;
}

// Finds the disks of a target that was just logged in, and mounts them. Returns the command's result.
int present_volumes(TargetEntry* entry) {
  const int found = ktree_update_dev(entry);
  if (found == kTreeFailed) {
    LOG(0, "ktree failed, exit...");
    return kOk;  // the session stays, and so does the user's wish
  }
  if (found != kOk) {
    give_up_session(entry, found, kVolumeFailed);
    return kFailed;
  }
  sleep(kSettleSeconds);
  const int result = mount_enabled_luns(entry);
  (void)ktree_update_status(entry);
  reload_share_services();
  return result;
}

int disconnect_all() {
  Target_umount_all();
  LOG(1, "update share folder status");
  reload_share_services();
  LOG(1, "finish share folder status");
  return log_out_all();
}

int disconnect_target(const char* target_name) {
  TargetEntry entry;
  if (ktree_get_entry_by_targetname(target_name, &entry) != kOk) return kFailed;
  const BriefTargetHold hold(entry.target_name, is_no_lun_formatting);
  const int result = Target_Disconnect(&entry);
  (void)ktree_update_status(&entry);
  return result == kSessionStays ? kFailed : kOk;  // a logout that fails is none of the command's
}

}  // namespace

int task_connect(const TargetEntry& request) {
  const LogScope scope;
  LOG(2, "start");
  const TargetHold hold(request.target_name);
  TargetEntry entry;
  if (ktree_get_entry_by_targetname(request.target_name, &entry) != kOk) {
    LOG(1, "Can not find: %s", request.target_name);
    return kTreeFailed;
  }
  (void)ktree_set_connect_state(entry.db_idx, kConnecting);
  (void)ktree_update_status(&entry);
  (void)Target_Config_Gen(&entry);
  const int login = Target_Connect(&entry, request.target_name);
  if (login != kOk) {
    LOG(0, "Target_Connect failed , target name = %s", entry.target_name);
    (void)ktree_set_connect_state(entry.db_idx, kConnectError);
    return login;
  }
  entry.conn_set = 1;
  (void)ktree_record_connect_set(&entry);
  (void)ktree_set_connect_state(entry.db_idx, kConnected);
  const int result = present_volumes(&entry);
  log_out_if_deleted(&entry);
  LOG(2, "end, ret = %d", result);
  return result;
}

int task_disconnect(const char* target_name) {
  const LogScope scope;
  LOG(2, "start");
  const int result = target_name == nullptr ? disconnect_all() : disconnect_target(target_name);
  LOG(2, "end");
  return result;
}

}  // namespace remvol
