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

// Exit status of ktreec.
constexpr int kSettingsRefused = 1;
constexpr int kUnreadable = -2;  // refused, and nothing can be said against what the file holds
constexpr int kLoadTries = 10;   // one a second

// Returns the exit status of the command that loads `file` into the tree, or -1 when it did not come to its
// end. Loading moves all slots at once: a run that has found them empty a moment ago must not take them for
// garbage.
int load_tree(const char* file) {
  const SlotsHeld held(SlotsHeld::kChange);
  slots_move();
  const int status = run_command(load_tree_command(kVolumesSocket, file));
  const int ended = command_exit_code(status);
  if (ended == kSettingsRefused && settings_file_is_unreadable(file)) return kUnreadable;
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
  const int saved = load_surely(kSettingsFile);
  if (saved == 0) return true;
  const bool refused = saved == kSettingsRefused;
  const bool has_copy = !is_nowhere(kFlashCopy);
  if (!refused && (saved != kUnreadable || !has_copy)) return is_nowhere(kSettingsFile) && !has_copy;
  keep_damaged_settings();
  if (!has_copy) return true;
  const int copy = load_surely(kFlashCopy);
  if (copy == 0) LOG(0, "%s is missing or damaged, %s was loaded instead", kSettingsFile, kFlashCopy);
  return copy == 0 || (refused && copy == kSettingsRefused);
}

// A run that was killed between starting the daemon and loading has left a tree that answers and holds no
// settings; a command may have put something into it since.
bool was_never_loaded() {
  return tree_is_missing(key::kVersion, key::kVersion) && unloaded_settings() != nullptr;
}

}  // namespace

// A killed daemon leaves its pid file behind. The result key was set a moment ago.
bool start_settings_daemon() {
  const bool runs = check_path_exist(kSettingsPidFile) == 0 && tree_answers(KeyText("%s/init", key::kResult));
  if (runs && !was_never_loaded()) return true;
  if (!runs) start_tree_daemon(kVolumesSocket);
  return load_settings();
}

void stop_settings_daemon() {
  (void)stop_tree_daemon(kSettingsPidFile);
}

}  // namespace remvol
