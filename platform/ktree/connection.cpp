#include "ktree/connection.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "ktree/descriptors.h"

namespace ktree {
namespace {

bool is_not_ready(int error) {
  return error == EAGAIN || error == EWOULDBLOCK || error == EINTR;
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
  DescriptorRoom room_for_one;
  iovec part = {buffer, room};
  msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = room_for_one.bytes;
  message.msg_controllen = sizeof room_for_one.bytes;
  const ssize_t n = recvmsg(connection.fd, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  if (n < 0) return is_not_ready(errno) ? 0 : -1;
  if (message.msg_controllen > 0) take_descriptor(message, connection.document);
  return n == 0 ? -1 : n;
}

int64_t send_some(const Connection& connection, std::string_view bytes) {
  const ssize_t n = send(connection.fd, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
  if (n < 0) return is_not_ready(errno) ? 0 : -1;
  return n;
}

int64_t send_with_descriptor(const Connection& connection, std::string_view bytes, int descriptor) {
  DescriptorRoom room = {};
  iovec part = {const_cast<char*>(bytes.data()), bytes.size()};
  msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  pass_descriptor(message, room, descriptor);
  const ssize_t n = sendmsg(connection.fd, &message, MSG_DONTWAIT | MSG_NOSIGNAL);
  if (n < 0) return is_not_ready(errno) ? 0 : -1;
  return n;
}

}  // namespace ktree
