#include "tasks/format.h"

#include <unistd.h>

#include "frontend/log.h"
#include "iscsi/node.h"
#include "iscsi/session.h"
#include "iscsi/target_status.h"
#include "support/result.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "tasks/ftp_share.h"
#include "tasks/requested_lun.h"
#include "tasks/whole_target.h"
#include "tree/entry.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "volume/disk_identity.h"
#include "volume/lun_status.h"
#include "volume/mount.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

// Fills `entry` with the requested LUN. Returns 0; -1 missing arguments, unreadable entry, no device or
// another disk's; 1 unknown target or LUN.
Result read_lun_to_format(const TargetEntry& request, TargetEntry* entry) {
  if (request.target_name[0] == '\0' || request.lun < 0) return kFailed;
  int dbidx = 0;
  int lun_dbidx = 0;
  const Result found = find_requested_lun(request, &dbidx, &lun_dbidx);
  if (found != kOk) return found;
  if (read_requested_lun(request, entry, dbidx, lun_dbidx) != kOk) return kFailed;
  if (entry->dev[0] == '\0') {
    LOG(2, "Can not get device");
    return kFailed;
  }
  if (is_foreign_disk(entry, entry->dev)) return kFailed;
  return kOk;
}

// Formats and mounts the LUN anew, with its FTP share taken down meanwhile. Returns -1 when the mount table
// cannot be read, else the result of the mount.
int remake_volume(TargetEntry* entry) {
  (void)ktree_update_format_progress(entry->db_idx, entry->lun_db_idx, 0);
  (void)ktree_update_lun_status(entry, 1);
  (void)ktree_update_volume_state(entry, kVolumeCreating);

  FtpPath ftp_path;
  if (take_ftp_share_down(entry, ftp_path) != kOk) {
    (void)ktree_update_volume_state(entry, kVolumeNormal);
    return kFailed;
  }
  (void)Target_LUN_umount(entry);
  const MountResult mounted = Target_mount(entry, 1, 0);
  if (mounted != kMounted && mounted != kMountUnsupported && mounted != kMountReadOnly) {
    (void)ktree_update_volume_state(entry, kVolumeFailed);
  }
  if (ftp_path[0] != '\0') {
    LOG(1, "mount_ftp : FTP SHARE PATH = %s", ftp_path);
    (void)Target_remount_ftp(entry, ftp_path);
  }
  (void)ktree_update_lun_status(entry, 0);
  unmount_if_deleted(entry);
  return mounted;
}

// Writes the entry to its slot. A target that was deleted meanwhile is not stored again.
void _update_stored_target(TargetEntry* entry) {
  const LogScope scope;
  const SlotsHeld held(SlotsHeld::kChange);
  if (HeldSlot(entry->db_idx)) (void)ktree_add_entry(entry);
}

// Puts the requested CHAP settings into the target's entry, its slot and its node record.
void store_chap(const TargetEntry& request, TargetEntry* entry) {
  entry->chap = request.chap;
  copy_text(entry->chap_name, request.chap_name);
  copy_text(entry->chap_pwd, request.chap_pwd);
  _update_stored_target(entry);
  (void)Target_Config_Gen(entry);
}

// Logs the target in with its new settings and mounts its volumes. A failure is stored, not returned: the
// settings are to be kept either way.
void reconnect(TargetEntry* entry, int conn_set) {
  if (Target_Connect(entry, entry->target_name) != kOk) {
    LOG(0, "Reconnect failed , target name = %s", entry->target_name);
    entry->conn_set = 0;
    (void)ktree_record_connect_set(entry);
    (void)ktree_set_connect_state(entry->db_idx, kConnectError);
    return;
  }
  entry->conn_set = conn_set;
  (void)ktree_record_connect_set(entry);
  (void)ktree_update_dev(entry);
  sleep(kSettleSeconds);
  (void)Target_mount_all_lun(entry, 0, 1);
  log_out_if_deleted(entry);
}

}  // namespace

int task_format(const TargetEntry& request) {
  const LogScope scope;
  TargetEntry entry = {};
  LOG(2, "start");
  const TargetHold hold(request.target_name, request.lun);
  int result = read_lun_to_format(request, &entry);
  if (result == kOk) result = remake_volume(&entry);
  LOG(2, "end");
  return result;
}

int task_modify(const TargetEntry& request) {
  const LogScope scope;
  LOG(2, "start");
  const TargetHold hold(request.target_name);
  int result = kFailed;
  TargetEntry entry;
  if (ktree_get_entry_by_targetname(request.target_name, &entry) == kOk) {
    const int conn_set = entry.conn_set;
    (void)Target_Disconnect(&entry);
    store_chap(request, &entry);
    if (conn_set != 0) reconnect(&entry, conn_set);
    (void)ktree_update_status(&entry);
    result = kOk;
  }
  LOG(2, "end");
  return result;
}

}  // namespace remvol
