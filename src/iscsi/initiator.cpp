#include "iscsi/initiator.h"

#include <unistd.h>

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "iscsi/daemon.h"
#include "iscsi/iface.h"
#include "iscsi/initiator_name.h"
#include "iscsi/iscsiadm.h"
#include "iscsi/node.h"
#include "iscsi/records.h"
#include "support/command.h"
#include "support/files.h"
#include "support/shell_text.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/access.h"
#include "tree/keys.h"
#include "tree/settings_file.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "upgrade/remvol_ver_upgrade.h"
#include "volume/session_volumes.h"
#include "volume/share_services.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

constexpr char kSettingsPidFile[] = "/var/run/ktree_sock_vv_config.pid";
constexpr char kFlashCopy[] = "/usr/local/config/vv.xml";
constexpr char kModuleFolder[] = "/usr/local/modules/driver";
constexpr char kIscsidConf[] = "/etc/iscsi/iscsid.conf";
constexpr char kNameFile[] = "/etc/iscsi/initiatorname.iscsi";

// Exit statuses of ktreec.
constexpr int kSettingsRefused = 1;
constexpr int kTreeUnreachable = 3;
constexpr int kLoadTries = 10;  // one a second

// Top of the stack first: the order of unloading.
constexpr const char* kModules[] = {"iscsi_tcp.ko", "libiscsi_tcp.ko", "libiscsi.ko",
                                    "scsi_transport_iscsi.ko"};
constexpr int kModuleCount = sizeof kModules / sizeof *kModules;

// Times are in seconds.
constexpr struct {
  const char* name;
  const char* value;
} kIscsidSettings[] = {
    {"node.startup", "manual"},
    {"node.session.timeo.replacement_timeout", "30"},
    {"node.session.initial_login_retry_max", "5"},
    {"node.conn[0].timeo.login_timeout", "10"},
    {"node.conn[0].timeo.logout_timeout", "15"},
    {"node.conn[0].timeo.noop_out_interval", "5"},
    {"node.conn[0].timeo.noop_out_timeout", "5"},
    {"node.session.err_timeo.abort_timeout", "15"},
    {"node.session.err_timeo.lu_reset_timeout", "20"},
};

using ConfText = Text<1024>;

// All settings, each followed by `line_end`.
ConfText iscsid_settings(const char* line_end) {
  ConfText text;
  size_t length = 0;
  for (const auto& setting : kIscsidSettings) {
    snprintf(text.data() + length, ConfText::size() - length, "%s = %s%s", setting.name, setting.value,
             line_end);
    length = strlen(text);
  }
  return text;
}

// Returns whether the file holds the settings and nothing else; the empty line that echo adds is nothing.
bool iscsid_conf_holds(const char* settings) {
  char content[ConfText::size() + 2];
  const File file(fopen(kIscsidConf, "re"));
  if (file == nullptr) return false;
  const size_t length = fread(content, 1, sizeof content - 1, file.get());
  content[length] = '\0';
  const size_t wanted = strlen(settings);
  return strncmp(content, settings, wanted) == 0 && (length == wanted || strcmp(content + wanted, "\n") == 0);
}

bool write_iscsid_conf(const char* settings) {
  File file(fopen(kIscsidConf, "we"));
  if (file == nullptr) return false;
  const bool written = fputs(settings, file.get()) >= 0;
  return fclose(file.release()) == 0 && written;
}

void write_daemon_configuration() {
  run_command(CommandText("echo -e \"%s\" > %s", iscsid_settings("\\n").c_str(), kIscsidConf));
  // The echo of dash knows no -e: it writes it into the file.
  const ConfText settings = iscsid_settings("\n");
  if (iscsid_conf_holds(settings) || write_iscsid_conf(settings)) return;
  LOG(0, "write %s failed", kIscsidConf);
}

// Returns the exit status of the command that loads `file` into the tree, which moves all slots at once: a
// run that has found them empty a moment ago must not take them for garbage.
int load_tree(const char* file) {
  const SlotsHeld held(SlotsHeld::kChange);
  slots_move();
  return command_exit_code(run_command(CommandText("ktreec -S %s -l %s", kVolumesSocket, file)));
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

// A killed daemon leaves its pid file behind. The result key was set a moment ago.
void start_settings_daemon() {
  if (check_path_exist(kSettingsPidFile) == 0 && tree_answers(KeyText("%s/init", key::kResult))) return;
  start_tree_daemon(kVolumesSocket);
  load_settings();
}

// A module that is not loaded is no failure here.
void reload_modules() {
  for (const char* module : kModules) System("rmmod %s 1>/dev/null 2>/dev/null", module);
  for (int i = kModuleCount - 1; i >= 0; i--) {
    run_command(CommandText("insmod %s/%s", kModuleFolder, kModules[i]));
  }
}

InitiatorName write_initiator_name() {
  const InitiatorName name = make_initiator_name();
  run_command(shell_command("echo 'InitiatorName=%s' > %s", name.c_str(), kNameFile));
  return name;
}

// Returns whether the last module was unloaded.
bool unload_modules() {
  bool unloaded = false;
  for (const char* module : kModules) unloaded = run_command(CommandText("rmmod %s", module)) == 0;
  return unloaded;
}

}  // namespace

int task_init() {
  const LogScope scope;
  LOG(2, "start");
  start_settings_daemon();
  if (is_remvol_ver_changed() != 0) version_upgrade();
  set_remvol_ver_to_db(kSettingsVersion);
  run_command("killall -q -SIGTERM iscsid", kNote);
  reload_modules();
  run_command("mkdir -p /etc/iscsi");
  write_daemon_configuration();
  const InitiatorName name = write_initiator_name();
  drop_empty_records();
  start_daemon("iscsid -f >/dev/null 2>&1 &");
  Iface_Config_Gen();
  ktree_update_initiator_iqn(name);
  Target_load_all();
  LOG(2, "end");
  return 0;
}

int task_deinit(int system_off) {
  const LogScope scope;
  LOG(2, system_off != 0 ? "system off" : "deinit start");
  Target_umount_all();
  close_sessions(nullptr, kLogoutAllCommand);
  LOG(1, "killall -SIGTERM iscsid ");
  bool succeeded = run_command("killall -SIGTERM iscsid") == 0;
  LOG(2, "deinit end");
  if (system_off == 0) {
    LOG(1, "update share folder status");
    reload_share_services();
    LOG(1, "finish share folder status");
    succeeded = unload_modules();
  }
  stop_tree_daemon(kSettingsPidFile);
  return succeeded ? 0 : 1;
}

}  // namespace remvol
