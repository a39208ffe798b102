#include "tree/status_text.h"

#include <utility>

#include "frontend/log.h"
#include "iscsi/session_check.h"
#include "support/result.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/keys.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "volume/mount_point.h"

namespace remvol {

namespace {

using StatusText = Text<64>;

constexpr int kStatusTries = 3;

int write_logged(const char* key, const char* value) {
  LOG(1, "ktreec_set %s=%s", key, value);
  return tree_write_with_tries(key, value);
}

// The text, marked when the volume is read-only.
StatusText with_right(const char* text, int right) {
  return right == VOL_AC_RO ? StatusText("%s ( %s )", text, "Read Only") : StatusText("%s", text);
}

StatusText progress_text(const TargetEntry* entry) {
  int progress = 0;
  ktree_get_lun_format_progress(entry->db_idx, entry->lun_db_idx, &progress);
  return StatusText("%s %d%%", "Formatting", progress);
}

bool failed(const LunState& state) {
  return state.format == kFormatFailed || state.volume == kVolumeFailed;
}

// A file system is there, but it is not mounted.
StatusText unmounted_text(const TargetEntry* entry, const LunState& state) {
  if (state.format == kFormatting) return progress_text(entry);
  if (state.volume == kVolumeCreating) return StatusText("Creating Volume");
  if (state.volume == kVolumeUnsupported) return with_right("Unsupported File System", state.right);
  if (!failed(state)) return StatusText("Offline");
  return with_right("Create Volume Failed", state.right);
}

// No file system was recognised.
StatusText unformatted_text(const TargetEntry* entry, const LunState& state) {
  if (state.format == kFormatting) return progress_text(entry);
  if (state.format == kFormatWaiting) return StatusText("Wait to Format");
  if (state.volume == kVolumeCreating) return StatusText("Creating Volume");
  if (failed(state)) return with_right("Create Volume Failed", state.right);
  if (state.volume == kVolumeOffline) return StatusText("Offline");
  // The user interface knows no read-only form of this text here.
  if (state.volume == kVolumeUnsupported) return StatusText("Unsupported File System");
  return with_right("No Format", state.right);
}

// Writes a status text and a size; both are tried even when the first fails.
int write_status(const TargetEntry* entry, const char* text, const char* size) {
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  const int n = slot.target();
  const int m = slot.lun();
  const int status_result = write_logged(KeyText(key::kLunStatus, n, m), text);
  const int size_result = write_logged(KeyText(key::kLunSize, n, m), size);
  return status_result != kOk ? status_result : size_result;
}

int write_fs_type(const TargetEntry* entry, const char* fs_type) {
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  return write_logged(KeyText(key::kLunFsType, slot.target(), slot.lun()), fs_type);
}

// The text of a LUN on which the file system `fs_type` was recognised.
int write_recognised(const TargetEntry* entry, const LunState& state, const char* fs_type) {
  const int type_result = write_fs_type(entry, fs_type);
  unsigned long long total = 0;
  unsigned long long used = 0;
  unsigned long long available = 0;
  const MountPointText mount_point = mount_point_of(entry->share);
  int result = kOk;
  if (sys_get_df_info(mount_point, &total, &used, &available) == 0) {
    result = write_status(entry, with_right("Running", state.right), Text<64>("%llu/%llu", used, total));
  } else {
    result = write_status(entry, unmounted_text(entry, state), "0/0");
  }
  return type_result != kOk ? type_result : result;
}

// The size of a disabled LUN stays as it was.
int write_disabled(const TargetEntry* entry) {
  const HeldSlot slot(entry->db_idx, entry->lun_db_idx);
  if (!slot) return kTreeFailed;
  return write_logged(KeyText(key::kLunStatus, slot.target(), slot.lun()), "Disable");
}

int compose_lun_status(const TargetEntry* entry, bool formatting, const LunState& state) {
  if (!state.enabled) return write_disabled(entry);
  if (formatting) return write_status(entry, progress_text(entry), "0/0");
  if (entry->dev[0] == '\0') return write_status(entry, "Offline", "0/0");
  char fs_type[16] = "";
  if (sys_get_fs_type(fs_type, entry->mnt_dev) == 0) {
    return write_recognised(entry, state, fs_type);
  }
  return write_status(entry, unformatted_text(entry, state), "0/0");
}

int write_target_status(int dbidx, const char* text) {
  const HeldSlot slot(dbidx);
  if (!slot) return kTreeFailed;
  return write_logged(KeyText(key::kTargetStatus, slot.target()), text);
}

// Writes a status text and the connect state that goes with it; the result of the latter hides that of the
// former. `printed` is the state that a failure names: those who read the log know it as 1 for a connected
// target and 0 for every other.
int write_with_state(int dbidx, const char* text, int state, int printed) {
  write_target_status(dbidx, text);
  const int result = ktree_set_connect_state(dbidx, state);
  if (result != kOk) LOG(0, "ktree_set_connect_state(%d, %d) failed", dbidx, printed);
  return result;
}

int read_connect_state(int dbidx) {
  int state = -1;
  ktree_get_connect_state(dbidx, &state);
  return state;
}

int write_target_state(int n, bool connected, int state) {
  if (connected) return write_with_state(n, "Connected", kConnected, 1);
  if (state == kConnecting) return write_with_state(n, "Connecting", kConnecting, 0);
  if (state != kConnectError) return write_with_state(n, "Disconnected", kDisconnected, 0);
  return write_target_status(n, "Connect Error");
}

}  // namespace

int ktree_update_status(const TargetEntry* entry) {
  return ktree_update_status(entry, read_connect_state(entry->db_idx));
}

int ktree_update_status(const TargetEntry* entry, int state) {
  const LogScope scope;
  const int n = entry->db_idx;
  bool connected = false;
  // While the sessions are listed another run may bring the target up, or fail to: what it wrote counts then.
  for (int tries = 0; tries < kStatusTries; tries++) {
    if (state == kRecovering && entry->conn_set == 1) return write_target_status(n, "Reconnecting");
    connected = check_target_connected(entry->target_name) == 1;
    const SlotsHeld held(SlotsHeld::kChange);
    const int seen = std::exchange(state, read_connect_state(n));
    if (state == seen) return write_target_state(n, connected, state);
  }
  const SlotsHeld held(SlotsHeld::kChange);
  if (state == kRecovering && entry->conn_set == 1) return write_target_status(n, "Reconnecting");
  return write_target_state(n, connected, state);
}

int read_lun_state(int dbidx, int lun_dbidx, LunState* state) {
  const SlotsHeld held;
  int enabled = 0;
  if (ktree_get_lun_vol_access_right(&state->right, dbidx, lun_dbidx) != kOk) return kFailed;
  state->enabled = ktree_get_lun_enable(&enabled, dbidx, lun_dbidx) == kOk && enabled != 0;
  ktree_get_lun_format_state(dbidx, lun_dbidx, &state->format);
  ktree_get_lun_volume_state(dbidx, lun_dbidx, &state->volume);
  return kOk;
}

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
