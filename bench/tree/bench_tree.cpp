// Measures round trips to the configuration tree beside two peers, in one run: a bare echo between two
// processes, which is the floor that the machine sets, and redis-server.
//
// Usage: bench_tree KTREE_SOCKET REDIS_SOCKET OWN_CPUS ECHO_CPUS [ROUNDS]
//
// It runs on the processors OWN_CPUS, "1" or "0-1", the echoes on ECHO_CPUS, where its caller has put the two
// servers as well.
// Both servers get the same full tree first. Then every round makes the same few calls of every kind, one
// kind after the other. A round is shorter than the time slices of the scheduler, so whatever else the
// machine does disturbs a few rounds wholly instead of all of them a little. Prints the names of the kinds in
// a line, and then one line for each round, the microseconds of one call of each.

#include <sched.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

#include "full_tree.h"
#include "ktree/protocol.h"
#include "ktreec.h"

namespace {

constexpr char kPath[] = "/iscsi/initiator/id:3/status";
constexpr char kValue[] = "Connected, the volume is mounted and in use";
constexpr char kNextValue[] = "Connected, the volume is mounted but unused";
constexpr char kMissingPath[] = "/iscsi/initiator/id:3/missing";
constexpr int kRounds = 1001;
constexpr int kCalls = 32;

[[noreturn]] void fail(const char* what) {
  perror(what);
  exit(2);
}

void write_all(int fd, const char* data, size_t size) {
  if (write(fd, data, size) != static_cast<ssize_t>(size)) fail("write");
}

void read_all(int fd, char* data, size_t size) {
  for (size_t have = 0; have < size;) {
    const ssize_t n = read(fd, data + have, size - have);
    if (n <= 0) fail("read");
    have += static_cast<size_t>(n);
  }
}

void pin_to(const char* cpus) {
  char* end = nullptr;
  unsigned long cpu = strtoul(cpus, &end, 10);
  const unsigned long last = *end == '-' ? strtoul(end + 1, nullptr, 10) : cpu;
  cpu_set_t set;
  CPU_ZERO(&set);
  for (; cpu <= last; cpu++) CPU_SET(cpu, &set);
  if (sched_setaffinity(0, sizeof set, &set) != 0) fail("sched_setaffinity");
}

int connect_to(const char* path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  snprintf(address.sun_path, sizeof address.sun_path, "%s", path);
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0 || connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) fail(path);
  return fd;
}

// A process that answers every `request` bytes with `reply` bytes, blocking in both, and its caller's side.
class Echo {
 public:
  Echo(size_t request, size_t reply, const char* cpus) : request_(request), reply_(reply) {
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) != 0) fail("socketpair");
    fflush(stdout);
    child_ = fork();
    if (child_ == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      close(fds[0]);
      pin_to(cpus);
      answer(fds[1]);
    }
    close(fds[1]);
    fd_ = fds[0];
  }
  Echo(const Echo&) = delete;
  Echo& operator=(const Echo&) = delete;
  ~Echo() {
    close(fd_);
    waitpid(child_, nullptr, 0);
  }

  void call() {
    write_all(fd_, request_.data(), request_.size());
    read_all(fd_, reply_.data(), reply_.size());
  }

 private:
  [[noreturn]] void answer(int fd) {
    for (;;) {
      if (read(fd, request_.data(), request_.size()) <= 0) _exit(0);
      write_all(fd, reply_.data(), reply_.size());
    }
  }

  std::vector<char> request_;
  std::vector<char> reply_;
  int fd_ = -1;
  pid_t child_ = -1;
};

// A client of redis-server that does no more than it must: it puts the request together, as any client does
// for every call, writes once and reads once.
class Redis {
 public:
  explicit Redis(const char* socket) : fd_(connect_to(socket)) {}
  Redis(const Redis&) = delete;
  Redis& operator=(const Redis&) = delete;
  ~Redis() { close(fd_); }

  void set(const char* key, const char* value) {
    const int size =
        snprintf(buffer_.data(), buffer_.size(), "*3\r\n$3\r\nSET\r\n$%zu\r\n%s\r\n$%zu\r\n%s\r\n",
                 strlen(key), key, strlen(value), value);
    call(size, "+OK\r\n");
  }

  // `value` is what is expected.
  void get(const char* key, const char* value) {
    std::array<char, 256> reply;
    snprintf(reply.data(), reply.size(), "$%zu\r\n%s\r\n", strlen(value), value);
    ask(key, reply.data());
  }

  void get_in_vain(const char* key) { ask(key, "$-1\r\n"); }

 private:
  void ask(const char* key, const char* reply) {
    const int size =
        snprintf(buffer_.data(), buffer_.size(), "*2\r\n$3\r\nGET\r\n$%zu\r\n%s\r\n", strlen(key), key);
    call(size, reply);
  }

  void call(int size, const char* reply) {
    write_all(fd_, buffer_.data(), static_cast<size_t>(size));
    read_all(fd_, buffer_.data(), strlen(reply));
    if (memcmp(buffer_.data(), reply, strlen(reply)) != 0) {
      fprintf(stderr, "redis-server answered something else\n");
      exit(2);
    }
  }

  int fd_;
  std::array<char, 1024> buffer_;
};

struct Kind {
  const char* name;
  std::function<void()> call;
  std::vector<double> rounds;  // microseconds a call

  void measure(int calls) {
    const auto start = std::chrono::steady_clock::now();
    for (int i = 0; i < calls; i++) call();
    const std::chrono::duration<double, std::micro> time = std::chrono::steady_clock::now() - start;
    rounds.push_back(time.count() / calls);
  }
};

void fill(const char* ktree, Redis& redis) {
  for_each_entry_of_full_tree([&](const std::string& path, const std::string& value) {
    if (ktreec_set(ktree, 0, path.c_str(), value.c_str()) != 0) fail(path.c_str());
    redis.set(path.c_str(), value.c_str());
  });
}

// Always another value: to set the same again needs no daemon.
void set_tree(const char* socket) {
  static bool next = false;
  next = !next;
  if (ktreec_set(socket, 0, kPath, next ? kNextValue : kValue) != 0) fail("ktreec_set");
}

// The daemon is asked for what is not there.
void get_in_vain(const char* socket) {
  char buffer[256];
  if (ktreec_get_wb(socket, 0, kMissingPath, buffer, sizeof buffer) >= 0) fail("ktreec_get_wb in vain");
}

void get_tree(const char* socket) {
  char buffer[256];
  if (ktreec_get_wb(socket, 0, kPath, buffer, sizeof buffer) != static_cast<int>(strlen(kValue))) {
    fail("ktreec_get_wb");
  }
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 5) {
    fprintf(stderr, "Usage: bench_tree KTREE_SOCKET REDIS_SOCKET OWN_CPUS ECHO_CPUS [ROUNDS]\n");
    return 2;
  }
  const char* ktree = argv[1];
  const char* echo_cpus = argv[4];
  const int rounds = argc > 5 ? atoi(argv[5]) : kRounds;
  pin_to(argv[3]);

  Redis redis(argv[2]);
  fill(ktree, redis);
  Echo set_echo(sizeof(ktree::RequestHeader) + strlen(kPath) + strlen(kValue), sizeof(ktree::ReplyHeader),
                echo_cpus);
  Echo get_echo(sizeof(ktree::RequestHeader) + strlen(kPath) + sizeof(uint32_t),
                sizeof(ktree::ReplyHeader) + strlen(kValue), echo_cpus);

  Echo vain_echo(sizeof(ktree::RequestHeader) + strlen(kMissingPath) + sizeof(uint32_t),
                 sizeof(ktree::ReplyHeader), echo_cpus);

  std::array<Kind, 9> kinds = {{
      {"echo of a set", [&] { set_echo.call(); }, {}},
      {"ktreec_set", [&] { set_tree(ktree); }, {}},
      {"redis SET", [&] { redis.set(kPath, kValue); }, {}},
      {"echo of a get", [&] { get_echo.call(); }, {}},
      {"ktreec_get_wb", [&] { get_tree(ktree); }, {}},
      {"redis GET", [&] { redis.get(kPath, kValue); }, {}},
      {"echo of a get in vain", [&] { vain_echo.call(); }, {}},
      {"ktreec_get_wb in vain", [&] { get_in_vain(ktree); }, {}},
      {"redis GET in vain", [&] { redis.get_in_vain(kMissingPath); }, {}},
  }};
  for (int i = 0; i < rounds; i++) {
    for (Kind& kind : kinds) kind.measure(kCalls);
  }
  for (const Kind& kind : kinds) printf("%s\t", kind.name);
  for (size_t i = 0; i < kinds[0].rounds.size(); i++) {
    puts("");
    for (const Kind& kind : kinds) printf("%.3f\t", kind.rounds[i]);
  }
  puts("");
  return 0;
}
