#include "iscsi/node.h"

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "iscsi/iface.h"
#include "iscsi/iscsiadm.h"
#include "iscsi/session_check.h"
#include "support/command.h"
#include "support/result.h"
#include "support/session_hold.h"
#include "support/text.h"
#include "tree/state.h"

namespace remvol {

namespace {

constexpr int kMinPort = 1;
constexpr int kMaxPort = 65535;

// What iscsiadm prints when the node is logged in already; 2.0.874 and later print another text, and the
// session stays then: logging it out would pull its disks from under mounted volumes.
constexpr char kAlreadyExists[] = "initiator reported error (15 - already exists)";

// Returns the result of the last setting alone, as 0 or -1.
int _target_chap_gen(const TargetEntry* entry) {
  const LogScope scope;
  if (entry == nullptr || entry->iface[0] == '\0') return kFailed;
  if (entry->chap != 1) return run_command(no_auth_command(*entry)) == 0 ? kOk : kFailed;
  (void)run_command(chap_method_command(*entry));
  (void)run_command(chap_user_command(*entry));
  return run_command(chap_secret_command(*entry)) == 0 ? kOk : kFailed;
}

int _target_chap_apply(TargetEntry* entry) {
  if (entry == nullptr || get_iface_name(entry) != kOk) return kFailed;
  _target_chap_gen(entry);
  return kOk;
}

// Reads the output of a login until it says that a session to this node is already open.
bool login_found_session(FILE* output) {
  char line[512];
  while (fgets(line, sizeof line, output) != nullptr) {
    if (strstr(line, kAlreadyExists) != nullptr) return true;
  }
  return false;
}

// Starts the login and reads its output. Returns whether a session was there already.
bool run_login(const char* command, FILE** output) {
  const LoginUnderWay under_way;
  *output = popen(command, "r");
  return *output != nullptr && login_found_session(*output);
}

void close_own_session(const TargetEntry& entry) {
  const SessionClosing closing(entry.target_name);
  (void)run_command(portal_logout_command(entry));
}

void log_in_again(const TargetEntry& entry) {
  close_own_session(entry);
  const LoginUnderWay under_way;
  (void)run_command(login_again_command(entry));
}

// Returns whether the session to `name` is there.
bool confirm_login(const char* name, const char* requested) {
  if (check_target_connected(name) == kLoggedIn) return true;
  LOG(0, "Can not find target %s in session\n, connect failed.", requested);
  return false;
}

int _target_connect_run(const TargetEntry& entry, const char* requested) {
  const LogScope scope;
  if (entry.port < kMinPort || entry.port > kMaxPort) return kFailed;
  const CommandText login = login_command(entry);
  LOG(1, "try to login - cmd: %s \n", login.c_str());
  FILE* output = nullptr;
  if (run_login(login, &output)) log_in_again(entry);
  if (output == nullptr) return kNotConfirmed;
  pclose(output);
  return confirm_login(entry.target_name, requested) ? kOk : kNotConfirmed;
}

}  // namespace

// A deletion that failed is found in a log by the one name, also that for a target that goes for good.
int delete_node_record(TargetEntry* entry) {
  const LogScope scope("Target_Config_Gen");
  if (entry == nullptr || get_iface_name(entry) != kOk) return kFailed;
  (void)run_command(delete_node_command(*entry));
  return kOk;
}

int Target_Config_Gen(TargetEntry* entry) {
  const LogScope scope;
  if (delete_node_record(entry) != kOk) return kFailed;
  (void)run_command(new_node_command(*entry));
  return _target_chap_apply(entry);
}

int _target_login(TargetEntry* entry, const char* requested) {
  if (get_iface_name(entry) != kOk || entry->iface[0] == '\0') return kFailed;
  return _target_connect_run(*entry, requested);
}

int Target_Connect(TargetEntry* entry, const char* requested) {
  const LogScope scope;
  (void)ktree_set_connect_state(entry->db_idx, kConnecting);
  if (_target_login(entry, requested) != 0) return kFailed;
  return confirm_login(entry->target_name, requested) ? kOk : kFailed;
}

}  // namespace remvol
