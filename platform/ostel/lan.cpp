// The link of a LAN port, asked from the driver (ethtool's ioctl) in the network namespace of the caller;
// /sys/class/net would answer for the namespace in which /sys was mounted.

#include <linux/ethtool.h>
#include <linux/sockios.h>
#include <net/if.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>

#include "ostel_common.h"

namespace {

constexpr const char* kPorts[] = {"egiga0", "egiga1"};
constexpr int kUnknownSpeed = 1000;

bool ask_driver(int socket_fd, const char* port, void* question) {
  ifreq request{};
  strcpy(request.ifr_name, port);
  request.ifr_data = static_cast<char*>(question);
  return ioctl(socket_fd, SIOCETHTOOL, &request) == 0;
}

// The kernel's own flag, for drivers that cannot be asked.
bool is_running(int socket_fd, const char* port) {
  ifreq request{};
  strcpy(request.ifr_name, port);
  return ioctl(socket_fd, SIOCGIFFLAGS, &request) == 0 && (request.ifr_flags & IFF_RUNNING) != 0;
}

bool has_link(int socket_fd, const char* port) {
  ethtool_value link{ETHTOOL_GLINK, 0};
  return ask_driver(socket_fd, port, &link) ? link.data != 0 : is_running(socket_fd, port);
}

int speed(int socket_fd, const char* port) {
  ethtool_cmd settings{};
  settings.cmd = ETHTOOL_GSET;
  if (!ask_driver(socket_fd, port, &settings)) return kUnknownSpeed;
  const int mbits = static_cast<int>(ethtool_cmd_speed(&settings));
  return mbits > 0 ? mbits : kUnknownSpeed;
}

}  // namespace

int LIB_Get_Lan_Link_Speed(int port) {
  if (port < 0 || port > 1) return 0;
  const int socket_fd = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  if (socket_fd < 0) return 0;
  const int mbits = has_link(socket_fd, kPorts[port]) ? speed(socket_fd, kPorts[port]) : 0;
  close(socket_fd);
  return mbits;
}
