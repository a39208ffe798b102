#include "events/netlink.h"

#include <linux/netlink.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>

namespace events {
namespace {

constexpr unsigned kGroup = 1;  // of both: events as the kernel sends them
constexpr int kBuffer = 1 << 20;

int open_group(int protocol) {
  const int fd = socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC | SOCK_NONBLOCK, protocol);
  if (fd < 0) return -1;
  // Bursts: every session reports its loss when a cable is pulled. Without the privilege the usual size
  // remains.
  (void)setsockopt(fd, SOL_SOCKET, SO_RCVBUFFORCE, &kBuffer, sizeof kBuffer);
  sockaddr_nl address{};
  address.nl_family = AF_NETLINK;
  address.nl_groups = kGroup;  // the port number is the kernel's choice: iscsid takes its own process number
  if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) return fd;
  const int error = errno;
  close(fd);
  errno = error;
  return -1;
}

}  // namespace

int open_device_events() {
  return open_group(NETLINK_KOBJECT_UEVENT);
}

int open_iscsi_events() {
  return open_group(NETLINK_ISCSI);
}

Received receive(int socket, unsigned char* buffer, size_t room, size_t& size) {
  for (;;) {
    sockaddr_nl sender{};
    socklen_t sender_size = sizeof sender;
    const ssize_t got = recvfrom(socket, buffer, room, 0, reinterpret_cast<sockaddr*>(&sender), &sender_size);
    if (got >= 0 && sender.nl_pid == 0) {
      size = static_cast<size_t>(got);
      return Received::kMessage;
    }
    if (got >= 0 || errno == EINTR) continue;
    if (errno == EAGAIN) return Received::kNothing;
    return errno == ENOBUFS ? Received::kOverrun : Received::kFailed;
  }
}

bool is_session_event(const unsigned char* message, size_t size) {
  // "ACTION@PATH", then "NAME=VALUE" each, all ended by NUL; the kernel's Documentation/ABI has no better
  // word.
  constexpr std::string_view kWanted("\0SUBSYSTEM=iscsi_session\0", 25);
  return std::string_view(reinterpret_cast<const char*>(message), size).find(kWanted) !=
         std::string_view::npos;
}

}  // namespace events
