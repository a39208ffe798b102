#include "tasks/search_lun.h"

#include <optional>

#include "frontend/log.h"
#include "iscsi/lun_search.h"
#include "iscsi/node.h"
#include "iscsi/result_daemon.h"
#include "iscsi/session_check.h"
#include "support/result.h"
#include "support/target_hold.h"
#include "tasks/whole_target.h"
#include "tree/search_results.h"
#include "tree/state.h"
#include "volume/device.h"

namespace remvol {

namespace {

// Logs in for the time of the search. The node record that this makes is left in place.
bool log_in(TargetEntry* target) {
  (void)Target_Config_Gen(target);
  return _target_login(target, target->target_name) == 0 &&
         check_target_connected(target->target_name) != kNotLoggedIn;
}

// Makes sure of a session, given whether the target is connected; `logged_in` tells whether it was opened
// here. Returns 0 or -1.
int open_session(const char* socket, TargetEntry* target, int connected, bool* logged_in) {
  if (connected == kLoggedIn) return kOk;
  if (connected != kNotLoggedIn) {
    LOG(0, "check_target_connected failed");
    return kFailed;
  }
  *logged_in = log_in(target);
  if (*logged_in) return kOk;
  LOG(0, "Target_Connect %s failed", target->target_name);
  (void)ktree_update_search_lun_err_code(socket, kLunSearchLoginFailed);
  return kFailed;
}

// A run that brings the target up for longer than this one could wait, and does so still, needs the session.
void log_out_again(const TargetEntry* target, bool given_up) {
  std::optional<IdleTarget> idle;
  if (given_up && !idle.emplace(target->target_name)) return;
  (void)_target_disconnect(target);
}

// The search itself. While it is logged in for its own sake no other run brings the target up: the session
// would be closed under that run's volumes.
int search_luns(const char* socket, TargetEntry* target) {
  const char* name = target->target_name;
  std::optional<BriefTargetHold> hold;
  int connected = check_target_connected(name);
  if (connected == kNotLoggedIn && hold.emplace(name, is_no_lun_formatting).waited()) {
    connected = check_target_connected(name);
  }
  bool logged_in = false;
  int result = open_session(socket, target, connected, &logged_in);
  if (result == kOk) result = publish_luns(socket, name, _create_device_node);
  if (logged_in) log_out_again(target, hold && hold->given_up());
  return result;
}

}  // namespace

int task_search_lun(const TargetEntry& request, const char* output_file) {
  const LogScope scope;
  LOG(2, "start");
  if (request.target_name[0] == '\0') return kFailed;
  const char* socket = open_results(kLunResults, output_file);
  TargetEntry target = request;
  const int result = search_luns(socket, &target);
  close_results(kLunResults, socket, output_file);
  LOG(2, "end, ret = %d", result);
  return result;
}

}  // namespace remvol
