// Requests to a daemon over the one connection that a process keeps to each socket.
//
// This code is part of a library that any program may load, C programs too: it needs nothing of the C++
// runtime and throws nothing.
#ifndef PLATFORM_KTREE_CLIENT_CHANNEL_H
#define PLATFORM_KTREE_CLIENT_CHANNEL_H

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "ktree/protocol.h"

namespace ktree::client {

// A request with its reply takes at most this long, connecting included.
constexpr int64_t kRequestMilliseconds = 5000;

enum class CallResult {
  kDone,
  kMissing,
  kRefused,
  kDamaged,
  kFailed,       // the daemon, or a file here, could not do it
  kUnreachable,  // no daemon answers
};

struct Call {
  Operation operation;
  std::string_view path;
  std::string_view value;
  int document;   // the memory file to pass, or -1
  char* body;     // where the body of the reply goes
  size_t room;    // the most bytes of it
  size_t size;    // set to the bytes that came
  int came = -1;  // set to the descriptor that came, the caller's then
};

// Sends the request to the daemon on `socket` (null: remvol::kGeneralSocket) and waits for the reply, on the
// connection of earlier calls when there is one. A connection that turns out to be dead, because the daemon
// was restarted or made room for others, is opened again and the request sent again when it cannot have been
// carried out, or when carrying it out twice does no harm. Calls from several threads to one socket follow
// each other.
[[nodiscard]] CallResult request(const char* socket, Call& call);

}  // namespace ktree::client

#endif
