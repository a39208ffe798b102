#include "iscsi/target_status.h"

#include <utility>

#include "frontend/log.h"
#include "iscsi/session_check.h"
#include "support/result.h"
#include "tree/access.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "tree/status_text.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr int kStatusTries = 3;

int write_target_status(int dbidx, const char* text) {
  const HeldSlot slot(dbidx);
  if (!slot) return kTreeFailed;
  return tree_write_logged(KeyText(key::kTargetStatus, slot.target()), text);
}

// Writes a status text and the connect state that goes with it; the result of the latter hides that of the
// former. A failure names 1 for a connected target and 0 for every other: those who read the log know it so.
int write_target_state(int dbidx, bool connected, int state) {
  const TargetStatus status = target_status(connected, state);
  const int text_result = write_target_status(dbidx, status.text);
  if (status.state < 0) return text_result;
  const int result = ktree_set_connect_state(dbidx, status.state);
  if (result != kOk) LOG(0, "ktree_set_connect_state(%d, %d) failed", dbidx, connected ? 1 : 0);
  return result;
}

int read_connect_state(int dbidx) {
  int state = -1;
  (void)ktree_get_connect_state(dbidx, &state);
  return state;
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
    if (state == kRecovering && entry->conn_set == 1) return write_target_status(n, kReconnecting);
    connected = check_target_connected(entry->target_name) == kLoggedIn;
    const SlotsHeld held(SlotsHeld::kChange);
    const int seen = std::exchange(state, read_connect_state(n));
    if (state == seen) return write_target_state(n, connected, state);
  }
  const SlotsHeld held(SlotsHeld::kChange);
  if (state == kRecovering && entry->conn_set == 1) return write_target_status(n, kReconnecting);
  return write_target_state(n, connected, state);
}

}  // namespace remvol
