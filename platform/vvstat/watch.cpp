#include "vvstat/watch.h"

#include <poll.h>
#include <sys/ioctl.h>
#include <sys/signalfd.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <initializer_list>
#include <string_view>
#include <vector>

namespace vvstat {
namespace {

constexpr int kInterval = 1000;  // milliseconds

// xterm's control sequences: the other screen, no cursor, long lines cut at the edge; and all of it undone.
constexpr char kBegin[] = "\x1b[?1049h\x1b[?25l\x1b[?7l";
constexpr char kEnd[] = "\x1b[?7h\x1b[?25h\x1b[?1049l";

void put(std::string_view text) {
  fwrite(text.data(), 1, text.size(), stdout);
  fflush(stdout);
}

std::vector<std::string_view> lines_of(std::string_view text) {
  std::vector<std::string_view> lines;
  while (!text.empty()) {
    const size_t size = std::min(text.find('\n'), text.size() - 1);
    lines.push_back(text.substr(0, size));
    text.remove_prefix(size + 1);
  }
  return lines;
}

// Leaves lines out where the screen has no room for all: the verdict has up to half of it, and the table's
// last line says how much it lacks.
std::string fitting(const Page& page, size_t height) {
  std::vector<std::string_view> table = lines_of(page.table), verdict = lines_of(page.verdict);
  std::string more;
  if (table.size() + verdict.size() > height) {
    verdict.resize(std::min(verdict.size(), std::max<size_t>(1, height / 2)));
    const size_t room = height - std::min(height, verdict.size());
    const size_t kept = std::min(table.size(), room - std::min<size_t>(1, room));
    more.append("+").append(std::to_string(table.size() - kept)).append(" rows");
    table.resize(kept);
    if (room > 0) table.push_back(more);
  } else if (table.size() + verdict.size() < height) {
    table.emplace_back();
  }
  std::string text;
  for (const auto* lines : {&table, &verdict}) {
    for (const std::string_view line : *lines) text.append(line).append("\x1b[K\r\n");
  }
  return text;
}

void redraw(std::string_view text) {
  put(std::string("\x1b[H").append(text).append("\x1b[J"));
}

struct Size {
  size_t width = 80, height = 24;
};

Size size_of_terminal() {
  winsize size{};
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_col == 0 || size.ws_row == 0) return {};
  return {size.ws_col, size.ws_row};
}

// A terminal whose keys are read one by one and not shown, until the end of the object.
class Keys {
 public:
  Keys() : set_(tcgetattr(STDIN_FILENO, &before_) == 0) {
    if (!set_) return;
    termios raw = before_;
    raw.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
    tcsetattr(STDIN_FILENO, TCSANOW, &raw);
  }
  Keys(const Keys&) = delete;
  Keys& operator=(const Keys&) = delete;
  ~Keys() {
    if (set_) tcsetattr(STDIN_FILENO, TCSANOW, &before_);
  }
  // For poll(2), which takes no notice of a negative one.
  int descriptor() const { return set_ ? STDIN_FILENO : -1; }

 private:
  termios before_{};
  bool set_;
};

int open_signals() {
  sigset_t set;
  sigemptyset(&set);
  for (const int number : {SIGINT, SIGTERM, SIGHUP, SIGWINCH}) sigaddset(&set, number);
  sigprocmask(SIG_BLOCK, &set, nullptr);
  return signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK);
}

// Waits for the next page. Returns false when it is to end.
bool wait_for_next(int signals, int keys) {
  pollfd inputs[] = {{signals, POLLIN, 0}, {keys, POLLIN, 0}};
  poll(inputs, 2, kInterval);
  signalfd_siginfo info{};
  if (read(signals, &info, sizeof info) == sizeof info && info.ssi_signo != SIGWINCH) return false;
  if (inputs[1].revents == 0) return true;
  char key = 0;
  return read(keys, &key, 1) == 1 && key != 'q' && key != 'Q';
}

}  // namespace

void watch(const std::function<Page(size_t width)>& make) {
  const bool terminal = isatty(STDOUT_FILENO) != 0;
  const int signals = open_signals();
  const Keys keys;
  if (terminal) put(kBegin);
  do {
    const Size size = size_of_terminal();
    const Page page = make(terminal ? size.width : 0);
    terminal ? redraw(fitting(page, size.height - 1)) : put(page.table + page.verdict + "\n");
  } while (ferror(stdout) == 0 && wait_for_next(signals, terminal ? keys.descriptor() : -1));
  if (terminal) put(kEnd);
}

}  // namespace vvstat
