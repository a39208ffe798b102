#include "iscsi/settings_daemon.h"

#include <unistd.h>

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

// Exit statuses of ktreec.
constexpr int kSettingsRefused = 1;
constexpr int kTreeUnreachable = 3;
constexpr int kLoadTries = 10;  // one a second

// Returns the exit status of the command that loads `file` into the tree, which moves all slots at once: a
// run that has found them empty a moment ago must not take them for garbage.
int load_tree(const char* file) {
  const SlotsHeld held(SlotsHeld::kChange);
  slots_move();
  return command_exit_code(run_command(load_tree_command(kVolumesSocket, file)));
}

// A daemon that a busy machine has not started in its second is waited for: without its settings the tree
// would count as fresh, and be dumped over them.
int load_saved_settings() {
  int ended = load_tree(kSettingsFile);
  for (int i = 0; i < kLoadTries && ended == kTreeUnreachable && access(kSettingsFile, F_OK) == 0; i++) {
    sleep(1);
    ended = load_tree(kSettingsFile);
  }
  return ended;
}

// Settings that are missing or damaged are replaced by their copy on the configuration flash.
void load_settings() {
  if (load_saved_settings() != kSettingsRefused) return;
  keep_damaged_settings();
  if (access(kFlashCopy, F_OK) != 0 || load_tree(kFlashCopy) != 0) return;
  LOG(0, "%s is missing or damaged, %s was loaded instead", kSettingsFile, kFlashCopy);
}

}  // namespace

// A killed daemon leaves its pid file behind. The result key was set a moment ago.
void start_settings_daemon() {
  if (check_path_exist(kSettingsPidFile) == 0 && tree_answers(KeyText("%s/init", key::kResult))) return;
  start_tree_daemon(kVolumesSocket);
  load_settings();
}

void stop_settings_daemon() {
  (void)stop_tree_daemon(kSettingsPidFile);
}

}  // namespace remvol
