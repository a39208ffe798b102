#include "ktree/client/channel.h"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <utility>

#include "ktree/client/mirror_map.h"
#include "ktree/descriptors.h"

#include "tree_layout.h"

namespace ktree::client {
namespace {

constexpr int kTries = 3;

struct Channel {
  Channel* next;
  pthread_mutex_t lock;
  int fd;                      // -1: not connected
  pid_t owner;                 // the process that connected
  const mirror::Word* mirror;  // of the daemon at the other end, or null
  bool has_read;               // both of this connection
  bool without_mirror;         // nor is there one to be had
  sockaddr_un address;
};

pthread_mutex_t channels_lock = PTHREAD_MUTEX_INITIALIZER;
Channel* channels = nullptr;

// The end of a request in milliseconds of CLOCK_MONOTONIC.
struct Deadline {
  int64_t end;
  bool tight;  // some of the time has gone by

  static int64_t now() {
    timespec time = {};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return int64_t{time.tv_sec} * 1000 + time.tv_nsec / 1000000;
  }
  [[nodiscard]] int64_t left() const {
    const int64_t milliseconds = end - now();
    return milliseconds > 0 ? milliseconds : 0;
  }
};

// What became of one try.
enum class TryOutcome {
  kAnswered,
  kNotSent,   // the daemon cannot have read the whole request
  kLost,      // the connection ended, the daemon may have carried the request out
  kTimedOut,  // or the daemon speaks another language
};

// What a thread lets go of here is nobody's in a child that another thread forks meanwhile: the number or the
// place may be a stranger's by then.
void disconnect(Channel& channel) {
  if (channel.fd >= 0) close(std::exchange(channel.fd, -1));
  unmap_mirror(std::exchange(channel.mirror, nullptr));
  channel.has_read = channel.without_mirror = false;
}

// In a forked child: it must not speak on its parent's connections, and a lock that a thread of the parent
// held at the fork would never be released there.
void start_anew_in_child() {
  pthread_mutex_init(&channels_lock, nullptr);
  for (Channel* channel = channels; channel != nullptr; channel = channel->next) {
    pthread_mutex_init(&channel->lock, nullptr);
    disconnect(*channel);
  }
}

Channel* make_channel(const char* socket) {
  auto* channel = static_cast<Channel*>(calloc(1, sizeof(Channel)));
  if (channel == nullptr) return nullptr;
  if (channels == nullptr) pthread_atfork(nullptr, nullptr, start_anew_in_child);
  pthread_mutex_init(&channel->lock, nullptr);
  channel->fd = -1;
  channel->address.sun_family = AF_UNIX;
  strcpy(channel->address.sun_path, socket);
  channel->next = channels;
  channels = channel;
  return channel;
}

// The channel of `socket`, made at its first use; null when the path is no socket's. Never removed.
Channel* find_channel(const char* socket) {
  const size_t length = strlen(socket);
  if (length == 0 || length >= sizeof(sockaddr_un::sun_path)) return nullptr;
  pthread_mutex_lock(&channels_lock);
  Channel* channel = channels;
  while (channel != nullptr && strcmp(channel->address.sun_path, socket) != 0) channel = channel->next;
  if (channel == nullptr) channel = make_channel(socket);
  pthread_mutex_unlock(&channels_lock);
  return channel;
}

// Waits until `fd` is ready for `events`. Returns false when the time is over.
bool wait_for(int fd, short events, Deadline& deadline) {
  deadline.tight = true;
  for (;;) {
    pollfd entry = {fd, events, 0};
    const int ready = poll(&entry, 1, static_cast<int>(deadline.left()));
    if (ready > 0) return true;
    if (ready == 0 || errno != EINTR) return false;
  }
}

// Opens a socket above the standard descriptors: a program that runs without them would print into it.
int open_socket() {
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0 || fd > STDERR_FILENO) return fd;
  const int above = fcntl(fd, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
  close(fd);
  return above;
}

// Connects `fd`, which waits while the daemon's backlog is full. A signal may interrupt that.
bool connect_to(int fd, const sockaddr_un& address, const Deadline& deadline) {
  while (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    if (errno != EINTR || deadline.left() == 0) return false;
  }
  return true;
}

// The socket's own time limits bound the connect and the usual receive.
bool connect_channel(Channel& channel, Deadline& deadline) {
  const int64_t left = deadline.left();
  const timeval limit = {left / 1000, (left % 1000) * 1000 + 1};
  const int fd = open_socket();
  if (fd < 0) return false;
  if (setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit) != 0 ||
      setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit) != 0 ||
      !connect_to(fd, channel.address, deadline)) {
    close(fd);
    return false;
  }
  deadline.tight = true;
  channel.owner = getpid();
  channel.fd = fd;
  return true;
}

// The parts of a message that are still to be moved.
struct MessageParts {
  iovec part[3];
  size_t count;
  size_t left;

  void advance(size_t done) {
    left -= done;
    for (size_t i = 0; i < count && done > 0; i++) {
      const size_t step = done < part[i].iov_len ? done : part[i].iov_len;
      part[i].iov_base = static_cast<char*>(part[i].iov_base) + step;
      part[i].iov_len -= step;
      done -= step;
    }
  }
};

iovec readable(const void* data, size_t size) {
  return {const_cast<void*>(data), size};
}

TryOutcome send_request(int fd, const Call& call, Deadline& deadline) {
  RequestHeader header = {};
  header.length = static_cast<uint32_t>(sizeof header - kLengthBytes + call.path.size() + call.value.size());
  header.operation = static_cast<uint8_t>(call.operation);
  header.path_length = static_cast<uint16_t>(call.path.size());
  MessageParts parts = {{readable(&header, sizeof header), readable(call.path.data(), call.path.size()),
                         readable(call.value.data(), call.value.size())},
                        3,
                        sizeof header + call.path.size() + call.value.size()};
  DescriptorRoom room = {};
  msghdr message = {};
  message.msg_iov = parts.part;
  message.msg_iovlen = parts.count;
  if (call.document >= 0) pass_descriptor(message, room, call.document);
  while (parts.left > 0) {
    const ssize_t n = sendmsg(fd, &message, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (n > 0) {
      parts.advance(static_cast<size_t>(n));
      message.msg_control = nullptr;
      message.msg_controllen = 0;
    } else if (errno != EINTR && errno != EAGAIN) {
      return TryOutcome::kNotSent;
    } else if (!wait_for(fd, POLLOUT, deadline)) {
      return TryOutcome::kTimedOut;
    }
  }
  return TryOutcome::kAnswered;
}

// The end of the connection as a receive sees it. The kernel says ECONNRESET when the other side closed with
// something of ours unread (unix(7) sockets do, unix_release_sock() in the kernel): the request was then not
// carried out.
TryOutcome lost_connection(ssize_t received) {
  return received < 0 && errno == ECONNRESET ? TryOutcome::kNotSent : TryOutcome::kLost;
}

TryOutcome receive_reply(int fd, Call& call, ReplyHeader& header, Deadline& deadline) {
  MessageParts parts = {{{&header, sizeof header}, {call.body, call.room}, {}}, 2, sizeof header + call.room};
  DescriptorRoom room;
  msghdr message = {};
  message.msg_iov = parts.part;
  message.msg_iovlen = parts.count;
  size_t have = 0;
  size_t wanted = sizeof header;
  while (have < wanted) {
    if (deadline.tight && !wait_for(fd, POLLIN, deadline)) return TryOutcome::kTimedOut;
    if (call.operation == Operation::kMirror) {
      message.msg_control = room.bytes;
      message.msg_controllen = sizeof room.bytes;
    }
    const ssize_t n = recvmsg(fd, &message, MSG_CMSG_CLOEXEC | (deadline.tight ? MSG_DONTWAIT : 0));
    deadline.tight = true;
    if (n > 0) {
      take_descriptor(message, call.came);
      parts.advance(static_cast<size_t>(n));
      have += static_cast<size_t>(n);
      if (have >= sizeof header) wanted = kLengthBytes + size_t{header.length};
      if (wanted < sizeof header || wanted > sizeof header + call.room || have > wanted) {
        return TryOutcome::kTimedOut;
      }
    } else if (n == 0 || (errno != EINTR && errno != EAGAIN)) {
      return lost_connection(n);
    }
  }
  call.size = wanted - sizeof header;
  return TryOutcome::kAnswered;
}

TryOutcome try_once(Channel& channel, Call& call, ReplyHeader& header, Deadline& deadline) {
  const TryOutcome sent = send_request(channel.fd, call, deadline);
  return sent == TryOutcome::kAnswered ? receive_reply(channel.fd, call, header, deadline) : sent;
}

// A delete that was carried out must not be sent again: it would take the next sibling.
bool may_try_again(TryOutcome outcome, Operation operation) {
  return outcome == TryOutcome::kNotSent || (outcome == TryOutcome::kLost && operation != Operation::kDel);
}

CallResult result_of(uint8_t status) {
  switch (static_cast<ReplyStatus>(status)) {
    case ReplyStatus::kDone:
      return CallResult::kDone;
    case ReplyStatus::kMissing:
      return CallResult::kMissing;
    case ReplyStatus::kRefused:
      return CallResult::kRefused;
    case ReplyStatus::kDamaged:
      return CallResult::kDamaged;
    case ReplyStatus::kFailed:
      break;
  }
  return CallResult::kFailed;
}

// A child may have been made without fork(3), so that nothing was started anew there.
CallResult request_on(Channel& channel, Call& call, Deadline& deadline) {
  if (channel.fd >= 0 && channel.owner != getpid()) disconnect(channel);
  for (int i = 0; i < kTries; i++) {
    if (channel.fd < 0 && !connect_channel(channel, deadline)) return CallResult::kUnreachable;
    ReplyHeader header = {};
    const TryOutcome outcome = try_once(channel, call, header, deadline);
    if (outcome == TryOutcome::kAnswered) return result_of(header.status);
    disconnect(channel);
    if (!may_try_again(outcome, call.operation)) break;
  }
  return CallResult::kUnreachable;
}

// Asks for the mirror at the second read of a connection: the next ones need no request then. Returns true
// when it has come.
bool open_mirror(Channel& channel, Deadline& deadline) {
  const bool is_first = !std::exchange(channel.has_read, true);
  if (channel.mirror != nullptr || channel.fd < 0 || channel.without_mirror || is_first) return false;
  Call call = {Operation::kMirror, {}, {}, -1, nullptr, 0, 0};
  if (request_on(channel, call, deadline) == CallResult::kDone) channel.mirror = map_mirror(call.came);
  channel.without_mirror = channel.mirror == nullptr && deadline.left() > 0;
  if (call.came >= 0) close(call.came);
  return channel.mirror != nullptr;
}

// The other end is closed when the daemon is gone. What was read before that was so.
bool is_alive(const Channel& channel) {
  char byte = 0;
  return recv(channel.fd, &byte, 1, MSG_PEEK | MSG_DONTWAIT) < 0 && errno == EAGAIN;
}

// A value that is in the mirror is read there. Returns false when the daemon is to be asked.
bool get_from_mirror(const Channel& channel, Call& call) {
  if (channel.mirror == nullptr) return false;
  const int size = mirror::read(channel.mirror, call.path, call.body, call.room);
  if (size < 0 || !is_alive(channel)) return false;
  call.size = static_cast<size_t>(size);
  return true;
}

// To set the value that is there already changes nothing that anybody could see.
bool is_in_mirror(const Channel& channel, const Call& call) {
  char value[mirror::kLongestValue];
  if (channel.mirror == nullptr || call.value.size() > sizeof value) return false;
  const int size = mirror::read(channel.mirror, call.path, value, sizeof value);
  return size >= 0 && call.value == std::string_view(value, static_cast<size_t>(size)) && is_alive(channel);
}

bool done_by_mirror(const Channel& channel, Call& call) {
  return (call.operation == Operation::kGet && get_from_mirror(channel, call)) ||
         (call.operation == Operation::kSet && is_in_mirror(channel, call));
}

CallResult carry_out(Channel& channel, Call& call) {
  if (done_by_mirror(channel, call)) return CallResult::kDone;
  Deadline deadline = {Deadline::now() + kRequestMilliseconds, false};
  const bool came = call.operation == Operation::kGet && open_mirror(channel, deadline);
  return came && get_from_mirror(channel, call) ? CallResult::kDone : request_on(channel, call, deadline);
}

}  // namespace

CallResult request(const char* socket, Call& call) {
  call.size = 0;
  Channel* channel = find_channel(socket == nullptr ? remvol::kGeneralSocket : socket);
  if (channel == nullptr) return CallResult::kUnreachable;
  if (call.path.size() > kMaxPathBytes || call.value.size() > kMaxValueBytes) return CallResult::kRefused;
  pthread_mutex_lock(&channel->lock);
  const CallResult result = carry_out(*channel, call);
  pthread_mutex_unlock(&channel->lock);
  return result;
}

}  // namespace ktree::client
