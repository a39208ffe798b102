#include "iscsi/initiator.h"

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "iscsi/daemon.h"
#include "iscsi/records.h"
#include "support/command.h"
#include "support/files.h"
#include "support/shell_text.h"
#include "support/text.h"
#include "sysaux.h"

namespace remvol {

namespace {

constexpr char kModuleFolder[] = "/usr/local/modules/driver";
constexpr char kIscsidConf[] = "/etc/iscsi/iscsid.conf";
constexpr char kNameFile[] = "/etc/iscsi/initiatorname.iscsi";

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

}  // namespace

InitiatorName start_initiator() {
  run_command("killall -q -SIGTERM iscsid", kNote);
  reload_modules();
  run_command("mkdir -p /etc/iscsi");
  write_daemon_configuration();
  const InitiatorName name = write_initiator_name();
  drop_empty_records();
  start_daemon("iscsid -f >/dev/null 2>&1 &");
  return name;
}

bool stop_initiator() {
  LOG(1, "killall -SIGTERM iscsid ");
  return run_command("killall -SIGTERM iscsid") == 0;
}

bool unload_modules() {
  bool unloaded = false;
  for (const char* module : kModules) unloaded = run_command(CommandText("rmmod %s", module)) == 0;
  return unloaded;
}

}  // namespace remvol
