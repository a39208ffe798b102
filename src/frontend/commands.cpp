#include "frontend/commands.h"

#include "frontend/request.h"
#include "tasks/add.h"
#include "upgrade/remvol_ver_upgrade.h"

namespace remvol {

namespace {

constexpr unsigned kNone = 0;
constexpr unsigned kPortal = kOptAddress | kOptPort;
constexpr unsigned kOneLun = kOptName | kOptLun;

int run_version_upgrade(const Options&) {
  return version_upgrade();
}

}  // namespace

// The failure texts of oiscsi_evt_recover and modify_address are those of other commands: scripts look for
// them.
const Command kCommands[kCommandCount] = {
    {"init", nullptr, kNone, "task_init() failed", false, false, nullptr},
    {"search", nullptr, kPortal, "task_search() failed", false, false, nullptr},
    {"add", nullptr, kOneLun | kPortal | kOptShare, "task_add() failed", true, false, nullptr},
    {"del", nullptr, kOptName, "task_del() failed", true, false, nullptr},
    {"format", nullptr, kOneLun, "task_format() failed", true, false, nullptr},
    {"modify", nullptr, kOptName | kOptChap, "task_modify() failed", true, false, nullptr},
    {"status", nullptr, kNone, "task_status() failed", false, false, nullptr},
    {"check_share_name", nullptr, kOptShare, "", false, true, nullptr},
    {"disconnect", nullptr, kNone, "task_disconnect() failed", true, false, "task_disconnect(all) failed"},
    {"connect", nullptr, kOptName, "task_connect() failed", true, false, nullptr},
    {"system_off", nullptr, kNone, "system_off failed", false, false, nullptr},
    {"deinit", nullptr, kNone, "task_deinit failed", false, false, nullptr},
    {"oiscsi_evt_reopen", nullptr, kNone, "task_oiscsi_evt_reopen failed", false, false, nullptr},
    {"oiscsi_evt_recover", nullptr, kNone, "task_oiscsi_evt_reopen failed", false, false, nullptr},
    {"search_lun", nullptr, kOptName | kOptChap | kPortal, "task_search_lun() failed", false, false, nullptr},
    {"del_lun", nullptr, kOneLun, "task_del_lun() failed", true, false, nullptr},
    {"verupgrade", run_version_upgrade, kNone, "task_version_upgrade() failed", false, false, nullptr},
    {"modify_address", nullptr, kOptName | kPortal, "task_modify() failed", false, false, nullptr},
    {"help", nullptr, kNone, "", false, false, nullptr},
};

}  // namespace remvol
