// remvol-events: tells the tool when the connection of an iSCSI session is lost and when it is back.

#include <poll.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <initializer_list>
#include <string>
#include <string_view>

#include "begin.h"
#include "common/program.h"
#include "common/report.h"
#include "common/sessions.h"
#include "common/tree_reader.h"
#include "events/kernel_event.h"
#include "events/netlink.h"
#include "events/recovery.h"
#include "events/targets.h"

namespace events {
namespace {

using platform::read_sessions;

constexpr char kDefaultNotifier[] = "remvol-notify";
constexpr int kMuchHurry = 50, kSomeHurry = 1000;  // milliseconds between looks

struct Listener {
  const char* notifier = kDefaultNotifier;
  int signals = -1;
  int devices = -1;
  int iscsi = -1;
  bool deaf = false;  // there are sessions, but their events cannot be had
  bool gap = false;   // events were lost
  bool ended = false;
  int status = 0;
  Targets targets;
};

time_t now() {
  timespec time{};
  clock_gettime(CLOCK_MONOTONIC, &time);
  return time.tv_sec;
}

void complain(const char* what) {
  platform::report(LOG_ERR, "remvol-events: %s: %s", what, strerror(errno));
}

int open_signals() {
  sigset_t set;
  sigemptyset(&set);
  for (int number : {SIGCHLD, SIGTERM, SIGINT}) sigaddset(&set, number);
  sigprocmask(SIG_BLOCK, &set, nullptr);
  return signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK);
}

pid_t start_tool(const Order& order) {
  const bool reopen = order.action == Action::kReopen;
  const char* option = reopen ? "--oiscsi_evt_reopen" : "--oiscsi_evt_recover";
  const char* argv[] = {platform::kTool, option, "-n", order.target.c_str(), nullptr};
  const pid_t process = platform::start_apart(platform::kTool, argv);
  const char* target = order.target.c_str();
  if (process < 0) {
    platform::report(LOG_ERR, "remvol-events: %s: %s", target, strerror(errno));
  } else if (reopen) {
    platform::report(LOG_WARNING, "remvol-events: %s: the connection is lost", target);
  } else {
    platform::report(LOG_NOTICE, "remvol-events: %s: the session is back", target);
  }
  return process;
}

// The tree is up to date now: people and programs are told of what has changed.
void notify(const char* notifier, const OrderEnd& end) {
  const char* changes[] = {notifier, nullptr};
  const char* failure[] = {notifier, "--recovery-failed", end.given_up.c_str(), nullptr};
  const auto start = platform::start_apart;
  if (start(notifier, changes) < 0 || (!end.given_up.empty() && start(notifier, failure) < 0)) {
    complain(notifier);
  }
}

void give_orders(Listener& daemon) {
  Order order;
  if (!daemon.targets.next(order)) return;
  const platform::TreeReader tree;
  do {
    daemon.targets.started(order.target, is_others(tree, order.target) ? -1 : start_tool(order));
  } while (daemon.targets.next(order));
}

// A recovery may have ended well and left its target to a run that did not.
void settle_doubts(Listener& daemon) {
  std::string target;
  while (daemon.targets.next_doubt(target, now())) {
    if (!daemon.targets.settle_doubt(target, recovery_of(target), read_sessions(), now())) continue;
    platform::report(LOG_WARNING, "remvol-events: %s: its recovery was not finished, it is tried again",
                     target.c_str());
  }
}

// The socket is open only while there is a session, so that the kernel module can be unloaded after the last
// one.
void follow_sessions(Listener& daemon, bool any) {
  if (!any && daemon.iscsi >= 0) close(daemon.iscsi);
  if (!any) daemon.iscsi = -1;
  if (any && daemon.iscsi < 0) daemon.iscsi = open_iscsi_events();
  const bool deaf = any && daemon.iscsi < 0;
  if (deaf && !daemon.deaf) complain("no connection events, looking every second instead");
  daemon.deaf = deaf;
}

void look(Listener& daemon) {
  follow_sessions(daemon, platform::is_any_session());
  // Read again: a connection may have been lost before the socket was open.
  daemon.targets.look(read_sessions());
}

void look_after_a_gap(Listener& daemon) {
  daemon.gap = false;
  follow_sessions(daemon, platform::is_any_session());
  daemon.targets.look_after_a_gap(read_sessions());
}

void take_signals(Listener& daemon) {
  signalfd_siginfo info;
  while (read(daemon.signals, &info, sizeof info) == sizeof info) {
    if (info.ssi_signo != SIGCHLD) daemon.ended = true;
  }
  int status = 0;
  for (pid_t child; (child = waitpid(-1, &status, WNOHANG)) > 0;) {
    const OrderEnd end = daemon.targets.ended(child, status != 0, now());
    if (end.ordered) notify(daemon.notifier, end);
  }
}

// Takes all that waits on a socket; `take(message, size)` gets each message.
template <typename Take>
void take_messages(Listener& daemon, int socket, Take take) {
  static unsigned char buffer[1 << 16];
  size_t size = 0;
  for (;;) {
    switch (receive(socket, buffer, sizeof buffer, size)) {
      case Received::kMessage:
        take(buffer, size);
        break;
      case Received::kOverrun:
        platform::report(LOG_WARNING, "remvol-events: events were lost, looking at all sessions");
        daemon.gap = true;
        break;
      case Received::kFailed:
        complain("events");
        daemon.ended = true;
        daemon.status = 1;
        return;
      case Received::kNothing:
        return;
    }
  }
}

void take_device_events(Listener& daemon) {
  bool changed = false;
  take_messages(daemon, daemon.devices, [&changed](const unsigned char* message, size_t size) {
    changed = changed || is_session_event(message, size);
  });
  if (changed) look(daemon);
}

void take_iscsi_events(Listener& daemon) {
  take_messages(daemon, daemon.iscsi, [&daemon](const unsigned char* message, size_t size) {
    KernelEvent event{};
    while (take_kernel_event(message, size, event)) {
      if (event.kind != KernelEventKind::kOther) daemon.targets.take(event, read_sessions());
    }
  });
}

// Milliseconds until the sessions are looked at, -1 for no end.
int patience_with_sessions(const Listener& daemon) {
  switch (daemon.targets.hurry()) {
    case Hurry::kMuch:
      return kMuchHurry;
    case Hurry::kSome:
      return kSomeHurry;
    default:
      return daemon.deaf ? kSomeHurry : -1;
  }
}

int patience(const Listener& daemon) {
  const int look = patience_with_sessions(daemon);
  const time_t due = daemon.targets.next_doubt_due();
  if (due == 0) return look;
  const int wait = static_cast<int>(std::max<time_t>(due - now(), 0)) * 1000;
  return look < 0 ? wait : std::min(look, wait);
}

void run(Listener& daemon) {
  look_after_a_gap(daemon);
  while (!daemon.ended) {
    settle_doubts(daemon);
    give_orders(daemon);
    pollfd inputs[] = {{daemon.signals, POLLIN, 0}, {daemon.devices, POLLIN, 0}, {daemon.iscsi, POLLIN, 0}};
    if (poll(inputs, 3, patience(daemon)) == 0) look(daemon);
    if (inputs[0].revents != 0) take_signals(daemon);
    if (inputs[2].revents != 0) take_iscsi_events(daemon);
    if (inputs[1].revents != 0) take_device_events(daemon);
    if (daemon.gap) look_after_a_gap(daemon);
  }
}

int serve(const char* notifier) {
  Listener daemon;
  daemon.notifier = notifier;
  daemon.signals = open_signals();
  daemon.devices = open_device_events();
  if (daemon.signals < 0 || daemon.devices < 0) {
    complain("device events");
    return 1;
  }
  run(daemon);
  return daemon.status;
}

constexpr char kHelp[] =
    "usage: remvol-events [--notifier PROGRAM | --test]\n"
    "When the connection of an iSCSI session is lost it runs\n"
    "\"remvol --oiscsi_evt_reopen -n TARGET\", when the session is back\n"
    "\"remvol --oiscsi_evt_recover -n TARGET\", and remvol-notify after each.\n"
    "Stays in the foreground.\n"
    "  --notifier PROGRAM  is run in place of remvol-notify\n"
    "  --test              has remvol-notify tell of a made-up event, and ends\n"
    "  -h, --help          this text\n"
    "  -V, --version       the version\n";

}  // namespace
}  // namespace events

int main(int argc, char** argv) {
  remvol::begin();
  if (argc == 1) return events::serve(events::kDefaultNotifier);
  const std::string_view option = argc == 2 ? argv[1] : "";
  if (argc == 3 && std::string_view(argv[1]) == "--notifier") return events::serve(argv[2]);
  if (option == "--test") {
    execlp("remvol-notify", "remvol-notify", "--test", nullptr);
    perror("remvol-events: remvol-notify");
    return 1;
  }
  if (option == "-h" || option == "--help") return platform::print_asked_for(events::kHelp);
  if (option == "-V" || option == "--version") {
    return platform::print_asked_for("remvol-events " REMVOL_VERSION "\n");
  }
  fputs(events::kHelp, stderr);
  return 2;
}
