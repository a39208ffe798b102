#include "support/lan.h"

#include <cstdio>
#include <cstring>

#include "ostel_common.h"
#include "sysaux.h"

namespace remvol {

namespace {

constexpr int kMacTextSize = 32;

// The second octet stands in lower case: initiator names and interface records of running systems hold it so.
int mac_text(const char* interface, const char* end, char* text) {
  unsigned char mac[6];
  if (sys_get_mac_addr(interface, mac) != 0) return -1;
  snprintf(text, kMacTextSize, "%02X:%02x:%02X:%02X:%02X:%02X%s", mac[0], mac[1], mac[2], mac[3], mac[4],
           mac[5], end);
  return 0;
}

}  // namespace

int get_lan0_mac_text(char* text) {
  return mac_text(kLan0, "", text);
}

int get_lan1_mac_text(char* text) {
  memset(text, 0, kMacTextSize);
  return mac_text(kLan1, "\n", text);
}

int is_lan0_linked() {
  return LIB_Get_Lan_Link_Speed(0) != 0 ? 1 : 0;
}

int is_lan1_linked() {
  return LIB_Get_Lan_Link_Speed(1) != 0 ? 1 : 0;
}

}  // namespace remvol
