#include "tree/state.h"

#include <cstdlib>

#include "frontend/log.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/lun_slots.h"
#include "tree/slots.h"
#include "tree_layout.h"

namespace remvol {

namespace {

int read_state(const char* key, bool stored, int* value, int missing) {
  StateValue text;
  const bool present = stored && tree_read(key, text);
  *value = present ? atoi(text) : missing;
  return present ? kOk : kTreeFailed;
}

}  // namespace

int ktree_get_lun_format_state(int dbidx, int lun_dbidx, int* value) {
  const LogScope scope;
  const HeldSlot slot(dbidx, lun_dbidx);
  return read_state(KeyText(key::kLunFormatState, slot.target(), slot.lun()), bool(slot), value, -1);
}

int ktree_get_lun_format_progress(int dbidx, int lun_dbidx, int* value) {
  const LogScope scope;
  const HeldSlot slot(dbidx, lun_dbidx);
  return read_state(KeyText(key::kLunFormatProgress, slot.target(), slot.lun()), bool(slot), value, 0);
}

int ktree_get_lun_volume_state(int dbidx, int lun_dbidx, int* value) {
  const LogScope scope;
  const HeldSlot slot(dbidx, lun_dbidx);
  return read_state(KeyText(key::kLunVolumeState, slot.target(), slot.lun()), bool(slot), value, -1);
}

int ktree_get_connect_state(int dbidx, int* value) {
  const LogScope scope;
  const HeldSlot slot(dbidx);
  return read_state(KeyText(key::kTargetConnState, slot.target()), bool(slot), value, -1);
}

int ktree_set_connect_state(int dbidx, int state) {
  const LogScope scope;
  const SlotsHeld held(SlotsHeld::kChange);  // not between the looks of a run that composes the status
  const HeldSlot slot(dbidx);
  if (!slot) return kTreeFailed;
  return tree_write_with_tries(KeyText(key::kTargetConnState, slot.target()), NumberText("%d", state), 1);
}

int ktree_update_lun_vol_access_right(int right, int dbidx, int lun_dbidx) {
  const LogScope scope;
  if (right != VOL_AC_RW && right != VOL_AC_RO) {
    LOG(0, "volume access right should be VOL_AC_RW or VOL_AC_RO, but you given %d", right);
    return kFailed;
  }
  if (dbidx < 1 || lun_dbidx < 1) {
    LOG(0, "db index must > 0");
    return kFailed;
  }
  const HeldSlot slot(dbidx, lun_dbidx);
  if (!slot) return kTreeFailed;
  return tree_write_with_tries(KeyText(key::kLunAccessRight, slot.target(), slot.lun()),
                               NumberText("%d", right));
}

int ktree_get_lun_vol_access_right(int* right, int dbidx, int lun_dbidx) {
  const LogScope scope;
  if (right == nullptr) {
    LOG(0, "vol_ac is null");
    return kFailed;
  }
  if (dbidx < 1 || lun_dbidx < 1) {
    LOG(0, "db index must > 0");
    return kFailed;
  }
  const HeldSlot slot(dbidx, lun_dbidx);
  (void)read_state(KeyText(key::kLunAccessRight, slot.target(), slot.lun()), bool(slot), right, VOL_AC_RW);
  if (*right != VOL_AC_RO) *right = VOL_AC_RW;
  return kOk;
}

int ktree_update_formatting_state(const TargetEntry* entry, int state) {
  const LogScope scope;
  if (entry->db_idx < 1 || entry->lun_db_idx < 1) {
    // Only a warning: the tree itself refuses a slot below 1.
    LOG(0, "target or lun db index not given");
  }
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  return tree_write_with_tries(KeyText(key::kLunFormatState, slot.target(), slot.lun()),
                               NumberText("%d", state));
}

bool is_no_lun_formatting(const char* target_name) {
  const SlotsHeld held;
  const int dbidx = ktree_get_dbidx_by_targetname(target_name);
  for (const int m : stored_luns(dbidx)) {
    int state = kFormatIdle;
    (void)ktree_get_lun_format_state(dbidx, m, &state);
    if (state == kFormatting || state == kFormatWaiting) return false;
  }
  return true;
}

int ktree_update_format_progress(int dbidx, int lun_dbidx, int percent) {
  const LogScope scope;
  if (dbidx < 1 || lun_dbidx < 1) {
    LOG(0, "target or lun db index not given");
    return kFailed;
  }
  const HeldSlot slot(dbidx, lun_dbidx);
  if (!slot) return kTreeFailed;
  const KeyText key(key::kLunFormatProgress, slot.target(), slot.lun());
  const NumberText value("%d", percent);
  LOG(2, "set %s = %s", key.c_str(), value.c_str());
  return tree_write_with_tries(key, value);
}

int ktree_update_volume_state(const TargetEntry* entry, int state) {
  const LogScope scope;
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  const KeyText key(key::kLunVolumeState, slot.target(), slot.lun());
  const NumberText value("%d", state);
  LOG(1, "set %s=%s", key.c_str(), value.c_str());
  return tree_write_with_tries(key, value);
}

int ktree_update_all_volume_state(TargetEntry* entry, int state) {
  if (entry == nullptr) return kFailed;
  if (entry->db_idx < 1) entry->db_idx = ktree_get_dbidx_by_targetname(entry->target_name);
  if (entry->db_idx < 1) return kFailed;
  const SlotsHeld held;
  for (const int m : stored_luns(entry->db_idx)) {
    entry->lun_db_idx = m;
    const int result = ktree_update_volume_state(entry, state);
    if (result != kOk) return result;
  }
  return kOk;
}

int ktree_update_mount_info(TargetEntry* entry, const char* node, const char* mount_point,
                            const char* fs_type) {
  const LogScope scope;
  copy_text(entry->mnt_dev, node);
  copy_text(entry->mnt, mount_point);
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kOk;
  const int n = slot.target();
  const int m = slot.lun();
  (void)tree_write(KeyText(key::kLunMntDev, n, m), entry->mnt_dev);
  (void)tree_write(KeyText(key::kLunMnt, n, m), entry->mnt);
  (void)tree_write(KeyText(key::kLunFsType, n, m), fs_type);
  return kOk;
}

int ktree_update_initiator_iqn(const char* name) {
  const LogScope scope;
  return tree_write_with_tries(key::kInitiatorName, name);
}

int ktree_record_connect_set(const TargetEntry* entry) {
  const LogScope scope;
  const HeldSlot slot(entry->db_idx);
  if (!slot) return kTreeFailed;
  const KeyText key(key::kTargetConnSet, slot.target());
  const NumberText value("%d", entry->conn_set);
  LOG(1, "ktreec_set %s=%s", key.c_str(), value.c_str());
  return tree_write_once(key, value);
}

LunState read_lun_state(int dbidx, int lun_dbidx) {
  const SlotsHeld held;
  LunState state;
  (void)ktree_get_lun_format_state(dbidx, lun_dbidx, &state.format);
  (void)ktree_get_lun_volume_state(dbidx, lun_dbidx, &state.volume);
  return state;
}

}  // namespace remvol
