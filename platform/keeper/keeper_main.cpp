// remvol-keeper: sees to it that what should be there is there: the initiator's daemon, a session of each
// target that is to be connected, and the mounts of its volumes.

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
#include <vector>

#include "begin.h"
#include "common/processes.h"
#include "common/program.h"
#include "common/report.h"
#include "common/sessions.h"
#include "common/tree_reader.h"
#include "events/netlink.h"
#include "keeper/attempt.h"
#include "keeper/schedule.h"
#include "keeper/tool_runs.h"
#include "keeper/volumes.h"
#include "keeper/wish.h"
#include "tree_layout.h"

namespace keeper {
namespace {

constexpr char kInitiatorDaemon[] = "iscsid";
// How it calls itself, with a target or a share behind.
constexpr char kTryFirst[] = "--try-first", kTry[] = "--try", kMount[] = "--mount";
constexpr time_t kHurry = 1, kRest = 2;  // seconds between looks

constexpr Terms kInitiatorTerms = {.looks = 2, .lasting = Schedule::kLongestPause};
// Whoever unmounts a volume to work on its disk has begun by then, and is at it for longer than who looks at
// all disks.
constexpr Terms kVolumeTerms = {
    .looks = 10, .lasting = Schedule::kLongestPause, .once_there = true, .taken_looks = 2};

// What should be there, and the processes of the tries that are under way.
struct Kept {
  struct UnderWay {
    pid_t process;
    time_t since;
    std::string name;
  };

  Schedule schedule;
  std::vector<UnderWay> tries;

  // One try after the other, but a long one, such as of a target that does not answer, holds up nobody.
  bool is_trying(time_t now) const {
    return std::any_of(tries.begin(), tries.end(),
                       [now](const UnderWay& one) { return now - one.since < Schedule::kLongestPause; });
  }
  bool is_trying(const std::string& name) const {
    return std::any_of(tries.begin(), tries.end(), [&name](const UnderWay& one) { return one.name == name; });
  }
};

struct Keeper {
  Kept targets, volumes{Schedule(kVolumeTerms), {}};
  Wishes wishes;
  Schedule initiator{kInitiatorTerms};  // its daemon in place of a target
  int signals = -1, devices = -1;
  bool first = true;  // no look yet: what is away now was taken down when the settings say so
};

time_t now() {
  timespec time{};
  clock_gettime(CLOCK_MONOTONIC, &time);
  return time.tv_sec;
}

// Starts a program that goes on when this one ends. Returns its process, or -1.
pid_t start_program(std::initializer_list<const char*> words, const char* program) {
  std::vector<const char*> argv(words);
  argv.push_back(nullptr);
  const pid_t process = platform::start_apart(program, argv.data());
  if (process < 0) platform::report(LOG_ERR, "remvol-keeper: %s: %s", program, strerror(errno));
  return process;
}

void tell(Schedule& schedule, const char* missing, const char* back) {
  std::string name;
  for (Change change; (change = schedule.next_change(name)) != Change::kNone;) {
    const char* news = change == Change::kMissing ? missing : back;
    if (change == Change::kLeft) news = "was unmounted by somebody who works on its disk, it stays so";
    platform::report(change == Change::kBack ? LOG_NOTICE : LOG_WARNING, "remvol-keeper: %s %s", name.c_str(),
                     news);
  }
}

// Without the daemon no lost session is healed and none is made. Whoever stops it on purpose is still at
// work, or has stopped the tree as well. Where that comes again of itself so does the daemon, as nothing says
// then that it was stopped.
void keep_initiator(Keeper& daemon, bool tree_answers, bool at_work) {
  std::vector<Wanted> wanted;
  if (tree_answers && !at_work) {
    wanted.push_back({kInitiatorDaemon, platform::runs(kInitiatorDaemon)});
  }
  daemon.initiator.look(wanted, now());
  tell(daemon.initiator, "is gone, starting another one", "is there again");
  Try next;
  if (daemon.initiator.next_try(next, now())) start_program({kInitiatorDaemon, "-f"}, kInitiatorDaemon);
}

std::vector<Wanted> wanted_targets(const Keeper& daemon, const platform::TreeReader& tree,
                                   const std::vector<platform::Session>& sessions) {
  std::vector<Wanted> wanted;
  for (int n = 1; n <= remvol::kMaxTargets; n++) {
    const std::string name = tree.value(remvol::key::kTargetName, n);
    if (name.empty()) break;
    if (tree.number(0, remvol::key::kTargetConnSet, n) == 0 && !daemon.wishes.has(name)) continue;
    // The session of a try may show no disk, and is closed then.
    const bool connected =
        !daemon.targets.is_trying(name) &&
        std::any_of(sessions.begin(), sessions.end(),
                    [&name](const platform::Session& session) { return session.target == name; });
    const bool was_taken = daemon.first && tree.number(remvol::kDisconnected, remvol::key::kTargetConnState,
                                                       n) == remvol::kDisconnected;
    const bool is_taken = !connected && (was_taken || is_taken_down(name));
    wanted.push_back({name, connected, is_taken, !connected && is_brought_up(name)});
  }
  return wanted;
}

// Starts the next try that is due as a process of its own.
void try_next(Kept& kept, const char* first_option, const char* option) {
  Try next;
  if (kept.is_trying(now()) || !kept.schedule.next_try(next, now()) || kept.is_trying(next.name)) return;
  const char* chosen = next.first ? first_option : option;
  const pid_t process = start_program({"remvol-keeper", chosen, next.name.c_str()}, "/proc/self/exe");
  if (process > 0) kept.tries.push_back({process, now(), next.name});
}

void try_what_is_due(Keeper& daemon) {
  try_next(daemon.targets, kTryFirst, kTry);
  // A new daemon takes the sessions over, whose disks do not run meanwhile.
  if (!daemon.initiator.anything_missing()) try_next(daemon.volumes, kMount, kMount);
}

// Returns the name of what the process has tried; empty when it is another one's.
std::string end_of_try(Kept& kept, pid_t process) {
  std::string name;
  std::erase_if(kept.tries, [&name, process](const Kept::UnderWay& one) {
    if (one.process == process) name = one.name;
    return one.process == process;
  });
  return name;
}

// A volume that is not mounted although the tool has said 0 cannot be: it is left to a person.
void take_end(Keeper& daemon, pid_t process, int status) {
  end_of_try(daemon.targets, process);
  const std::string volume = end_of_try(daemon.volumes, process);
  if (!volume.empty() && platform::exit_status(status) == 0) daemon.volumes.schedule.leave(volume);
}

void look(Keeper& daemon) {
  const std::vector<platform::Session> sessions = platform::read_sessions();
  const platform::TreeReader tree;
  const bool starting = platform::runs(platform::kTool, {"--init"});
  keep_initiator(daemon, tree.answered(), starting || is_taken_down());
  if (!tree.answered() || daemon.wishes.look(tree, sessions, starting)) return;
  daemon.targets.schedule.look(wanted_targets(daemon, tree, sessions), now());
  daemon.first = false;
  tell(daemon.targets.schedule, "should be connected and is not, it is tried until it is",
       "is connected again");
  // The states that a try stores for a moment are no news.
  if (daemon.volumes.is_trying(now())) return;
  daemon.volumes.schedule.look(wanted_volumes(tree, sessions), now());
  tell(daemon.volumes.schedule,
       "was unmounted by somebody else, it is mounted as soon as it can be unless its target is disconnected",
       "is mounted again");
}

// Returns false when the daemon is to end.
bool take_signals(Keeper& daemon) {
  bool ended = false;
  signalfd_siginfo info;
  while (read(daemon.signals, &info, sizeof info) == sizeof info) ended = ended || info.ssi_signo != SIGCHLD;
  int status = 0;
  for (pid_t child; (child = waitpid(-1, &status, WNOHANG)) > 0;) take_end(daemon, child, status);
  return !ended;
}

// Waits for the next look: it is due at once when a session comes or goes, so that whoever takes it away is
// still there.
bool wait_for_look(Keeper& daemon) {
  static unsigned char buffer[1 << 14];
  const bool hurry = daemon.targets.schedule.anything_missing() ||
                     daemon.volumes.schedule.anything_missing() || daemon.initiator.anything_missing();
  const time_t due = now() + (hurry ? kHurry : kRest);
  for (bool session = false; !session && now() < due;) {
    pollfd inputs[] = {{daemon.signals, POLLIN, 0}, {daemon.devices, POLLIN, 0}};
    poll(inputs, 2, static_cast<int>(due - now()) * 1000);
    if (inputs[0].revents != 0 && !take_signals(daemon)) return false;
    events::Received received = events::Received::kMessage;
    for (size_t size; (received = events::receive(daemon.devices, buffer, sizeof buffer, size)) ==
                      events::Received::kMessage;) {
      session = session || events::is_session_event(buffer, size);
    }
    session = session || received == events::Received::kOverrun;
  }
  return true;
}

bool open_inputs(Keeper& daemon) {
  sigset_t set;
  sigemptyset(&set);
  for (int number : {SIGTERM, SIGINT, SIGCHLD}) sigaddset(&set, number);
  sigprocmask(SIG_BLOCK, &set, nullptr);
  daemon.signals = signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK);
  daemon.devices = events::open_device_events();
  return daemon.signals >= 0 && daemon.devices >= 0;
}

int serve() {
  Keeper daemon;
  if (!open_inputs(daemon)) {
    platform::report(LOG_ERR, "remvol-keeper: device events: %s", strerror(errno));
    return 1;
  }
  do {
    look(daemon);
    try_what_is_due(daemon);
  } while (wait_for_look(daemon));
  return 0;
}

constexpr char kHelp[] =
    "usage: remvol-keeper\n"
    "Starts the initiator's daemon again when it has died, has targets connected that\n"
    "should be and are not, and volumes mounted that somebody else has unmounted.\n"
    "Stays in the foreground.\n"
    "  -h, --help     this text\n"
    "  -V, --version  the version\n";

}  // namespace
}  // namespace keeper

int main(int argc, char** argv) {
  remvol::begin();
  if (argc == 1) return keeper::serve();
  const std::string_view option = argv[1];
  if (option == keeper::kTryFirst && argc == 3) return keeper::try_target(argv[2], true);
  if (option == keeper::kTry && argc == 3) return keeper::try_target(argv[2], false);
  if (option == keeper::kMount && argc == 3) return keeper::mount_again(argv[2]);
  if (argc == 2 && (option == "-h" || option == "--help")) return platform::print_asked_for(keeper::kHelp);
  if (argc == 2 && (option == "-V" || option == "--version")) {
    return platform::print_asked_for("remvol-keeper " REMVOL_VERSION "\n");
  }
  fputs(keeper::kHelp, stderr);
  return 2;
}
