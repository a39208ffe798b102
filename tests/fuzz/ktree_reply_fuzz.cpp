// The replies of a hostile daemon: whatever the socket gives, a call ends at once, fills no more than its
// buffer and says what came.
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <string>

#include "ktree/client/channel.h"
#include "require.h"

using namespace ktree;
using namespace ktree::client;

namespace {

const uint8_t* reply = nullptr;
size_t reply_size = 0;
int peer = -1;

}  // namespace

extern "C" {

// A connection whose other end has said this run's bytes already and says no more.
int __wrap_socket(int, int, int) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return -1;
  if (peer >= 0) close(peer);
  peer = ends[1];
  if (write(peer, reply, reply_size) != static_cast<ssize_t>(reply_size)) abort();
  shutdown(peer, SHUT_WR);
  return ends[0];
}

int __wrap_connect(int, const sockaddr*, socklen_t) {
  return 0;
}

}  // extern "C"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 2 || size > 32768) return 0;
  const size_t room = data[0];
  // A get may be sent again, a delete may not.
  const Operation operation = (data[1] & 1) != 0 ? Operation::kGet : Operation::kDel;
  reply = data + 2;
  reply_size = size - 2;
  std::string body(room + 8, 'x');
  for (int i = 0; i < 2; i++) {  // the second finds what the first left of the connection
    Call call = {operation, "/a", "", -1, body.data(), room, 0};
    const CallResult result = request("/hostile", call);
    require(call.size <= room);
    require(body.compare(room, 8, "xxxxxxxx") == 0);
    if (result == CallResult::kUnreachable) continue;
    require(reply_size >= sizeof(ReplyHeader));
    ReplyHeader header;
    memcpy(&header, reply, sizeof header);
    if (i == 0) {
      require(kLengthBytes + size_t{header.length} == sizeof header + call.size);
      require(memcmp(body.data(), reply + sizeof header, call.size) == 0);
    }
  }
  // The connection is left to the next run: end it by a reply that no call takes.
  const uint8_t* const bad = reinterpret_cast<const uint8_t*>("\xff\xff\xff\xff\0\0\0\0");
  reply = bad;
  reply_size = 8;
  Call call = {Operation::kDel, "/a", "", -1, nullptr, 0, 0};
  while (request("/hostile", call) != CallResult::kUnreachable) {
  }
  return 0;
}
