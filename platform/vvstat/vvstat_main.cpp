// vvstat: the state of targets and volumes for an operator. Reads the configuration tree and changes nothing.
#include <getopt.h>
#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <initializer_list>

#include "json.h"
#include "table.h"

namespace vvstat {
namespace {

constexpr int kNotConnected = 1, kUsage = 2, kUnreachable = 3;
constexpr int kInterval = 1000;  // milliseconds
constexpr char kMissing[] = "vvstat: the configuration tree cannot be reached\n";

struct Options {
  bool json = false;
  bool watch = false;
};

int exit_status(const Status& status) {
  if (!status.reachable) return kUnreachable;
  return all_connected(status) ? 0 : kNotConnected;
}

void put(const std::string& text) {
  fwrite(text.data(), 1, text.size(), stdout);
  fflush(stdout);
}

// Colour for a terminal, unless NO_COLOR asks for none (no-color.org).
Screen screen_of_output() {
  Screen screen;
  if (isatty(STDOUT_FILENO) == 0) return screen;
  const char* no_colour = getenv("NO_COLOR");
  screen.colour = no_colour == nullptr || no_colour[0] == '\0';
  return screen;
}

int show_once(const Options& options) {
  const Status status = read_status();
  if (options.json) {
    put(json(status));
  } else if (status.reachable) {
    put(table(status, screen_of_output()));
  }
  if (!status.reachable) fputs(kMissing, stderr);
  return exit_status(status);
}

// Puts the text over the one before: each line is cleared behind its end, the rest of the screen at last.
void redraw(const std::string& text) {
  std::string drawn = "\x1b[H";
  for (const char character : text) {
    if (character == '\n') drawn += "\x1b[K";
    drawn += character;
  }
  put(drawn + "\x1b[J");
}

void draw(const Status& status, const Options& options) {
  if (options.json) return put(json(status));
  Screen screen = screen_of_output();
  winsize size{};
  if (isatty(STDOUT_FILENO) == 0)
    return put((status.reachable ? table(status, screen) : kMissing) + std::string("\n"));
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0) {
    screen.columns = size.ws_col;
    screen.lines = size.ws_row > 1 ? size.ws_row - 1U : size.ws_row;
  }
  redraw(status.reachable ? table(status, screen) : kMissing);
}

int watch(const Options& options) {
  sigset_t set;
  sigemptyset(&set);
  for (int number : {SIGINT, SIGTERM, SIGHUP, SIGWINCH}) sigaddset(&set, number);
  sigprocmask(SIG_BLOCK, &set, nullptr);
  pollfd signals{signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK), POLLIN, 0};
  const bool terminal = isatty(STDOUT_FILENO) != 0 && !options.json;
  // The other screen, without a cursor; both are as before at the end.
  if (terminal) put("\x1b[?1049h\x1b[?25l");
  Status status{};
  for (signalfd_siginfo info{}; info.ssi_signo == 0 || info.ssi_signo == SIGWINCH;) {
    status = read_status();
    draw(status, options);
    if (ferror(stdout) != 0) break;
    poll(&signals, 1, kInterval);
    if (read(signals.fd, &info, sizeof info) != sizeof info) info = {};
  }
  if (terminal) put("\x1b[?25h\x1b[?1049l");
  return exit_status(status);
}

constexpr char kHelp[] =
    "usage: vvstat [--watch] [--json]\n"
    "Shows the targets and their volumes as the configuration tree has them.\n"
    "  -w, --watch    shows it again every second\n"
    "  -j, --json     shows it as JSON, for programs\n"
    "  -h, --help     this text\n"
    "  -V, --version  the version\n"
    "Exit status: 0 all that should be connected is, 1 something is not, 2 usage,\n"
    "3 the configuration tree cannot be reached.\n";

constexpr option kLongOptions[] = {{"watch", no_argument, nullptr, 'w'},
                                   {"json", no_argument, nullptr, 'j'},
                                   {"help", no_argument, nullptr, 'h'},
                                   {"version", no_argument, nullptr, 'V'},
                                   {}};

int run(int argc, char** argv) {
  Options options;
  for (int letter; (letter = getopt_long(argc, argv, "wjhV", kLongOptions, nullptr)) != -1;) {
    switch (letter) {
      case 'w':
        options.watch = true;
        break;
      case 'j':
        options.json = true;
        break;
      case 'h':
        put(kHelp);
        return 0;
      case 'V':
        put("vvstat " REMVOL_VERSION "\n");
        return 0;
      default:
        fputs(kHelp, stderr);
        return kUsage;
    }
  }
  if (optind != argc) {
    fputs(kHelp, stderr);
    return kUsage;
  }
  return options.watch ? watch(options) : show_once(options);
}

}  // namespace
}  // namespace vvstat

int main(int argc, char** argv) {
  return vvstat::run(argc, argv);
}
