#include "volume/lun_status.h"

#include "frontend/log.h"
#include "support/disk_look.h"
#include "support/result.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/access.h"
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

// The progress, asked for only where it is shown.
int progress_of(const TargetEntry* entry, const LunState& state) {
  return state.format == kFormatting ? read_progress(entry) : 0;
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

// Writes the status of a LUN on which the file system `fs_type` was recognised.
int write_recognised(const TargetEntry* entry, const LunState& state, const char* fs_type) {
  const int type_result = write_fs_type(entry, fs_type);
  unsigned long long total = 0;
  unsigned long long used = 0;
  unsigned long long available = 0;
  const MountPointText mount_point = mount_point_of(entry->share);
  int result = kOk;
  if (sys_get_df_info(mount_point, &total, &used, &available) == 0) {
    result = write_status(entry, running_text(state), Text<64>("%llu/%llu", used, total));
  } else {
    result = write_status(entry, unmounted_text(state, progress_of(entry, state)), "0/0");
  }
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

int compose_lun_status(const TargetEntry* entry, bool formatting, const LunState& state) {
  if (!state.enabled) return write_disabled(entry);
  if (formatting) return write_status(entry, formatting_text(read_progress(entry)), "0/0");
  if (entry->dev[0] == '\0') return write_status(entry, kLunOffline, "0/0");
  char fs_type[16] = "";
  if (recognise(entry->mnt_dev, fs_type)) return write_recognised(entry, state, fs_type);
  return write_status(entry, unformatted_text(state, progress_of(entry, state)), "0/0");
}

}  // namespace

int ktree_update_lun_status(const TargetEntry* entry, int formatting) {
  const LogScope scope;
  LOG(2, "update lun status start");
  if (entry->db_idx < 1 || entry->lun_db_idx < 1) {
    LOG(1, "target or lun db index not given");
    return kFailed;
  }
  LunState state;
  if (read_lun_state(entry->db_idx, entry->lun_db_idx, &state) != kOk) {
    LOG(0, "ktree_get_lun_vol_access_right() failed");
    return kFailed;
  }
  const int result = compose_lun_status(entry, formatting != 0, state);
  LOG(2, "update status end");
  return result;
}

int ktree_update_lun_status(const TargetEntry* entry, const LunState& state) {
  const LogScope scope;
  LOG(2, "update lun status start");
  const int result = compose_lun_status(entry, state.format == kFormatting, state);
  LOG(2, "update status end");
  return result;
}

}  // namespace remvol
