#include "volume/lun_status.h"

#include "frontend/log.h"
#include "support/disk_look.h"
#include "support/result.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/slots.h"
#include "tree/status_text.h"
#include "tree_layout.h"
#include "volume/mount_point.h"

namespace remvol {

namespace {

int read_progress(const TargetEntry* entry) {
  int progress = 0;
  (void)ktree_get_lun_format_progress(entry->db_idx, entry->lun_db_idx, &progress);
  return progress;
}

// Writes a status text and a size; both are tried even when the first fails.
int write_status(const TargetEntry* entry, const char* text, const char* size) {
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  const int n = slot.target();
  const int m = slot.lun();
  const int status_result = tree_write_logged(KeyText(key::kLunStatus, n, m), text);
  const int size_result = tree_write_logged(KeyText(key::kLunSize, n, m), size);
  return status_result != kOk ? status_result : size_result;
}

int write_fs_type(const TargetEntry* entry, const char* fs_type) {
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  return tree_write_logged(KeyText(key::kLunFsType, slot.target(), slot.lun()), fs_type);
}

// Writes the status of a LUN that is not mounted. Its state is read behind the looks at the disk, which last,
// and no run begins a format between the state and the text.
int write_not_mounted(const TargetEntry* entry, int right,
                      StatusText (*text_of)(const LunState& state, int right, int progress)) {
  const SlotsHeld held(SlotsHeld::kChange);
  const LunState state = read_lun_state(entry->db_idx, entry->lun_db_idx);
  const int progress = state.format == kFormatting ? read_progress(entry) : 0;  // shown only then
  return write_status(entry, text_of(state, right, progress), "0/0");
}

// Writes the status of a LUN on which the file system `fs_type` was recognised.
int write_recognised(const TargetEntry* entry, int right, const char* fs_type) {
  const int type_result = write_fs_type(entry, fs_type);
  unsigned long long total = 0;
  unsigned long long used = 0;
  unsigned long long available = 0;
  const MountPointText mount_point = mount_point_of(entry->share);
  const int result = sys_get_df_info(mount_point, &total, &used, &available) == 0
                         ? write_status(entry, running_text(right), Text<64>("%llu/%llu", used, total))
                         : write_not_mounted(entry, right, unmounted_text);
  return type_result != kOk ? type_result : result;
}

bool recognise(const char* node, char* fs_type) {
  const DiskLook look(node);
  return sys_get_fs_type(fs_type, node) == 0;
}

// The size of a disabled LUN stays as it was.
int write_disabled(const TargetEntry* entry) {
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  return tree_write_logged(KeyText(key::kLunStatus, slot.target(), slot.lun()), kLunDisabled);
}

int compose_lun_status(const TargetEntry* entry, bool formatting, int right) {
  int enabled = 0;
  (void)ktree_get_lun_enable(&enabled, entry->db_idx, entry->lun_db_idx);
  if (enabled == 0) return write_disabled(entry);
  if (formatting) return write_status(entry, formatting_text(read_progress(entry)), "0/0");
  if (entry->dev[0] == '\0') return write_status(entry, kLunOffline, "0/0");
  char fs_type[16] = "";
  if (recognise(entry->mnt_dev, fs_type)) return write_recognised(entry, right, fs_type);
  return write_not_mounted(entry, right, unformatted_text);
}

}  // namespace

int ktree_update_lun_status(const TargetEntry* entry, int formatting) {
  const LogScope scope;
  LOG(2, "update lun status start");
  if (entry->db_idx < 1 || entry->lun_db_idx < 1) {
    LOG(1, "target or lun db index not given");
    return kFailed;
  }
  int right = VOL_AC_RW;
  if (ktree_get_lun_vol_access_right(&right, entry->db_idx, entry->lun_db_idx) != kOk) {
    LOG(0, "ktree_get_lun_vol_access_right() failed");
    return kFailed;
  }
  const int result = compose_lun_status(entry, formatting != 0, right);
  LOG(2, "update status end");
  return result;
}

}  // namespace remvol
