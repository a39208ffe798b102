#include "iscsi/iscsiadm.h"

#include <cstring>

#include "frontend/log.h"
#include "support/shell_text.h"

namespace remvol {

namespace {

// iscsiadm makes folders of a target's name and address: behind a component ".." they would lie outside its
// records.
bool leaves_records(const char* text) {
  while (true) {
    const size_t length = strcspn(text, "/");
    if (length == 2 && strncmp(text, "..", length) == 0) return true;
    if (text[length] == '\0') return false;
    text += length + 1;
  }
}

// A record holds one setting on each line: what follows a line break would be another one.
bool breaks_line(const char* value) {
  return strchr(value, '\n') != nullptr;
}

CommandText refused(const char* reason) {
  const LogScope scope;
  LOG(0, "cmd of iscsiadm is refused, %s", reason);
  return CommandText("%s", kRefusedCommand);
}

// Returns `command`, or one that fails when the entry names a node that iscsiadm must not be given.
CommandText node_command(const TargetEntry& entry, const CommandText& command) {
  const bool leaves = leaves_records(entry.target_name) || leaves_records(entry.ip);
  return leaves ? refused("the target leaves its records") : command;
}

// The same for a command that stores `value`.
CommandText setting_command(const TargetEntry& entry, const char* value, const CommandText& command) {
  if (breaks_line(value)) return refused("a setting is of more than one line");
  return node_command(entry, command);
}

}  // namespace

CommandText new_iface_command(const char* iface) {
  return shell_command("iscsiadm -m iface -I %s --op=new", iface);
}

CommandText bind_iface_command(const char* iface, const char* netif) {
  return shell_command("iscsiadm -m iface -I %s --op=update -n iface.net_ifacename -v \"%s\"", iface, netif);
}

CommandText discovery_command(const char* address, int port, const char* iface, const char* path) {
  return shell_command("iscsiadm -m discovery -t sendtargets -p %s:%d -I %s > %s", address, port, iface,
                       path);
}

CommandText sessions_command(const char* path) {
  return shell_command("iscsiadm -m session >%s 2>&1", path);
}

CommandText session_devices_command(const char* path) {
  return shell_command("iscsiadm -m session -P3 >%s 2>&1", path);
}

CommandText session_luns_command(const char* path) {
  return shell_command("iscsiadm -m session -P 3 >%s 2>&1", path);
}

CommandText new_node_command(const TargetEntry& entry) {
  return node_command(entry, shell_command("iscsiadm -m node -I %s -T %s -p %s:%d -o new", entry.iface,
                                           entry.target_name, entry.ip, entry.port));
}

CommandText delete_node_command(const TargetEntry& entry) {
  return node_command(entry, shell_command("iscsiadm -m node -I %s -T %s -p %s:%d -o delete", entry.iface,
                                           entry.target_name, entry.ip, entry.port));
}

CommandText no_auth_command(const TargetEntry& entry) {
  return node_command(
      entry,
      shell_command("iscsiadm -m node -I %s -T %s -p %s:%d -o update -n node.session.auth.authmethod -v None",
                    entry.iface, entry.target_name, entry.ip, entry.port));
}

CommandText chap_method_command(const TargetEntry& entry) {
  return node_command(
      entry,
      shell_command(
          "iscsiadm -m node -I %s -T \"%s\" -p %s:%d -o update -n node.session.auth.authmethod -v CHAP",
          entry.iface, entry.target_name, entry.ip, entry.port));
}

CommandText chap_user_command(const TargetEntry& entry) {
  return setting_command(
      entry, entry.chap_name,
      shell_command(
          "iscsiadm -m node -I %s -T \"%s\" -p %s:%d -o update -n node.session.auth.username -v \"%s\"",
          entry.iface, entry.target_name, entry.ip, entry.port, entry.chap_name));
}

CommandText chap_secret_command(const TargetEntry& entry) {
  return setting_command(
      entry, entry.chap_pwd,
      shell_command(
          "iscsiadm -m node -I %s -T \"%s\" -p %s:%d -o update -n node.session.auth.password -v \"%s\"",
          entry.iface, entry.target_name, entry.ip, entry.port, entry.chap_pwd));
}

CommandText login_command(const TargetEntry& entry) {
  return node_command(entry, shell_command("iscsiadm -m node -T %s -p %s:%d -I %s --login", entry.target_name,
                                           entry.ip, entry.port, entry.iface));
}

CommandText portal_logout_command(const TargetEntry& entry) {
  return node_command(entry, shell_command("iscsiadm -m node -T \"%s\" -p %s:%d --logout", entry.target_name,
                                           entry.ip, entry.port));
}

CommandText login_again_command(const TargetEntry& entry) {
  return node_command(entry, shell_command("iscsiadm -m node -T \"%s\" -p %s:%d -I %s --login",
                                           entry.target_name, entry.ip, entry.port, entry.iface));
}

CommandText logout_command(const TargetEntry& entry) {
  return node_command(entry, shell_command("iscsiadm -m node -T \"%s\" --logout", entry.target_name));
}

CommandText logout_all_command() {
  return CommandText("iscsiadm -m node -u");
}

}  // namespace remvol
