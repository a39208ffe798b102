#include "support/ping.h"

#include <cstdlib>

#include "frontend/log.h"
#include "support/net.h"
#include "support/shell_text.h"
#include "support/text.h"

namespace remvol {

namespace {

CommandText ping_command(const char* address, const char* interface) {
  return interface != nullptr && interface[0] != '\0'
             ? shell_command("ping -W 1 -c 2 -I %s %s", interface, address)
             : shell_command("ping -W 1 -c 2 %s", address);
}

CommandText ping_ipv6_command(const char* address, const char* interface) {
  return interface != nullptr && interface[0] != '\0'
             ? shell_command("ping -6 -W 1 -c 2 -I %s %s", interface, address)
             : shell_command("ping -6 -W 1 -c 2 %s", address);
}

}  // namespace

int ping_ip(const char* address, const char* interface) {
  const LogScope scope;
  if (address == nullptr || address[0] == '\0') return 0;
  if (!is_ipv6_text(address)) return system(ping_command(address, interface)) == 0 ? 1 : 0;
  const CommandText command = ping_ipv6_command(without_brackets(address), interface);
  LOG(2, "run cmd = %s", command.c_str());
  return system(command) == 0 ? 1 : 0;
}

}  // namespace remvol
