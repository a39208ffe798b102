// The appliance's own name and hardware addresses.

#include <net/if.h>
#include <net/if_arp.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>

#include "common/fd.h"
#include "sysaux.h"

extern "C" {

int sys_get_mac_addr(const char* interface, unsigned char mac[6]) {
  ifreq request{};
  if (interface == nullptr || mac == nullptr) return -1;
  const size_t length = strlen(interface);
  if (length == 0 || length >= sizeof request.ifr_name) return -1;
  memcpy(request.ifr_name, interface, length);
  const platform::Fd socket_fd(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  if (!socket_fd.ok() || ioctl(socket_fd.get(), SIOCGIFHWADDR, &request) != 0) return -1;
  if (request.ifr_hwaddr.sa_family != ARPHRD_ETHER) return -1;
  memcpy(mac, request.ifr_hwaddr.sa_data, 6);
  return 0;
}

int sys_hostname(char* out, size_t size) {
  if (out == nullptr || size == 0) return -1;
  out[0] = '\0';
  char name[256];
  if (gethostname(name, sizeof name) != 0) return -1;
  const size_t length = strnlen(name, sizeof name);
  if (length == 0 || length >= sizeof name || length >= size) return -1;
  memcpy(out, name, length + 1);
  return 0;
}

}  // extern "C"
