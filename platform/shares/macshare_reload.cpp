// macshare_reload: makes every mounted volume a netatalk share. Without netatalk there is nothing to do: Macs
// then use the Samba shares, which winshare_reload prepares for them. With --withdraw no volume is shared.
#include <cerrno>
#include <cstring>

#include "begin.h"
#include "shares/process.h"
#include "shares/reload.h"
#include "shares/server_config.h"

using namespace shares;

namespace {

constexpr char kConfig[] = "/etc/netatalk/afp.conf";
constexpr char kShares[] = "/run/remvol/afp-shares.conf";
constexpr char kLock[] = "afp-shares.lock";

}  // namespace

int main(int argc, char** argv) {
  remvol::begin();
  const ReloadCommand command = read_command(argc, argv);
  if (command == ReloadCommand::kWrong) return 2;
  open_log("macshare_reload");
  // Macs use the Samba shares then.
  if (!is_installed("netatalk")) return 0;
  if (!take_turn(kLock)) {
    log_line(LOG_WARNING, "%s: %s", kLock, strerror(errno));
    return 0;
  }
  const ServerConfig config = read_server_config(kConfig, kShares);
  const Reload done = reload_shares({"macshare_reload", kShares, kNetatalkNames, config.names, false, "",
                                     command == ReloadCommand::kWithdraw});
  if (!done.has_tree) {
    log_line(LOG_WARNING, "the configuration tree does not answer; only shares that are gone are taken out");
  } else if (!config.includes_shares && !done.shares.empty()) {
    log_line(LOG_WARNING, "%s does not include %s; nobody sees the shares", kConfig, kShares);
  }
  if (!done.untold) return 0;
  // netatalk(8): SIGHUP makes it and its servers read the configuration again.
  if (run({"killall", "-q", "-HUP", "netatalk"}) != 0) log_line(LOG_WARNING, "netatalk does not run");
  remember_told(kShares, {});
  return 0;
}
