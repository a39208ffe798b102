#include "iscsi/iscsid.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstring>

#include "support/shell_text.h"

namespace remvol {

namespace {

constexpr char kNameFile[] = "/etc/iscsi/initiatorname.iscsi";

constexpr int kEndSeconds = 10;
constexpr int kPollsPerSecond = 20;
constexpr useconds_t kPoll = 1'000'000 / kPollsPerSecond;

// Returns whether somebody has the name. It is tried, and given back at once.
bool is_name_taken() {
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return false;
  sockaddr_un name = {};
  name.sun_family = AF_UNIX;
  static_assert(sizeof kIscsidSocket < sizeof name.sun_path);
  memcpy(name.sun_path + 1, kIscsidSocket, sizeof kIscsidSocket - 1);
  const socklen_t size = offsetof(sockaddr_un, sun_path) + sizeof kIscsidSocket;
  const bool taken = bind(fd, reinterpret_cast<const sockaddr*>(&name), size) != 0 && errno == EADDRINUSE;
  close(fd);
  return taken;
}

}  // namespace

CommandText start_iscsid_command() {
  return CommandText("iscsid -f >/dev/null 2>&1 &");
}

CommandText end_iscsid_command() {
  return CommandText("killall -SIGTERM iscsid");
}

CommandText end_iscsid_quietly_command() {
  return CommandText("killall -q -SIGTERM iscsid");
}

bool await_iscsid_end() {
  bool taken = is_name_taken();
  for (int polls = 0; taken && polls < kEndSeconds * kPollsPerSecond; polls++) {
    usleep(kPoll);
    taken = is_name_taken();
  }
  return !taken;
}

CommandText configure_iscsid_command(const char* settings) {
  return CommandText("echo -e \"%s\" > %s", settings, kIscsidConf);
}

CommandText name_initiator_command(const char* name) {
  return shell_command("echo 'InitiatorName=%s' > %s", name, kNameFile);
}

}  // namespace remvol
