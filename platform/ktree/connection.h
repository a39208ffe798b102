// One client of the daemon: its descriptor and what of a request has come or of a reply has not gone yet.
#ifndef PLATFORM_KTREE_CONNECTION_H
#define PLATFORM_KTREE_CONNECTION_H

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>

#include "ktree/series.h"

namespace ktree {

struct Connection {
  int fd = -1;
  int document = -1;  // the memory file that came with the request, or -1
  bool sending = false;
  bool last = false;   // the client has shut down its side: nothing comes after this request
  bool stuck = false;  // in the middle of a request or a reply

  // Receiving: `used` of the `size` bytes of a request that came in part. Sending: the bytes from `used` to
  // `size` of a reply are still to go. Empty between requests.
  std::unique_ptr<char[]> bytes;
  size_t used = 0;
  size_t size = 0;

  Series series;

  int64_t since = 0;  // since when it is stuck, in milliseconds of CLOCK_MONOTONIC
  Connection* previous = nullptr;
  Connection* next = nullptr;

  Connection() = default;
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;
  ~Connection();

  void close_document();
};

// Connections in the order in which they came in.
struct ConnectionList {
  Connection* first = nullptr;
  Connection* last = nullptr;

  void append(Connection& connection);
  void remove(Connection& connection);
};

// Receives what is there into `buffer` of `room` bytes; a passed descriptor goes to connection.document, any
// more are closed. Returns the bytes received, 0 when nothing is there yet, -1 when the client is gone.
[[nodiscard]] int64_t receive(Connection& connection, char* buffer, size_t room);

// Sends as much of `bytes` as goes at once. Returns the bytes sent, -1 when the client is gone.
[[nodiscard]] int64_t send_some(const Connection& connection, std::string_view bytes);

// The same, and passes `descriptor` with the first byte.
[[nodiscard]] int64_t send_with_descriptor(const Connection& connection, std::string_view bytes,
                                           int descriptor);

}  // namespace ktree

#endif
