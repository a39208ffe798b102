#include "iscsi/lun_search.h"

#include <optional>

#include "frontend/log.h"
#include "frontend/request.h"
#include "iscsi/node.h"
#include "iscsi/result_daemon.h"
#include "iscsi/session.h"
#include "iscsi/session_check.h"
#include "support/lun_list.h"
#include "support/result.h"
#include "support/target_hold.h"
#include "tree/search_results.h"
#include "tree/state.h"

namespace remvol {

namespace {

constexpr int kWaitSeconds = 3;

// Logs in for the time of the search. The node record that this makes is left in place.
bool log_in() {
  TargetEntry* target = &request_target;
  Target_Config_Gen(target);
  return _target_login(target) == 0 && check_target_connected(target->target_name) != 0;
}

// Makes sure of a session, given whether the target is connected; `logged_in` tells whether it was opened
// here. Returns 0 or -1.
int open_session(const char* socket, int connected, bool* logged_in) {
  if (connected == 1) return kOk;
  if (connected != 0) {
    LOG(0, "check_target_connected failed");
    return kFailed;
  }
  *logged_in = log_in();
  if (*logged_in) return kOk;
  LOG(0, "Target_Connect %s failed", request_target.target_name);
  ktree_update_search_lun_err_code(socket, kLunSearchLoginFailed);
  return kFailed;
}

// Lists the LUNs of the session and publishes them. A list that is empty although a LUN was ready, since all
// are too small, is neither printed nor stored.
int publish_luns(const char* socket) {
  const char* name = request_target.target_name;
  const int ready = _wait_sess_lun_ready(name, kWaitSeconds);
  if (ready == 1) {
    LOG(1, "Can not find any available LUN on target %s", name);
    print_lun_list(nullptr, name);
    ktree_update_search_lun_result(socket, nullptr, name);
    ktree_update_search_lun_err_code(socket, kLunSearchDone);
    return kOk;
  }
  LunNode* luns = nullptr;
  if (ready != 0 || _get_sess_lun_list(&luns, name) != 0) {
    LOG(0, "get session lun list failed");
    return kFailed;
  }
  if (luns != nullptr) {
    print_lun_list(luns, name);
    ktree_update_search_lun_result(socket, luns, name);
    lun_node_free_list(luns);
  }
  ktree_update_search_lun_err_code(socket, kLunSearchDone);
  return kOk;
}

// The search itself. While it is logged in for its own sake no other run brings the target up: the session
// would be closed under that run's volumes.
int search_luns(const char* socket) {
  const char* name = request_target.target_name;
  std::optional<BriefTargetHold> hold;
  int connected = check_target_connected(name);
  if (connected == 0 && hold.emplace(name, is_no_lun_formatting).waited()) {
    connected = check_target_connected(name);
  }
  bool logged_in = false;
  int result = open_session(socket, connected, &logged_in);
  if (result == kOk) result = publish_luns(socket);
  if (logged_in) _target_disconnect(&request_target);
  return result;
}

}  // namespace

int task_search_lun() {
  const LogScope scope;
  LOG(2, "start");
  if (request_target.target_name[0] == '\0') return kFailed;
  const char* socket = open_results(kLunResults);
  const int result = search_luns(socket);
  close_results(kLunResults, socket);
  LOG(2, "end, ret = %d", result);
  return result;
}

}  // namespace remvol
