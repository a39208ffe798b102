// winshare_reload: makes every mounted volume a Samba share. With --withdraw, none: the volumes are about to
// go.
//
// The shares stand in a file of their own that smb.conf includes. A running server is told only when that
// file changed, or when it could not be told the last time. Clients of a share that is gone are cut off,
// since the folder below it is no volume any more, and so are those of a share whose users have changed.
#include <glob.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "begin.h"
#include "shares/process.h"
#include "shares/reload.h"
#include "shares/server_config.h"
#include "shares/share_name.h"

using namespace shares;

namespace {

constexpr char kConfig[] = "/etc/samba/smb.conf";
constexpr char kShares[] = "/run/remvol/smb-shares.conf";
constexpr char kLock[] = "smb-shares.lock";
constexpr char kPidFile[] = "/run/samba/smbd.pid";

bool has_module(const std::string& name) {
  glob_t found{};
  const bool there =
      glob(("/usr/lib*/*/samba/vfs/" + name + ".so").c_str(), GLOB_NOSORT, nullptr, &found) == 0 ||
      glob(("/usr/lib*/samba/vfs/" + name + ".so").c_str(), GLOB_NOSORT, nullptr, &found) == 0;
  globfree(&found);
  return there;
}

// What lets Macs keep their file attributes, where they have no server of their own; vfs_fruit(8).
std::string options_for_macs(const ServerConfig& config) {
  const bool wanted = !is_installed("netatalk") && !config.sets_vfs_objects && has_module("catia") &&
                      has_module("fruit") && has_module("streams_xattr");
  return wanted ? "\tvfs objects = catia fruit streams_xattr\n" : "";
}

// Samba prefers a share of smb.conf to one of the same name in its registry, so ours would take its place.
void add_registry_shares(ServerConfig& config) {
  std::string output;
  if (run({"net", "conf", "listshares"}, &output) != 0) {
    log_line(LOG_WARNING, "net failed; the shares in Samba's registry are not known");
    return;
  }
  for (std::string_view rest = output; !rest.empty();) {
    const size_t end = std::min(rest.find('\n'), rest.size());
    config.names.push_back(folded_name(rest.substr(0, end)));
    rest.remove_prefix(std::min(end + 1, rest.size()));
  }
}

bool samba_runs() {
  const int pid = atoi(read_file(kPidFile).c_str());
  return pid > 0 && (kill(pid, 0) == 0 || errno == EPERM);
}

// One that does not run reads the shares when it starts, and has no clients.
void tell_samba(const Reload& done) {
  const bool runs = samba_runs();
  if (!runs) log_line(LOG_NOTICE, "Samba does not run; it finds the shares when it starts");
  const bool told = run({"smbcontrol", "all", "reload-config"}) == 0;
  if (!told) log_line(LOG_WARNING, "smbcontrol failed; Samba may not know the shares");
  std::vector<std::string> left;
  for (const std::string& share : done.cut_off) {
    // Without "--" a name that begins with a dash is an option.
    if (run({"smbcontrol", "smbd", "close-share", "--", share}) == 0 || !runs) continue;
    left.push_back(share);
    if (told) {
      log_line(LOG_WARNING, "smbcontrol failed; clients of the share \"%s\" may still be in it",
               share.c_str());
    }
  }
  if (told || !runs) remember_told(kShares, left);
}

void tell_what_is_missing(const Reload& done, const ServerConfig& config, bool has_samba) {
  if (!has_samba && !done.has_tree) {
    log_line(LOG_WARNING, "nothing to do without Samba and without the configuration tree");
  } else if (!has_samba) {
    log_line(LOG_WARNING, "Samba is not installed; nobody reads %s", kShares);
  } else if (!done.has_tree) {
    log_line(LOG_WARNING, "the configuration tree does not answer; only shares that are gone are taken out");
  } else if (!config.includes_shares && !done.shares.empty()) {
    log_line(LOG_WARNING, "%s does not include %s; nobody sees the shares", kConfig, kShares);
  }
}

}  // namespace

int main(int argc, char** argv) {
  remvol::begin();
  const ReloadCommand command = read_command(argc, argv);
  if (command == ReloadCommand::kWrong) return 2;
  open_log("winshare_reload");
  if (!take_turn(kLock)) {
    log_line(LOG_WARNING, "%s: %s", kLock, strerror(errno));
    return 0;
  }
  ServerConfig config = read_server_config(kConfig, kShares);
  if (config.uses_registry) add_registry_shares(config);
  const Reload done = reload_shares({"winshare_reload", kShares, kSambaNames, config.names, true,
                                     options_for_macs(config), command == ReloadCommand::kWithdraw});
  const bool has_samba = is_installed("smbcontrol");
  tell_what_is_missing(done, config, has_samba);
  if (!done.untold) return 0;
  if (has_samba) {
    tell_samba(done);
  } else {
    remember_told(kShares, {});
  }
  return 0;
}
