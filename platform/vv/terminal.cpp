#include "vv/terminal.h"

#include <fcntl.h>
#include <strings.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <iterator>

namespace vv {
namespace {

constexpr int kSignals[] = {SIGINT, SIGQUIT, SIGTERM, SIGHUP, SIGTSTP};

volatile sig_atomic_t caught = 0;

class Terminal {
 public:
  Terminal() : fd_(open("/dev/tty", O_RDWR | O_CLOEXEC)) {}
  ~Terminal() {
    if (fd_ >= 0) close(fd_);
  }
  Terminal(const Terminal&) = delete;
  Terminal& operator=(const Terminal&) = delete;

  bool there() const { return fd_ >= 0; }
  int fd() const { return fd_; }

  void say(const std::string& text) const {
    if (write(fd_, text.data(), text.size()) < 0) return;  // the answer tells whether it was seen
  }

  // Reads a line without its end. Returns false at the end of the input, or when a signal came.
  bool read_line(std::string& line) const {
    line.clear();
    char byte = '\0';
    while (read(fd_, &byte, 1) == 1) {
      if (byte == '\n') return true;
      line += byte;
    }
    return false;
  }

 private:
  int fd_;
};

// The terminal shows nothing of what is typed, as long as this lives; signals are remembered meanwhile.
class Unseen {
 public:
  explicit Unseen(int fd) : fd_(fd) {
    caught = 0;
    struct sigaction remember {};
    remember.sa_handler = [](int number) { caught = number; };
    for (size_t i = 0; i < std::size(kSignals); i++) sigaction(kSignals[i], &remember, &before_[i]);
    tcgetattr(fd_, &shown_);
    termios unseen = shown_;
    unseen.c_lflag &= ~static_cast<tcflag_t>(ECHO);
    tcsetattr(fd_, TCSAFLUSH, &unseen);
  }
  ~Unseen() {
    tcsetattr(fd_, TCSAFLUSH, &shown_);
    for (size_t i = 0; i < std::size(kSignals); i++) sigaction(kSignals[i], &before_[i], nullptr);
    if (caught != 0) raise(caught);
  }
  Unseen(const Unseen&) = delete;
  Unseen& operator=(const Unseen&) = delete;

 private:
  int fd_;
  termios shown_{};
  struct sigaction before_[std::size(kSignals)];
};

}  // namespace

Answer ask(const std::string& question) {
  const Terminal terminal;
  if (!terminal.there()) return Answer::kNobody;
  terminal.say(question + " [y/N] ");
  std::string answer;
  if (!terminal.read_line(answer)) return Answer::kNo;
  return strcasecmp(answer.c_str(), "y") == 0 || strcasecmp(answer.c_str(), "yes") == 0 ? Answer::kYes
                                                                                        : Answer::kNo;
}

bool ask_secret(const std::string& question, std::string& secret) {
  const Terminal terminal;
  if (!terminal.there()) return false;
  terminal.say(question);
  bool read = false;
  {
    const Unseen unseen(terminal.fd());
    read = terminal.read_line(secret);
  }
  terminal.say("\n");
  return read && !secret.empty();
}

}  // namespace vv
