// The daemon's loop: many clients, one thread, nothing that waits for one of them.
#ifndef PLATFORM_KTREE_SERVER_H
#define PLATFORM_KTREE_SERVER_H

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "ktree/connection.h"
#include "ktree/protocol.h"
#include "ktree/service.h"

struct epoll_event;

namespace ktree {

// A client that leaves a request unfinished, or a reply unread, for this long is dropped. Between requests a
// client may stay for ever.
constexpr int64_t kStuckMilliseconds = 30000;

class Server {
 public:
  // Serves `listener` (a listening, non-blocking socket) until `signals` (a signalfd) has something to read.
  // All of them, and what answers the requests, stay the caller's. At most `max_clients` are kept; when one
  // more comes, or descriptors run out, the one that has been stuck or idle the longest goes.
  Server(int listener, int signals, size_t max_clients, Service& service);
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;
  ~Server();

  // Returns true when a signal ended it, false when the system refused the means to run (errno says why).
  [[nodiscard]] bool run();

 private:
  [[nodiscard]] bool watch(int fd, void* tag, uint32_t events, int action) const;
  void take_turn(const epoll_event* events, int count);
  [[nodiscard]] int wait_time() const;
  void keep_time();

  void accept_clients();
  void welcome(int fd);
  void pause_accepting();
  [[nodiscard]] bool make_room();
  [[nodiscard]] Connection* idle_for_longest() const;

  void serve(Connection& connection, uint32_t events);
  [[nodiscard]] bool receive_part(Connection& connection);
  [[nodiscard]] bool take_request(Connection& connection, std::string_view bytes);
  [[nodiscard]] bool keep_part(Connection& connection, std::string_view bytes, size_t size);
  void answer(Connection& connection, std::string_view bytes);
  void send_reply(Connection& connection, std::string_view reply, int descriptor);
  void keep_reply(Connection& connection, std::string_view rest);
  void continue_reply(Connection& connection);
  void settle(Connection& connection);
  [[nodiscard]] bool await_request(Connection& connection) const;
  void mark_stuck(Connection& connection);
  void drop(Connection& connection);
  [[nodiscard]] ConnectionList& list_of(const Connection& connection);

  static constexpr int kEventsATurn = 64;

  int listener_;
  int signals_;
  size_t max_clients_;
  int epoll_ = -1;
  bool running_ = false;
  int64_t accept_again_ = 0;  // when to accept again after descriptors ran out; 0: accepting
  size_t clients_ = 0;
  ConnectionList idle_;   // between requests, the one that has been so the longest first
  ConnectionList stuck_;  // in the middle of a request or a reply, likewise
  Service& service_;
  std::array<char, kMaxRequestBytes> request_;
  std::array<char, kMaxReplyBytes> reply_;
};

}  // namespace ktree

#endif
