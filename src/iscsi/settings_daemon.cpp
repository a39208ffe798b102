#include "iscsi/settings_daemon.h"

#include <unistd.h>

#include <cerrno>

#include "frontend/log.h"
#include "iscsi/daemon.h"
#include "support/command.h"
#include "support/files.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/settings_file.h"
#include "tree/slots.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr char kSettingsPidFile[] = "/var/run/ktree_sock_vv_config.pid";
constexpr char kFlashCopy[] = "/usr/local/config/vv.xml";

// Exit status of ktreec.
constexpr int kSettingsRefused = 1;
constexpr int kLoadTries = 10;  // one a second

// Returns the exit status of the command that loads `file` into the tree, or -1 when it did not come to its
// end. Loading moves all slots at once: a run that has found them empty a moment ago must not take them for
// garbage.
int load_tree(const char* file) {
  const SlotsHeld held(SlotsHeld::kChange);
  slots_move();
  const int status = run_command(load_tree_command(kVolumesSocket, file));
  const int ended = command_exit_code(status);
  return ended == 0 && status != 0 ? -1 : ended;
}

// Loads what is there: without its settings the tree would count as fresh, and be dumped over them. A daemon
// that a busy machine has not started in its second is waited for, and a command that could not run is run
// again.
int load_surely(const char* file) {
  int ended = load_tree(file);
  for (int i = 0; i < kLoadTries && ended != 0 && ended != kSettingsRefused && access(file, F_OK) == 0; i++) {
    sleep(1);
    ended = load_tree(file);
  }
  return ended;
}

bool is_nowhere(const char* file) {
  return access(file, F_OK) != 0 && errno == ENOENT;
}

// Settings that are missing or damaged are replaced by their copy on the configuration flash. Returns whether
// no settings are left that may be good and were not loaded.
bool load_settings() {
  int ended = load_surely(kSettingsFile);
  if (ended == 0) return true;
  if (ended != kSettingsRefused) return is_nowhere(kSettingsFile) && is_nowhere(kFlashCopy);
  keep_damaged_settings();
  if (is_nowhere(kFlashCopy)) return true;
  ended = load_surely(kFlashCopy);
  if (ended == 0) LOG(0, "%s is missing or damaged, %s was loaded instead", kSettingsFile, kFlashCopy);
  return ended == 0 || ended == kSettingsRefused;
}

// A run that was killed between starting the daemon and loading has left a tree that answers and holds
// nothing.
bool was_left_empty() {
  return tree_is_missing(key::kVersion, key::kVersion) &&
         tree_is_missing(key::kTargetCount, key::kTargetCount) &&
         (settings_file_has_targets(kSettingsFile) || settings_file_has_targets(kFlashCopy));
}

}  // namespace

// A killed daemon leaves its pid file behind. The result key was set a moment ago.
bool start_settings_daemon() {
  const bool runs = check_path_exist(kSettingsPidFile) == 0 && tree_answers(KeyText("%s/init", key::kResult));
  if (runs && !was_left_empty()) return true;
  if (!runs) start_tree_daemon(kVolumesSocket);
  return load_settings();
}

void stop_settings_daemon() {
  (void)stop_tree_daemon(kSettingsPidFile);
}

}  // namespace remvol
