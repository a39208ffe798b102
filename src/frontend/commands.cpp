#include "frontend/commands.h"

#include <getopt.h>

#include <cstdio>
#include <iterator>

#include "frontend/request.h"
#include "iscsi/address.h"
#include "iscsi/discovery.h"
#include "support/program.h"
#include "tasks/add.h"
#include "tasks/connect.h"
#include "tasks/format.h"
#include "tasks/recover.h"
#include "tasks/remove.h"
#include "tasks/search_lun.h"
#include "tasks/start_stop.h"
#include "tasks/status.h"
#include "upgrade/remvol_ver_upgrade.h"

namespace remvol {

namespace {

constexpr unsigned kNone = 0;
constexpr unsigned kPortal = kOptAddress | kOptPort;
constexpr unsigned kOneLun = kOptName | kOptLun;

template <int (*kTask)()>
int run() {
  return kTask();
}

template <int (*kTask)(const TargetEntry& request)>
int run() {
  return kTask(request_target);
}

int search() {
  return task_search(request_target, output_file);
}

int search_lun() {
  return task_search_lun(request_target, output_file);
}

int share() {
  return task_share(request_target.share);
}

int disconnect() {
  return task_disconnect((OPT_FLAG & kOptName) == 0 ? nullptr : request_target.target_name);
}

template <int kSystemOff>
int deinit() {
  return task_deinit(kSystemOff);
}

int recover() {
  return task_oiscsi_evt_recover(request_target.target_name, wait_seconds);
}

int reopen() {
  return task_oiscsi_evt_reopen(request_target.target_name);
}

}  // namespace

// The failure texts of oiscsi_evt_recover and modify_address are those of other commands: scripts look for
// them.
const CommandRow kCommands[] = {
    {"init", run<task_init>, kNone, "task_init() failed", false, false, nullptr},
    {"search", search, kPortal, "task_search() failed", false, false, nullptr},
    {"add", run<task_add>, kOneLun | kPortal | kOptShare, "task_add() failed", true, false, nullptr},
    {"del", run<task_del>, kOptName, "task_del() failed", true, false, nullptr},
    {"format", run<task_format>, kOneLun, "task_format() failed", true, false, nullptr},
    {"modify", run<task_modify>, kOptName | kOptChap, "task_modify() failed", true, false, nullptr},
    {"status", run<task_status>, kNone, "task_status() failed", false, false, nullptr},
    {"check_share_name", share, kOptShare, "", false, true, nullptr},
    {"disconnect", disconnect, kNone, "task_disconnect() failed", true, false, "task_disconnect(all) failed"},
    {"connect", run<task_connect>, kOptName, "task_connect() failed", true, false, nullptr},
    {"system_off", deinit<1>, kNone, "system_off failed", false, false, nullptr, true},
    {"deinit", deinit<0>, kNone, "task_deinit failed", false, false, nullptr, true},
    {"oiscsi_evt_reopen", reopen, kNone, "task_oiscsi_evt_reopen failed", false, false, nullptr},
    {"oiscsi_evt_recover", recover, kNone, "task_oiscsi_evt_reopen failed", false, false, nullptr},
    {"search_lun", search_lun, kOptName | kOptChap | kPortal, "task_search_lun() failed", false, false,
     nullptr},
    {"del_lun", run<task_del_lun>, kOneLun, "task_del_lun() failed", true, false, nullptr},
    {"verupgrade", run<version_upgrade>, kNone, "task_version_upgrade() failed", false, false, nullptr},
    {"modify_address", run<task_modify_target_address>, kOptName | kPortal, "task_modify() failed", false,
     false, nullptr},
    {"help", nullptr, kNone, "", false, false, nullptr},
};

const int kCommandCount = static_cast<int>(std::size(kCommands));

const option* long_options() {
  static option options[std::size(kCommands) + 1] = {};
  for (size_t i = 0; i < std::size(kCommands); i++) {
    options[i].name = kCommands[i].name;
    options[i].val = kCommands[i].run == nullptr ? 'h' : 0;
  }
  return options;
}

// --add works without -c, though the text lists it: user interfaces show this text as it stands.
void print_usage() {
  printf(
      "use: %s [\n"
      "\t--init\n"
      "\t--search -i IP -p port\n"
      "\t--search_lun -n TARGET_NAME -i IP -p port -c CHAP [-U usename -P pwd]\n"
      "\t--add -n TARGET_NAME -l Lun -i IP -p port -s shared -c CHAP [-U usename -P pwd]\n"
      "\t--del -n TARGET_NAME\n"
      "\t--del_lun -n TARGET_NAME -l LUN\n"
      "\t--format -n TARGET_NAME -l LUN\n"
      "\t--modify -n TARGET_NAME -c CHAP [-U usename -P pwd]\n"
      "\t--modify_address -n TARGET_NAME -i IP -p port\n"
      "\t--status\n"
      "\t--check_share_name -s shared\n"
      "\t--disconnect [-n TARGET_NAME]\n"
      "\t--connect -n TARGET_NAME\n"
      "\t--system_off (for system shutdown use only)\n"
      "\t--deinit\n"
      "\t--verupgrade\n"
      "\r\n",
      program_path);
}

}  // namespace remvol
