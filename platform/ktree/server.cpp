#include "ktree/server.h"

#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <memory>
#include <new>

namespace ktree {
namespace {

constexpr int64_t kAcceptPause = 100;  // milliseconds without accepting when descriptors ran out
// Every event of a client is told once, when it happens.
constexpr uint32_t kNextRequest = EPOLLIN | EPOLLRDHUP | EPOLLET;
constexpr uint32_t kReplyTaken = EPOLLOUT | EPOLLET;

constexpr int64_t kEvictableAfter = 1000;  // a client in the middle of a request is left alone for so long

int64_t now_milliseconds() {
  timespec now = {};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return int64_t{now.tv_sec} * 1000 + now.tv_nsec / 1000000;
}

// The owner of the daemon and root may talk to it.
bool is_welcome(int fd) {
  ucred peer = {};
  socklen_t size = sizeof peer;
  return getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &size) == 0 &&
         (peer.uid == 0 || peer.uid == geteuid());
}

// Null when memory is short.
std::unique_ptr<char[]> room_for(size_t size) {
  return std::unique_ptr<char[]>(new (std::nothrow) char[size]);
}

bool has_input(int fd) {
  char byte = 0;
  return recv(fd, &byte, 1, MSG_PEEK | MSG_DONTWAIT) > 0;
}

}  // namespace

Server::Server(int listener, int signals, size_t max_clients, Service& service)
    : listener_(listener), signals_(signals), max_clients_(max_clients), service_(service) {}

Server::~Server() {
  for (ConnectionList* list : {&idle_, &stuck_}) {
    while (list->first != nullptr) {
      Connection* connection = list->first;
      list->remove(*connection);
      delete connection;
    }
  }
  if (epoll_ >= 0) close(epoll_);
}

bool Server::watch(int fd, void* tag, uint32_t events, int action) const {
  epoll_event event = {};
  event.events = events;
  event.data.ptr = tag;
  return epoll_ctl(epoll_, action, fd, &event) == 0;
}

bool Server::run() {
  epoll_ = epoll_create1(EPOLL_CLOEXEC);
  if (epoll_ < 0 || !watch(listener_, &listener_, EPOLLIN, EPOLL_CTL_ADD) ||
      !watch(signals_, &signals_, EPOLLIN, EPOLL_CTL_ADD)) {
    return false;
  }
  running_ = true;
  while (running_) {
    epoll_event events[kEventsATurn];
    const int ready = epoll_wait(epoll_, events, kEventsATurn, wait_time());
    if (ready < 0 && errno != EINTR) return false;
    take_turn(events, ready);
    keep_time();
  }
  return true;
}

// New clients come last: making room for one drops another, which must not be among the events still to
// serve.
void Server::take_turn(const epoll_event* events, int count) {
  bool accepting = false;
  for (int i = 0; i < count; i++) {
    void* tag = events[i].data.ptr;
    if (tag == &listener_) {
      accepting = true;
    } else if (tag == &signals_) {
      running_ = false;
    } else {
      serve(*static_cast<Connection*>(tag), events[i].events);
    }
  }
  if (accepting) accept_clients();
}

// Milliseconds until something is due, -1 when nothing ever will be without an event.
int Server::wait_time() const {
  if (stuck_.first == nullptr && accept_again_ == 0) return -1;
  int64_t due = INT64_MAX;
  if (stuck_.first != nullptr) due = stuck_.first->since + kStuckMilliseconds;
  if (accept_again_ != 0) due = std::min(due, accept_again_);
  return static_cast<int>(std::max<int64_t>(0, due - now_milliseconds()));
}

// Does what is due by the clock.
void Server::keep_time() {
  if (stuck_.first == nullptr && accept_again_ == 0) return;
  const int64_t now = now_milliseconds();
  while (stuck_.first != nullptr && now - stuck_.first->since >= kStuckMilliseconds) drop(*stuck_.first);
  if (accept_again_ != 0 && now >= accept_again_ && watch(listener_, &listener_, EPOLLIN, EPOLL_CTL_MOD)) {
    accept_again_ = 0;
  }
}

// When all places are taken, one client gets in a turn: the first of them is known to be there, and the
// requests of those that came before it are looked at in between.
void Server::accept_clients() {
  for (int i = 0; i < kEventsATurn; i++) {
    if (clients_ >= max_clients_ && (i > 0 || !make_room())) return;
    const int fd = accept4(listener_, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
    if (fd >= 0) {
      welcome(fd);
    } else if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
      if (!make_room()) {
        pause_accepting();
        return;
      }
    } else if (errno != EINTR && errno != ECONNABORTED) {
      return;
    }
  }
}

void Server::welcome(int fd) {
  std::unique_ptr<Connection> connection(new (std::nothrow) Connection);
  if (connection == nullptr) {
    close(fd);
    return;
  }
  connection->fd = fd;
  if (!is_welcome(fd) || !watch(fd, connection.get(), kNextRequest, EPOLL_CTL_ADD)) return;
  clients_++;
  idle_.append(*connection.release());
}

// A listener that stays readable while no descriptor is free would turn the loop into a busy one.
void Server::pause_accepting() {
  if (watch(listener_, &listener_, 0, EPOLL_CTL_MOD)) accept_again_ = now_milliseconds() + kAcceptPause;
}

// Drops the client that is needed least. Returns false when there is none.
bool Server::make_room() {
  Connection* victim = stuck_.first;
  if (victim == nullptr || now_milliseconds() - victim->since < kEvictableAfter) {
    Connection* idle = idle_for_longest();
    victim = idle == nullptr ? victim : idle;
  }
  if (victim == nullptr) return false;
  drop(*victim);
  return true;
}

// A client whose request has come in the meantime is not idle.
Connection* Server::idle_for_longest() const {
  Connection* connection = idle_.first;
  while (connection != nullptr && has_input(connection->fd)) connection = connection->next;
  return connection;
}

void Server::serve(Connection& connection, uint32_t events) {
  if (connection.sending) {
    continue_reply(connection);
    return;
  }
  if (connection.series.running()) {
    connection.series.count_wake_up(events != EPOLLOUT);
    if (!connection.series.running() && !await_request(connection)) {
      drop(connection);
      return;
    }
  }
  connection.last = (events & EPOLLRDHUP) != 0;
  while (receive_part(connection)) {
  }
}

// Returns true when there may be more of the request to receive.
bool Server::receive_part(Connection& connection) {
  const bool started = connection.bytes != nullptr;
  char* buffer = started ? connection.bytes.get() : request_.data();
  const size_t room = started ? connection.size : request_.size();
  const int64_t n = receive(connection, buffer + connection.used, room - connection.used);
  if (n < 0) drop(connection);
  if (n <= 0) return false;
  const size_t have = connection.used + static_cast<size_t>(n);
  if (started) connection.used = have;
  return take_request(connection, {buffer, have});
}

// Looks at what has come of a request. More than one at a time is not in the protocol, so no client can make
// the daemon work on its requests while others wait. Returns true when more is needed.
bool Server::take_request(Connection& connection, std::string_view bytes) {
  const size_t size = request_size(bytes);
  if (size == bytes.size()) {
    answer(connection, bytes);
    return false;
  }
  if (size != kMoreNeeded && (size == kNoRequest || size < bytes.size())) {
    drop(connection);
    return false;
  }
  if (!keep_part(connection, bytes, size == kMoreNeeded ? sizeof(RequestHeader) : size)) {
    drop(connection);
    return false;
  }
  return true;
}

// Keeps the part of a request that has come, with room for `size` bytes in all. Returns false when memory is
// short.
bool Server::keep_part(Connection& connection, std::string_view bytes, size_t size) {
  if (connection.bytes == nullptr) mark_stuck(connection);
  if (connection.size < size) {
    std::unique_ptr<char[]> room = room_for(size);
    if (room == nullptr) return false;
    memcpy(room.get(), bytes.data(), bytes.size());
    connection.bytes = std::move(room);
    connection.used = bytes.size();
    connection.size = size;
  }
  return true;
}

void Server::answer(Connection& connection, std::string_view bytes) {
  Request request = {};
  if (!parse_request(bytes, request)) {
    drop(connection);
    return;
  }
  // A receive stops at a passed descriptor and where its buffer is full. What came after the request by then
  // is not told of again.
  const bool stopped =
      connection.document >= 0 || connection.bytes != nullptr || bytes.size() == request_.size();
  if (stopped && has_input(connection.fd)) {
    drop(connection);
    return;
  }
  request.document = connection.document;
  const Service::Reply answer = service_.handle(request);
  connection.close_document();

  ReplyHeader header = {};
  header.length = static_cast<uint32_t>(sizeof header - kLengthBytes + answer.body.size());
  header.status = static_cast<uint8_t>(answer.status);
  memcpy(reply_.data(), &header, sizeof header);
  answer.body.copy(reply_.data() + sizeof header, answer.body.size());
  send_reply(connection, {reply_.data(), sizeof header + answer.body.size()}, answer.descriptor);
}

// A descriptor goes with the first byte or not at all; only a client that reads no replies has no room for
// one.
void Server::send_reply(Connection& connection, std::string_view reply, int descriptor) {
  const int64_t n =
      descriptor < 0 ? send_some(connection, reply) : send_with_descriptor(connection, reply, descriptor);
  if (n < 0 || (n == 0 && descriptor >= 0)) {
    drop(connection);
    return;
  }
  if (static_cast<size_t>(n) == reply.size()) {
    settle(connection);
    return;
  }
  keep_reply(connection, reply.substr(static_cast<size_t>(n)));
}

void Server::keep_reply(Connection& connection, std::string_view rest) {
  connection.bytes = room_for(rest.size());
  if (connection.bytes == nullptr) {
    drop(connection);
    return;
  }
  memcpy(connection.bytes.get(), rest.data(), rest.size());
  connection.used = 0;
  connection.size = rest.size();
  connection.sending = true;
  mark_stuck(connection);
  if (!watch(connection.fd, &connection, kReplyTaken, EPOLL_CTL_MOD)) drop(connection);
}

void Server::continue_reply(Connection& connection) {
  const int64_t n =
      send_some(connection, {connection.bytes.get() + connection.used, connection.size - connection.used});
  if (n < 0) {
    drop(connection);
    return;
  }
  connection.used += static_cast<size_t>(n);
  if (connection.used == connection.size) settle(connection);
}

// The reply has gone: the client is idle, and the last one to be dropped for others, unless it has said that
// it sends no more.
void Server::settle(Connection& connection) {
  const bool was_running = connection.series.running();
  connection.series.count_reply();
  const bool watch_changes = connection.sending || connection.series.running() != was_running;
  if (connection.last || (watch_changes && !await_request(connection))) {
    drop(connection);
    return;
  }
  list_of(connection).remove(connection);
  connection.bytes.reset();
  connection.used = connection.size = 0;
  connection.sending = connection.stuck = false;
  idle_.append(connection);
}

// Has the daemon woken by the client's next request, and in a series already by the client taking the reply.
bool Server::await_request(Connection& connection) const {
  const uint32_t events = connection.series.running() ? kNextRequest | kReplyTaken : kNextRequest;
  return watch(connection.fd, &connection, events, EPOLL_CTL_MOD);
}

void Server::mark_stuck(Connection& connection) {
  list_of(connection).remove(connection);
  connection.stuck = true;
  connection.since = now_milliseconds();
  stuck_.append(connection);
}

void Server::drop(Connection& connection) {
  list_of(connection).remove(connection);
  clients_--;
  delete &connection;
}

ConnectionList& Server::list_of(const Connection& connection) {
  return connection.stuck ? stuck_ : idle_;
}

}  // namespace ktree
