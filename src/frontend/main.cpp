// remvol: one command of the appliance for each run. main reads the command line, runs the command's handler
// and records the outcome.
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

#include "begin.h"
#include "frontend/commands.h"
#include "frontend/log.h"
#include "frontend/options.h"
#include "frontend/remvol_debug.h"
#include "frontend/request.h"
#include "ktreec.h"
#include "support/flashrun.h"
#include "support/memory.h"
#include "support/program.h"
#include "support/run_lock.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/access.h"
#include "tree/settings_file.h"
#include "tree_layout.h"
#include "volume/share_services.h"
#include "volume/unmount.h"

using namespace remvol;

namespace {

constexpr char kResetMark[] = "/tmp/reset_default";  // while it exists, the flash copy stays as it is
constexpr int kFailureStatus = -1;

KeyText result_key() {
  return KeyText("%s/%s", key::kResult, gs_str_command);
}

// Those who started the command poll this key: empty while it runs, then its result.
void record_result(const char* value) {
  (void)tree_write(result_key(), value);
}

int fail(bool show_usage) {
  if (show_usage) print_usage();
  fflush(stdout);
  // Only the SMB service is reloaded, and on every failure: users of the shares see what is left of them.
  reload_smb_shares();
  if (gs_str_command != nullptr) record_result("-1");
  begin_line(kCommandFailed);
  puts("execute failed.");
  return kFailureStatus;
}

// Anybody can make a mark in /tmp. One that is not root's is none.
bool is_strangers(const char* path) {
  struct stat info;
  return lstat(path, &info) == 0 && info.st_uid != 0 && info.st_uid != geteuid();
}

void copy_to_flash() {
  if (access(kResetMark, F_OK) == 0 && !is_strangers(kResetMark)) return;
  RunLock lock;
  lock.take("flash.lock", LockMode::kExclusive);               // the last to copy copies the newest settings
  System("%s", copy_to_flash_command(kSettingsFile).c_str());  // tells of a failure itself
}

// Dumps the tree. Returns whether the settings file may go to the flash.
bool dump_settings(const CommandRow& command) {
  // A tree that was told to end may be gone already, which is nothing to tell of.
  if (command.ends_tree) {
    return unloaded_settings() == nullptr && ktreec_dump(kVolumesSocket, 0, kSettingsFile) == 0;
  }
  RunLock lock;
  lock.take("settings.lock", LockMode::kExclusive);  // an older dump never replaces a newer one
  return store_settings();
}

// Returns whether the tree that the command has changed is gone, and the change with it: its daemon was
// started anew and has loaded the settings of before, or does not answer any more. Where there was no socket
// before the command, nothing is known of that.
bool is_tree_gone(const TreeInstance& tree) {
  return tree.inode != 0 && !(tree == tree_instance() && tree_answers(result_key()));
}

// Stores what the command has done. Returns whether it lasts.
bool keep_change(const CommandRow& command, int result, const TreeInstance& tree) {
  record_result(NumberText("%d", result));
  const bool stored = dump_settings(command);
  if (!command.persists) return true;
  if (is_tree_gone(tree)) {
    LOG(0, "the configuration tree was started anew meanwhile, what was changed may be lost");
    return false;
  }
  if (stored) copy_to_flash();
  reload_share_services();
  return true;
}

const char* failure_message(const CommandRow& command) {
  const bool for_all = command.failure_all != nullptr && (OPT_FLAG & kOptName) == 0;
  return for_all ? command.failure_all : command.failure;
}

int run(const CommandRow& command) {
  record_result("");
  if ((OPT_FLAG & command.required) != command.required) {
    LOG(1, "OPT_FLAG: %08x", OPT_FLAG);
    return fail(false);
  }
  if (command.run == nullptr) return fail(false);
  const TreeInstance tree = tree_instance();
  const int result = command.run();
  if (result != 0 && !command.reports_value) {
    LOG(1, "%s", failure_message(command));
  } else if (keep_change(command, result, tree)) {
    return result;
  }
  const int status = fail(false);
  if (command.persists && is_tree_gone(tree)) unmount_lost_volumes();
  return status;
}

void keep_program_path(int argc, char** argv) {
  if (argc > 0) copy_text(program_path, argv[0]);
}

void log_arguments(int argc, char** argv, const int* shown) {
  for (int i = 0; i < argc; i++) {
    LOG(1, "arg[%d]: '%.*s%s'", i, shown[i], argv[i], shown[i] < 0 ? "" : kMaskedSecret);
  }
}

}  // namespace

int main(int argc, char** argv) {
  const LogScope scope;
  begin();
  const Memory<int> shown = allocate<int>(static_cast<size_t>(argc) + 1);
  if (!shown) return fail(false);
  hide_secrets(argc, argv, shown.get());
  debug_level = dbg_get_remvol_debug_lv();
  keep_program_path(argc, argv);
  log_arguments(argc, argv, shown.get());
  request_target = TargetEntry();
  switch (parse_options(argc, argv)) {
    case ParseEnd::kExit:
      return 0;
    case ParseEnd::kFail:
      return fail(false);
    case ParseEnd::kUsage:
      return fail(true);
    case ParseEnd::kReady:
      break;
  }
  if (gs_str_command == nullptr) {
    begin_line(kCommandFailed, stderr);
    fprintf(stderr, "%s: %s:%d: %s: Assertion `gs_str_command' failed.\n", program_path, LOG_SOURCE, __LINE__,
            __func__);
    abort();
  }
  return run(kCommands[command_row]);
}
