#include "keeper/attempt.h"

#include <net/if.h>
#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <string_view>
#include <vector>

#include "common/mounts.h"
#include "common/program.h"
#include "common/sessions.h"
#include "common/tree_reader.h"
#include "keeper/tool_runs.h"
#include "keeper/wish.h"
#include "tree_layout.h"

namespace keeper {
namespace {

constexpr int kPatience = 3000, kLookPause = 200;  // milliseconds
constexpr std::string_view kConnect = "--connect";
constexpr const char* kPorts[] = {"egiga0", "egiga1", "bond0"};

bool accepts(const addrinfo& address) {
  const int fd = socket(address.ai_family, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) return false;
  bool connected = connect(fd, address.ai_addr, address.ai_addrlen) == 0;
  if (!connected && errno == EINPROGRESS) {
    pollfd waiting{fd, POLLOUT, 0};
    int error = 0;
    socklen_t size = sizeof error;
    connected = poll(&waiting, 1, kPatience) == 1 &&
                getsockopt(fd, SOL_SOCKET, SO_ERROR, &error, &size) == 0 && error == 0;
  }
  close(fd);
  return connected;
}

bool accepts_at_a_port(const addrinfo& address) {
  auto* name = reinterpret_cast<sockaddr_in6*>(address.ai_addr);
  if (address.ai_family != AF_INET6 || !IN6_IS_ADDR_LINKLOCAL(&name->sin6_addr)) return accepts(address);
  for (const char* port : kPorts) {
    name->sin6_scope_id = if_nametoindex(port);
    if (name->sin6_scope_id != 0 && accepts(address)) return true;
  }
  return false;
}

struct Stored {
  bool wanted = false;
  std::string address, port;
  std::vector<std::string> shares;
};

bool read_stored(const std::string& target, Stored& stored) {
  platform::TreeReader tree;
  for (int n = 1; n <= remvol::kMaxTargets; n++) {
    if (tree.value(remvol::key::kTargetName, n) != target) continue;
    stored.wanted = tree.number(0, remvol::key::kTargetConnSet, n) != 0;
    stored.address = tree.value(remvol::key::kTargetIp, n);
    stored.port = tree.value(remvol::key::kTargetPort, n);
    for (int m = 1; m <= remvol::kMaxLunsPerTarget; m++) {
      stored.shares.push_back(tree.value(remvol::key::kLunShare, n, m));
    }
    return true;
  }
  return false;
}

bool has_mounted(const Stored& stored) {
  const std::vector<platform::Mount> mounts = platform::read_mounts();
  return std::any_of(stored.shares.begin(), stored.shares.end(), [&mounts](const std::string& share) {
    return !share.empty() && platform::mount_on(mounts, remvol::kMountRoot + share) != nullptr;
  });
}

pid_t start_silently(std::vector<const char*> arguments) {
  arguments.insert(arguments.begin(), platform::kTool);
  arguments.push_back(nullptr);
  const platform::Streams silent = {STDIN_FILENO, platform::kNowhere, platform::kNowhere};
  return platform::start(platform::kTool, arguments.data(), silent);
}

int result_of(pid_t process) {
  const int status = process > 0 ? platform::exit_status(platform::end_of(process)) : -1;
  return status >= 0 ? status : 1;
}

// Looked up again behind all that takes its time.
bool is_still_missing(const std::string& target) {
  Stored stored;
  if (!read_stored(target, stored) || !stored.wanted || is_taken_down(target)) return false;
  const std::vector<platform::Session> sessions = platform::read_sessions();
  return std::none_of(sessions.begin(), sessions.end(),
                      [&target](const platform::Session& session) { return session.target == target; });
}

}  // namespace

bool end_with_keeper() {
  const pid_t keeper = getppid();
  (void)prctl(PR_SET_NAME, "remvol-keeper");
  return prctl(PR_SET_PDEATHSIG, SIGTERM) == 0 && getppid() == keeper && keeper != 1;
}

int bring_up(const char* option, const std::string& target) {
  const pid_t process = start_silently({option, "-n", target.c_str()});
  bool unwanted = false;
  do unwanted = unwanted || is_unwanted(target);
  while (process > 0 && !platform::ends_within(process, kLookPause));
  const int result = result_of(process);
  if (result != 0 && !unwanted) want_again(target);
  if (result != 0 || !unwanted || kConnect != option || is_busy(target)) return result;
  // It has not waited for the connection, but was done before, or gave up waiting: it was the later wish.
  Stored stored;
  if (read_stored(target, stored) && stored.wanted)
    (void)result_of(start_silently({"--disconnect", "-n", target.c_str()}));
  return 1;
}

bool portal_answers(const std::string& address, const std::string& port) {
  std::string bare = address;
  if (bare.size() > 2 && bare.front() == '[') bare = bare.substr(1, bare.size() - 2);
  addrinfo hints{};
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* found = nullptr;
  if (getaddrinfo(bare.c_str(), port.c_str(), &hints, &found) != 0) return false;
  bool answers = false;
  for (const addrinfo* one = found; one != nullptr && !answers; one = one->ai_next) {
    answers = accepts_at_a_port(*one);
  }
  freeaddrinfo(found);
  return answers;
}

int try_target(const std::string& target, bool refresh) {
  Stored stored;
  if (!end_with_keeper() || !read_stored(target, stored)) return 1;
  const bool mounted = has_mounted(stored);
  // Says "Reconnecting", which is also what a recovery wants to find.
  if (mounted) (void)result_of(start_silently({"--oiscsi_evt_reopen", "-n", target.c_str()}));
  if (refresh) (void)result_of(start_silently({"--status"}));
  if (!portal_answers(stored.address, stored.port) || !is_still_missing(target)) return 1;
  return bring_up(mounted ? "--oiscsi_evt_recover" : kConnect.data(), target);
}

}  // namespace keeper
