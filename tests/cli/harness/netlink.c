/* Preloaded into a program of a test box: its netlink sockets are datagram sockets that a test writes to.
 *
 * The socket of protocol N is the file /run/netlink-N; while /run/netlink-N-refused exists it cannot be
 * opened. Three datagrams are no message: "overrun" makes the call fail with ENOBUFS, "broken" with EIO, and
 * what begins with "foreign " comes from another process than the kernel. */
#undef _GNU_SOURCE /* would declare these functions with a union as their address */
#define _DEFAULT_SOURCE
#include <errno.h>
#include <linux/netlink.h>
#include <stdio.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#pragma GCC visibility push(default)

static int refuse(int error) {
  errno = error;
  return -1;
}

int socket(int domain, int type, int protocol) {
  struct sockaddr_un place = {.sun_family = AF_UNIX};
  char refused[sizeof place.sun_path + 16];
  if (domain != AF_NETLINK) return (int)syscall(SYS_socket, domain, type, protocol);
  snprintf(place.sun_path, sizeof place.sun_path, "/run/netlink-%d", protocol);
  snprintf(refused, sizeof refused, "%s-refused", place.sun_path);
  if (access(refused, F_OK) == 0) return refuse(ECONNREFUSED);
  unlink(place.sun_path);
  int flags = type & (SOCK_CLOEXEC | SOCK_NONBLOCK);
  int fd = (int)syscall(SYS_socket, AF_UNIX, SOCK_DGRAM | flags, 0);
  if (fd >= 0 && syscall(SYS_bind, fd, &place, sizeof place) != 0) return refuse(errno);
  return fd;
}

int bind(int fd, const struct sockaddr* address, socklen_t size) {
  if (address->sa_family == AF_NETLINK) return 0;
  return (int)syscall(SYS_bind, fd, address, size);
}

ssize_t recvfrom(int fd, void* buffer, size_t size, int flags, struct sockaddr* sender,
                 socklen_t* sender_size) {
  ssize_t got = syscall(SYS_recvfrom, fd, buffer, size, flags, NULL, NULL);
  if (got < 0 || sender == NULL || *sender_size < sizeof(struct sockaddr_nl)) return got;
  struct sockaddr_nl from = {.nl_family = AF_NETLINK};
  if (got == 7 && memcmp(buffer, "overrun", 7) == 0) return refuse(ENOBUFS);
  if (got == 6 && memcmp(buffer, "broken", 6) == 0) return refuse(EIO);
  if (got >= 8 && memcmp(buffer, "foreign ", 8) == 0) from.nl_pid = 77;
  memcpy(sender, &from, sizeof from);
  *sender_size = sizeof from;
  return got;
}
