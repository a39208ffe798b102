#include "iscsi/lun_search.h"

#include "frontend/log.h"
#include "support/lun_list.h"
#include "support/result.h"
#include "tree/search_results.h"

namespace remvol {

namespace {

constexpr int kWaitSeconds = 3;

}  // namespace

int publish_luns(const char* socket, const char* name, DeviceNodeMaker make_node) {
  const int ready = _wait_sess_lun_ready(name, kWaitSeconds);
  if (ready == kNoLunReady) {
    LOG(1, "Can not find any available LUN on target %s", name);
    print_lun_list(nullptr, name);
    (void)ktree_update_search_lun_result(socket, nullptr, name);
    (void)ktree_update_search_lun_err_code(socket, kLunSearchDone);
    return kOk;
  }
  LunNode* luns = nullptr;
  if (ready != kOk || _get_sess_lun_list(&luns, name, make_node) != kOk) {
    LOG(0, "get session lun list failed");
    return kFailed;
  }
  if (luns != nullptr) {
    print_lun_list(luns, name);
    (void)ktree_update_search_lun_result(socket, luns, name);
    lun_node_free_list(luns);
  }
  (void)ktree_update_search_lun_err_code(socket, kLunSearchDone);
  return kOk;
}

}  // namespace remvol
