// The pid file of a tree daemon and the name of a process, on any texts: the process whose number the file
// begins with is told to end when it is a ktree, and nobody else ever is.
#include <sys/types.h>

#include <algorithm>
#include <climits>
#include <csignal>
#include <string>

#include "frontend/log.h"
#include "iscsi/daemon.h"
#include "require.h"
#include "wrapped_files.h"

using namespace remvol;

namespace {

constexpr char kPidFile[] = "/run/ktree.pid";
std::string pid_text;
std::string name_text;
std::string asked;  // whose name was read
pid_t ended = 0;    // who was told to end

void choose_text(const char* path) {
  const bool is_pid_file = strcmp(path, kPidFile) == 0;
  if (!is_pid_file) asked = path;
  give_file(is_pid_file ? pid_text : name_text);
}

// The number that the text's first line begins with, in its first 31 characters, as far as it can be a
// process's; else 0.
pid_t named_process(const std::string& text) {
  const std::string line = text.substr(0, std::min<size_t>(text.find('\n'), 31));
  size_t at = line.find_first_not_of(" \t\v\f\r");
  if (at != std::string::npos && line[at] == '+') at++;
  long long number = 0;
  for (; at < line.size() && line[at] >= '0' && line[at] <= '9'; at++) {
    number = number * 10 + (line[at] - '0');
    if (number > INT_MAX) return 0;
  }
  return number > 1 ? static_cast<pid_t>(number) : 0;
}

}  // namespace

extern "C" {

// A shell that does not know the signal by that name.
int __wrap_System(const char*, ...) {
  return 2 << 8;
}

int __wrap_kill(pid_t pid, int signal) {
  require(signal == SIGTERM);
  ended = pid;
  return 0;
}

}  // extern "C"

// The pid file's text, a null character, the text with the process's name.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  on_file = choose_text;
  const uint8_t* end = std::find(data, data + size, 0);
  pid_text.assign(data, end);
  name_text.assign(std::min(end + 1, data + size), data + size);
  asked.clear();
  ended = 0;
  const pid_t named = named_process(pid_text);
  const bool is_daemon = named != 0 && name_text.starts_with("ktree\n");
  require(stop_tree_daemon(kPidFile) == is_daemon);
  require(ended == (is_daemon ? named : 0));
  require(asked == (named == 0 ? "" : "/proc/" + std::to_string(named) + "/comm"));
  return 0;
}
