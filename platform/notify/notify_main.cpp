// remvol-notify: looks at the volumes and tells people and programs what has changed since its last look.
#include <fcntl.h>
#include <getopt.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/file_text.h"
#include "common/report.h"
#include "common/tree_listing.h"
#include "common/utf8.h"
#include "notify/delivery.h"
#include "notify/history.h"
#include "vvstat/kernel.h"
#include "vvstat/status.h"

#include "begin.h"
#include "run_files.h"

namespace notify {
namespace {

constexpr char kConfig[] = "/etc/remvol/remvol.conf";
constexpr int kFailed = 1, kUsage = 2, kUnreachable = 3;

bool complain(const char* subject) {
  platform::report(LOG_WARNING, "remvol-notify: %s: %s", subject, strerror(errno));
  return false;
}

// Without the file nobody is told but the journal. Returns false, after saying so, when it is there and
// cannot be read: who should be told is not known then.
bool read_config(Config& config) {
  const int file = open(kConfig, O_RDONLY | O_CLOEXEC);
  if (file < 0 && errno == ENOENT) return true;
  char byte = '\0';
  const bool is_readable = file >= 0 && pread(file, &byte, 1, 0) >= 0;
  if (is_readable) {
    config = parse_config(platform::content_of(file));
  } else {
    platform::report(LOG_ERR, "remvol-notify: %s: %s", kConfig, strerror(errno));
  }
  if (file >= 0) close(file);
  return is_readable;
}

// When the history was made; 0 when it is none, because the file is new or damaged.
time_t time_of(int file, bool fresh, const std::string& text, const History& history) {
  struct stat info {};
  if (fresh || (history.empty() && !text.empty()) || fstat(file, &info) != 0) return 0;
  return info.st_mtime;
}

// Another look at the same time waits: each change is found by one of them. The file goes with the machine's
// run time, so a torn one costs a message told twice.
bool look(const vvstat::Status& status, std::vector<Event>& events) {
  mkdir(remvol::kRunDir, 0700);
  const bool fresh = access(vvstat::kHistoryFile, F_OK) != 0;
  const int file = open(vvstat::kHistoryFile, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
  if (file < 0 || flock(file, LOCK_EX) != 0) return complain(vvstat::kHistoryFile);
  const std::string before = platform::content_of(file);
  History history = vvstat::history_of(before);
  const time_t last_look = time_of(file, fresh, before, history), now = time(nullptr);
  events = compare(vvstat::assess(status, vvstat::read_facts(status, vvstat::Detail::kHealth)), now,
                   last_look, history);
  const std::string text = vvstat::text_of(history);
  // The time is set as well: an empty history is one, and writing nothing leaves the time as it was.
  const timespec times[] = {{now, 0}, {now, 0}};
  const bool written = ftruncate(file, 0) == 0 &&
                       pwrite(file, text.data(), text.size(), 0) == static_cast<ssize_t>(text.size()) &&
                       futimens(file, times) == 0;
  if (!written) complain(vvstat::kHistoryFile);
  close(file);
  return written;
}

int tell(const std::vector<Event>& events) {
  Config config;
  const bool is_known = read_config(config);
  return deliver(events, config) && is_known ? 0 : kFailed;
}

int look_and_tell() {
  const vvstat::Status status = vvstat::read_status(platform::TreeListing());
  if (!status.reachable) {
    platform::report(LOG_WARNING, "remvol-notify: %s",
                     geteuid() == 0 ? "the configuration tree cannot be reached"
                                    : "only root may read the configuration tree");
    return kUnreachable;
  }
  std::vector<Event> events;
  const bool looked = look(status, events);
  const int told = tell(events);
  return looked ? told : kFailed;
}

// Of each volume of the target; of the target itself where it has none, or the tree does not answer.
int tell_of_failed_recovery(const char* target) {
  const std::string name = platform::printable(target);
  const std::string end = " failed and is not tried again; run: ";
  std::vector<Event> events;
  for (const vvstat::Target& each : vvstat::read_status(platform::TreeListing()).targets) {
    if (each.name != target) continue;
    for (const vvstat::Volume& volume : each.volumes) {
      const std::string share = platform::printable(volume.share);
      const std::string command = platform::printable(vvstat::vv_command("connect", volume.share));
      events.push_back({EventKind::kRecoveryFailed, name, share,
                        "Volume " + share + ": the recovery of its target" + end + command});
    }
  }
  if (events.empty()) {
    const std::string command = platform::printable(vvstat::connect_command(target));
    events.push_back(
        {EventKind::kRecoveryFailed, name, "", "Target " + name + ": its recovery" + end + command});
  }
  return tell(events);
}

constexpr char kHelp[] =
    "usage: remvol-notify [--test | --recovery-failed TARGET]\n"
    "Looks at the volumes of remote targets and tells what has changed since its last\n"
    "look: in the journal, by mail and by programs, as remvol.conf(5) says.\n"
    "  --test                    tells of a made-up event\n"
    "  --recovery-failed TARGET  tells that a recovery is not tried again\n"
    "  -h, --help                this text\n"
    "  -V, --version             the version\n"
    "Exit status: 0 all is told, 1 something could not be, 2 usage,\n"
    "3 the configuration tree cannot be reached.\n";

constexpr option kLongOptions[] = {{"test", no_argument, nullptr, 't'},
                                   {"recovery-failed", required_argument, nullptr, 'r'},
                                   {"help", no_argument, nullptr, 'h'},
                                   {"version", no_argument, nullptr, 'V'},
                                   {}};

int run(int argc, char** argv) {
  const int letter = getopt_long(argc, argv, "hV", kLongOptions, nullptr);
  const char* target = optarg;
  if (optind == argc) {
    switch (letter) {
      case -1:
        return look_and_tell();
      case 't':
        return tell(
            {{EventKind::kTest, "", "", "A test of what is told when something happens to a volume"}});
      case 'r':
        return tell_of_failed_recovery(target);
      case 'h':
        return platform::print_asked_for(kHelp);
      case 'V':
        return platform::print_asked_for("remvol-notify " REMVOL_VERSION "\n");
      default:
        break;
    }
  }
  fputs("Try 'remvol-notify --help'.\n", stderr);
  return kUsage;
}

}  // namespace
}  // namespace notify

int main(int argc, char** argv) {
  remvol::begin();
  return notify::run(argc, argv);
}
