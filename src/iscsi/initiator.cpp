#include "iscsi/initiator.h"

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "iscsi/daemon.h"
#include "iscsi/iscsid.h"
#include "iscsi/kmod.h"
#include "iscsi/records.h"
#include "support/command.h"
#include "support/coreutils.h"
#include "support/files.h"
#include "support/text.h"
#include "sysaux.h"

namespace remvol {

namespace {

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
  (void)run_command(configure_iscsid_command(iscsid_settings("\\n")));
  // The echo of dash knows no -e: it writes it into the file.
  const ConfText settings = iscsid_settings("\n");
  if (iscsid_conf_holds(settings) || write_iscsid_conf(settings)) return;
  LOG(0, "write %s failed", kIscsidConf);
}

// A module that is not loaded is no failure here.
void reload_modules() {
  for (const char* module : kModules) System("%s", unload_module_quietly_command(module).c_str());
  for (int i = kModuleCount - 1; i >= 0; i--) {
    (void)run_command(load_module_command(kModules[i]));
  }
}

InitiatorName write_initiator_name() {
  const InitiatorName name = make_initiator_name();
  (void)run_command(name_initiator_command(name));
  return name;
}

}  // namespace

InitiatorName start_initiator() {
  (void)run_command(end_iscsid_quietly_command(), kNote);
  reload_modules();
  (void)run_command(make_system_folder_command(kIscsidFolder));
  write_daemon_configuration();
  const InitiatorName name = write_initiator_name();
  drop_empty_records();
  if (!await_iscsid_end()) LOG(0, "the iscsid that was told to end has not ended");
  (void)start_daemon(start_iscsid_command());
  return name;
}

bool stop_initiator() {
  LOG(1, "killall -SIGTERM iscsid ");
  return run_command(end_iscsid_command()) == 0;
}

bool unload_modules() {
  bool unloaded = false;
  for (const char* module : kModules) unloaded = run_command(unload_module_command(module)) == 0;
  return unloaded;
}

}  // namespace remvol
