#include "iscsi/iface.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "iscsi/iscsiadm.h"
#include "support/command.h"
#include "support/lan.h"
#include "support/net.h"
#include "support/ping.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr char kDefaultIface[] = "default";  // built into the initiator, has no record of its own
constexpr char kIface0[] = "iface0";
constexpr char kIface1[] = "iface1";
constexpr char kIfaceBond[] = "ifbond";

// An interface record. It is made only when the port that `read_mac` asks has a hardware address.
struct IfaceRecord {
  const char* iface;
  const char* netif;
  int (*read_mac)(char* text);
};

constexpr IfaceRecord kIfaceRecords[] = {
    {kIface0, kLan0, get_lan0_mac_text},
    {kIface1, kLan1, get_lan1_mac_text},
    {kIfaceBond, "bond0", get_lan0_mac_text},
};

// Makes or updates one record. Whether it existed before does not matter: the update decides. `mac` is not
// used.
int _set_iface_config(const char* iface, const char* /*mac*/, const char* netif) {
  const LogScope scope;
  if (iface == nullptr || iface[0] == '\0' || netif == nullptr || netif[0] == '\0') return kFailed;
  (void)run_command(new_iface_command(iface), kNote);
  return run_command(bind_iface_command(iface, netif)) == 0 ? kOk : kFailed;
}

bool answers_from(const char* address, const char* netif) {
  LOG(2, "ping_ip %s from %s", address, netif);
  if (ping_ip(address, netif) != 1) return false;
  LOG(1, "ping_ip %s from %s successed", address, netif);
  return true;
}

// A link-local address says nothing about the network that it is in: the port from which it answers does.
const char* iface_of_link_local(const char* address) {
  if (_ktree_get_bonding_mode_enable() == 1) return kIfaceBond;
  if (is_lan0_linked() == 1 && answers_from(address, kLan0)) return kIface0;
  if (is_lan1_linked() == 1 && answers_from(address, kLan1)) return kIface1;
  return kIface0;
}

}  // namespace

int Iface_Config_Gen() {
  const LogScope scope;
  for (const IfaceRecord& record : kIfaceRecords) {
    char mac[32] = "";
    if (record.read_mac(mac) != 0) continue;
    if (_set_iface_config(record.iface, mac, record.netif) == kOk) continue;
    LOG(0, "_set_iface_config %s %s %s failed", record.iface, mac, record.netif);
  }
  return kOk;
}

int get_iface_name(TargetEntry* entry) {
  const LogScope scope;
  if (entry == nullptr || entry->ip[0] == '\0') return kFailed;
  int result = kOk;
  if (entry->iface[0] == '\0') {
    const unsigned size = sizeof entry->iface;
    LOG(2, "_get_iface_name get iface name %s, %u ,%s", entry->iface, size, entry->ip);
    result = _get_iface_name(entry->iface, size, entry->ip);
    LOG(2, "_get_iface_name get iface name = %s", entry->iface);
  }
  LOG(2, "set iface name = %s", entry->iface);
  return result;
}

int _get_iface_name(char* out, size_t size, const char* address) {
  const LogScope scope;
  if (out == nullptr || address == nullptr || size == 0) return kFailed;
  const char* iface = kDefaultIface;
  if (address[0] != '\0') {
    memset(out, 0, size);
    const bool link_local = is_ipv6_text(address) != 0 && is_ipv6_link_local(address) == 1;
    if (link_local) iface = iface_of_link_local(address);
  }
  snprintf(out, size, "%s", iface);
  return kOk;
}

int _ktree_get_bonding_mode_enable() {
  const LogScope scope;
  char value[128];
  if (tree_read(key::kBondingEnable, value)) return atoi(value) != 0 ? 1 : 0;
  LOG(kNote, "get bonding mode status failed");
  return kFailed;
}

}  // namespace remvol
