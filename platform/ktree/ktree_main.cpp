// ktree: the daemon of the configuration tree.

#include <getopt.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "begin.h"
#include "common/report.h"
#include "ktree/endpoint.h"
#include "ktree/server.h"
#include "ktree/start_settings.h"

namespace {

constexpr int kUsageError = 2;
constexpr size_t kMaxClients = 4096;
constexpr size_t kOwnDescriptors = 16;

constexpr char kUsage[] =
    "Usage: ktree -n NAME -s SOCKET [-l FILE]...\n"
    "Holds a configuration tree and serves it on the unix socket SOCKET.\n"
    "\n"
    "  -n NAME        name of the tree; the process number goes into SOCKET_NAME.pid\n"
    "  -s SOCKET      path of the socket\n"
    "  -l FILE        load the settings file first; of several, the first that can be\n"
    "                 loaded\n"
    "  -h, --help     print this text and exit\n"
    "  -V, --version  print the version and exit\n";

struct DaemonOptions {
  std::string name;
  std::string socket;
  std::vector<std::string> settings;
};

// Returns -1 when the daemon is to run, otherwise the exit status.
int parse_options(int argc, char** argv, DaemonOptions& options) {
  const option long_options[] = {
      {"help", no_argument, nullptr, 'h'}, {"version", no_argument, nullptr, 'V'}, {nullptr, 0, nullptr, 0}};
  int letter = 0;
  while ((letter = getopt_long(argc, argv, "n:s:l:hV", long_options, nullptr)) != -1) {
    switch (letter) {
      case 'n':
        options.name = optarg;
        break;
      case 's':
        options.socket = optarg;
        break;
      case 'l':
        options.settings.emplace_back(optarg);
        break;
      case 'h':
        fputs(kUsage, stdout);
        return 0;
      case 'V':
        puts("ktree " REMVOL_VERSION);
        return 0;
      default:
        fputs(kUsage, stderr);
        return kUsageError;
    }
  }
  if (optind != argc || options.socket.empty() || options.name.empty() ||
      options.name.find('/') != std::string::npos) {
    fputs(kUsage, stderr);
    return kUsageError;
  }
  return -1;
}

void raise_descriptor_limit() {
  rlimit files = {};
  if (getrlimit(RLIMIT_NOFILE, &files) == 0) {
    files.rlim_cur = files.rlim_max;
    setrlimit(RLIMIT_NOFILE, &files);
  }
}

// Every client may have a memory file with the daemon, so two descriptors are reckoned for each.
size_t client_limit() {
  rlimit files = {};
  if (getrlimit(RLIMIT_NOFILE, &files) != 0) return 1;
  const rlim_t limit = std::max<rlim_t>(files.rlim_cur, kOwnDescriptors + 2);
  return static_cast<size_t>(std::min<rlim_t>((limit - kOwnDescriptors) / 2, kMaxClients));
}

// SIGTERM and SIGINT as a descriptor. A file that may not get so large (RLIMIT_FSIZE counts memory files,
// too) is an error, not the end. A shell starts a background command with SIGINT ignored, which would keep it
// from the descriptor, too.
int open_signals() {
  signal(SIGPIPE, SIG_IGN);
  signal(SIGHUP, SIG_IGN);
  signal(SIGXFSZ, SIG_IGN);
  signal(SIGTERM, SIG_DFL);
  signal(SIGINT, SIG_DFL);
  sigset_t mask;
  sigemptyset(&mask);
  sigaddset(&mask, SIGTERM);
  sigaddset(&mask, SIGINT);
  sigprocmask(SIG_BLOCK, &mask, nullptr);
  return signalfd(-1, &mask, SFD_CLOEXEC | SFD_NONBLOCK);
}

// Tells the service manager, where one waits for it, that the daemon answers; see sd_notify(3).
void tell_ready() {
  constexpr char kReady[] = "READY=1";
  const char* path = getenv("NOTIFY_SOCKET");
  sockaddr_un address = {};
  if (path == nullptr || path[0] == '\0' || strlen(path) >= sizeof address.sun_path) return;
  address.sun_family = AF_UNIX;
  strcpy(address.sun_path, path);
  if (path[0] == '@') address.sun_path[0] = '\0';
  const auto length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + strlen(path));
  const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  sendto(fd, kReady, sizeof kReady - 1, MSG_NOSIGNAL, reinterpret_cast<const sockaddr*>(&address), length);
  if (fd >= 0) close(fd);
}

int run_daemon(const DaemonOptions& options) {
  // What the starting process left open is not the daemon's: a lock file would stay locked for as long as it
  // lives. Nor is the folder that it was started in: a volume would stay busy.
  close_range(STDERR_FILENO + 1, ~0U, 0);
  raise_descriptor_limit();
  const int signals = open_signals();
  ktree::Service service;
  ktree::Endpoint endpoint;
  std::string error;
  const bool is_free = ktree::Endpoint::is_free(options.socket, error);
  // Before anybody can ask: an empty tree counts as fresh. One that has to refuse leaves the settings alone.
  if (is_free) ktree::load_first(options.settings, service);
  if (signals < 0 || !is_free || !endpoint.open(options.socket, options.name, error)) {
    platform::report(LOG_ERR, "ktree: %s", error.empty() ? strerror(errno) : error.c_str());
    return EXIT_FAILURE;
  }
  if (chdir("/") != 0) {
    platform::report(LOG_ERR, "ktree: /: %s", strerror(errno));
    return EXIT_FAILURE;
  }
  auto server = std::make_unique<ktree::Server>(endpoint.listener(), signals, client_limit(), service);
  tell_ready();
  if (!server->run()) {
    platform::report(LOG_ERR, "ktree: %s", strerror(errno));
    return EXIT_FAILURE;
  }
  return EXIT_SUCCESS;
}

}  // namespace

int main(int argc, char** argv) {
  remvol::begin();
  try {
    DaemonOptions options;
    const int status = parse_options(argc, argv, options);
    return status >= 0 ? status : run_daemon(options);
  } catch (const std::bad_alloc&) {
    platform::report(LOG_ERR, "ktree: out of memory");
    return EXIT_FAILURE;
  }
}
