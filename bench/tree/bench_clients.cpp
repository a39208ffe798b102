// Many clients of one server at once: bench_clients CLIENTS MILLISECONDS ktree|redis SOCKET PATH VALUE. Each
// client asks for the value, and again as soon as it has the reply; all of them are one process, so that as
// little as can be is not the server. Prints how many replies a second came.
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "ktree/protocol.h"

namespace {

[[noreturn]] void fail(const char* what) {
  perror(what);
  exit(2);
}

int connect_to(const char* path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  snprintf(address.sun_path, sizeof address.sun_path, "%s", path);
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0 || connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) fail(path);
  return fd;
}

std::string bytes_of(const void* from, size_t size) {
  return {static_cast<const char*>(from), size};
}

// What is sent again and again, and what has to come back.
struct Dialogue {
  std::string request;
  std::string reply;
};

Dialogue ktree_dialogue(const std::string& path, const std::string& value) {
  const uint32_t room = ktree::kMaxValueBytes;
  const ktree::RequestHeader request = {
      static_cast<uint32_t>(sizeof request - ktree::kLengthBytes + path.size() + sizeof room),
      static_cast<uint8_t>(ktree::Operation::kGet), 0, static_cast<uint16_t>(path.size())};
  const ktree::ReplyHeader reply = {
      static_cast<uint32_t>(sizeof reply - ktree::kLengthBytes + value.size()), 0, {}};
  return {bytes_of(&request, sizeof request) + path + bytes_of(&room, sizeof room),
          bytes_of(&reply, sizeof reply) + value};
}

std::string redis_text(const std::string& text) {
  return "$" + std::to_string(text.size()) + "\r\n" + text + "\r\n";
}

Dialogue redis_dialogue(const std::string& path, const std::string& value) {
  return {"*2\r\n" + redis_text("GET") + redis_text(path), redis_text(value)};
}

class Client {
 public:
  Client(const char* socket, const Dialogue& dialogue)
      : fd_(connect_to(socket)), dialogue_(dialogue), got_(dialogue.reply.size(), '\0') {}

  [[nodiscard]] int fd() const { return fd_; }

  void ask() {
    have_ = 0;
    const std::string& text = dialogue_.request;
    if (write(fd_, text.data(), text.size()) != static_cast<ssize_t>(text.size())) fail("write");
  }

  // Takes what has come. Returns whether the reply is whole.
  bool take() {
    const ssize_t count = read(fd_, got_.data() + have_, got_.size() - have_);
    if (count <= 0) fail("read");
    have_ += static_cast<size_t>(count);
    if (have_ < got_.size()) return false;
    if (got_ == dialogue_.reply) return true;
    fputs("bench_clients: another reply than was asked for\n", stderr);
    exit(2);
  }

 private:
  int fd_;
  const Dialogue& dialogue_;
  std::string got_;
  size_t have_ = 0;
};

double replies_a_second(std::vector<Client>& clients, std::chrono::milliseconds time) {
  const int poll = epoll_create1(EPOLL_CLOEXEC);
  for (size_t i = 0; i < clients.size(); i++) {
    epoll_event event = {EPOLLIN, {}};
    event.data.u32 = static_cast<uint32_t>(i);
    if (epoll_ctl(poll, EPOLL_CTL_ADD, clients[i].fd(), &event) != 0) fail("epoll_ctl");
    clients[i].ask();
  }
  const auto start = std::chrono::steady_clock::now();
  long replies = 0;
  while (std::chrono::steady_clock::now() - start < time) {
    epoll_event events[64];
    const int count = epoll_wait(poll, events, 64, -1);
    for (int i = 0; i < count; i++) {
      Client& client = clients[events[i].data.u32];
      if (!client.take()) continue;
      client.ask();
      replies++;
    }
  }
  const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
  close(poll);
  return static_cast<double>(replies) / taken.count();
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 7) {
    fputs("usage: bench_clients CLIENTS MILLISECONDS ktree|redis SOCKET PATH VALUE\n", stderr);
    return 2;
  }
  const Dialogue dialogue =
      strcmp(argv[3], "redis") == 0 ? redis_dialogue(argv[5], argv[6]) : ktree_dialogue(argv[5], argv[6]);
  std::vector<Client> clients;
  for (int i = atoi(argv[1]); i > 0; i--) clients.emplace_back(argv[4], dialogue);
  printf("%.0f\n", replies_a_second(clients, std::chrono::milliseconds(atoi(argv[2]))));
  return 0;
}
