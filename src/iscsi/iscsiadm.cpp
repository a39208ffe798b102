#include "iscsi/iscsiadm.h"

namespace remvol {

namespace {

CommandText node_command(const TargetEntry& entry, const char* operation) {
  return CommandText("iscsiadm -m node -I %s -T %s -p %s:%d -o %s", entry.iface, entry.target_name, entry.ip,
                     entry.port, operation);
}

CommandText auth_command(const TargetEntry& entry, const char* setting, const char* value) {
  return CommandText("iscsiadm -m node -I %s -T \"%s\" -p %s:%d -o update -n node.session.auth.%s -v %s",
                     entry.iface, entry.target_name, entry.ip, entry.port, setting, value);
}

}  // namespace

CommandText new_iface_command(const char* iface) {
  return CommandText("iscsiadm -m iface -I %s --op=new", iface);
}

CommandText bind_iface_command(const char* iface, const char* netif) {
  return CommandText("iscsiadm -m iface -I %s --op=update -n iface.net_ifacename -v \"%s\"", iface, netif);
}

CommandText discovery_command(const char* address, int port, const char* iface, const char* path) {
  return CommandText("iscsiadm -m discovery -t sendtargets -p %s:%d -I %s > %s", address, port, iface, path);
}

CommandText sessions_command(const char* path) {
  return CommandText("iscsiadm -m session >%s 2>&1", path);
}

CommandText session_devices_command(const char* path) {
  return CommandText("iscsiadm -m session -P3 >%s 2>&1", path);
}

CommandText session_luns_command(const char* path) {
  return CommandText("iscsiadm -m session -P 3 >%s 2>&1", path);
}

CommandText new_node_command(const TargetEntry& entry) {
  return node_command(entry, "new");
}

CommandText delete_node_command(const TargetEntry& entry) {
  return node_command(entry, "delete");
}

CommandText no_auth_command(const TargetEntry& entry) {
  return node_command(entry, "update -n node.session.auth.authmethod -v None");
}

CommandText chap_method_command(const TargetEntry& entry) {
  return auth_command(entry, "authmethod", "CHAP");
}

CommandText chap_user_command(const TargetEntry& entry) {
  return auth_command(entry, "username", Text<256>("\"%s\"", entry.chap_name));
}

CommandText chap_secret_command(const TargetEntry& entry) {
  return auth_command(entry, "password", Text<256>("\"%s\"", entry.chap_pwd));
}

CommandText login_command(const TargetEntry& entry) {
  return CommandText("iscsiadm -m node -T %s -p %s:%d -I %s --login", entry.target_name, entry.ip, entry.port,
                     entry.iface);
}

CommandText portal_logout_command(const TargetEntry& entry) {
  return CommandText("iscsiadm -m node -T \"%s\" -p %s:%d --logout", entry.target_name, entry.ip, entry.port);
}

CommandText login_again_command(const TargetEntry& entry) {
  return CommandText("iscsiadm -m node -T \"%s\" -p %s:%d -I %s --login", entry.target_name, entry.ip,
                     entry.port, entry.iface);
}

CommandText logout_command(const char* name) {
  return CommandText("iscsiadm -m node -T \"%s\" --logout", name);
}

}  // namespace remvol
