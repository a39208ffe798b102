#include "ktree/connection.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

namespace ktree {
namespace {

bool is_not_ready(int error) {
  return error == EAGAIN || error == EWOULDBLOCK || error == EINTR;
}

void take_descriptors(Connection& connection, msghdr& message) {
  for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (size_t i = 0; i < count; i++) {
      int fd = -1;
      memcpy(&fd, CMSG_DATA(part) + i * sizeof fd, sizeof fd);
      connection.close_document();
      connection.document = fd;
    }
  }
}

}  // namespace

Connection::~Connection() {
  close_document();
  if (fd >= 0) close(fd);
}

void Connection::close_document() {
  if (document >= 0) close(std::exchange(document, -1));
}

void ConnectionList::append(Connection& connection) {
  connection.previous = last;
  connection.next = nullptr;
  (last == nullptr ? first : last->next) = &connection;
  last = &connection;
}

void ConnectionList::remove(Connection& connection) {
  (connection.previous == nullptr ? first : connection.previous->next) = connection.next;
  (connection.next == nullptr ? last : connection.next->previous) = connection.previous;
  connection.previous = nullptr;
  connection.next = nullptr;
}

int64_t receive(Connection& connection, char* buffer, size_t room) {
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))];
  iovec part = {buffer, room};
  msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  const ssize_t n = recvmsg(connection.fd, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  if (n < 0) return is_not_ready(errno) ? 0 : -1;
  if (message.msg_controllen > 0) take_descriptors(connection, message);
  return n == 0 ? -1 : n;
}

int64_t send_some(const Connection& connection, std::string_view bytes) {
  const ssize_t n = send(connection.fd, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
  if (n < 0) return is_not_ready(errno) ? 0 : -1;
  return n;
}

}  // namespace ktree
