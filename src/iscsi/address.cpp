#include "iscsi/address.h"

#include "frontend/log.h"
#include "iscsi/discovery.h"
#include "iscsi/session_check.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/slots.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr int kCheckFailed = 1;  // a result of the handler's own

// Returns whether the request names a target and a portal; logs what is missing.
bool check_request(const TargetEntry& request) {
  if (request.target_name[0] == '\0') {
    LOG(0, "target name is not given");
  } else if (request.ip[0] == '\0') {
    LOG(0, "ip is not given");
  } else if (request.port < 1 || request.port > 65535) {
    LOG(0, "Port is not valid");
  } else {
    return true;
  }
  return false;
}

// The refusals are no failures: what is printed tells them from a change. It has no newline of its own.
int refuse_connected(const TargetEntry& request) {
  print_open(kNote, "%s is connecting, disconnect it before modifying its address.", request.target_name);
  return kOk;
}

int store_portal(const TargetEntry& request, int dbidx) {
  const HeldSlot slot(dbidx);
  if (!slot) return tree_write_failed();
  const int result = tree_write_once(KeyText(key::kTargetIp, slot.target()), request.ip);
  if (result != kOk) return result;
  return tree_write_once(KeyText(key::kTargetPort, slot.target()), NumberText("%d", request.port));
}

int modify_address(const TargetEntry& request) {
  if (!check_request(request)) return kFailed;
  const int dbidx = ktree_get_dbidx_by_targetname(request.target_name);
  if (dbidx <= 0) {
    print_open(0, "Target %s is not existed in config", request.target_name);
    return kFailed;
  }
  if (check_target_connected(request.target_name) != kNotLoggedIn) return refuse_connected(request);
  switch (Portal_search_target(request.target_name, request.ip, request.port)) {
    case kNotOffered:
      print_open(kNote, "Can not find %s at IP: %s Port: %d", request.target_name, request.ip, request.port);
      return kOk;
    case kOffered:
      return store_portal(request, dbidx);
    case kLoggedInAlready:
      return refuse_connected(request);
    default:
      LOG(0, "Portal_search_target() failed");
      return kCheckFailed;
  }
}

}  // namespace

int task_modify_target_address(const TargetEntry& request) {
  const LogScope scope;
  LOG(1, "task_modify_target_ip start");
  const int result = modify_address(request);
  LOG(1, "task_modify_target_ip end, ret = %d", result);
  return result;
}

}  // namespace remvol
