#include "tasks/repair.h"

#include "frontend/log.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/lun_slots.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "tree/status_text.h"
#include "tree_layout.h"
#include "volume/e2fsprogs.h"
#include "volume/process_check.h"

namespace remvol {

namespace {

bool is_format_under_way(int state) {
  return state == kFormatting || state == kFormatWaiting;
}

bool shows_work(const char* text_key) {
  StatusText text;
  return tree_read(text_key, text.data(), StatusText::size()) && tells_of_work(text);
}

bool any_text_shows_work(int dbidx) {
  const LogScope scope;
  const HeldSlot slot(dbidx);
  if (!slot) return false;
  const int n = slot.target();
  if (shows_work(KeyText(key::kTargetStatus, n))) return true;
  for (const int m : stored_luns_at(n)) {
    if (shows_work(KeyText(key::kLunStatus, n, m))) return true;
  }
  return false;
}

int read_connect_state(const TargetEntry* target) {
  int state = kDisconnected;
  (void)ktree_get_connect_state(target->db_idx, &state);
  return state;
}

bool is_busy(const LunState& state) {
  return is_format_under_way(state.format) || state.volume == kVolumeCreating;
}

}  // namespace

bool shows_ended_work(const TargetEntry* target) {
  return any_text_shows_work(target->db_idx) && IdleTarget(target->target_name);
}

int repair_target_state(const TargetEntry* target) {
  if (const int state = read_connect_state(target); state != kConnecting) return state;
  const IdleTarget idle(target->target_name);
  // A run that has ended between the two has stored what became of it.
  if (idle && read_connect_state(target) == kConnecting) {
    (void)ktree_set_connect_state(target->db_idx, kDisconnected);
  }
  return read_connect_state(target);
}

void repair_lun_state(const TargetEntry* lun, LunState* state) {
  if (!is_busy(*state)) return;
  const IdleTarget idle(lun->target_name, lun->lun);
  if (!idle) return;
  *state = read_lun_state(lun->db_idx, lun->lun_db_idx);
  if (!is_busy(*state)) return;
  if (lun->dev[0] != '\0' && has_process(kMke2fs, Text<32>("/dev/%s", lun->dev))) return;
  if (is_format_under_way(state->format)) (void)ktree_update_formatting_state(lun, kFormatIdle);
  if (state->volume == kVolumeCreating) (void)ktree_update_volume_state(lun, kVolumeNormal);
  *state = read_lun_state(lun->db_idx, lun->lun_db_idx);
}

}  // namespace remvol
