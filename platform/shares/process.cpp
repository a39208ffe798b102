#include "shares/process.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdarg>
#include <cstdlib>
#include <string_view>

#include "common/lock_file.h"
#include "common/report.h"

namespace shares {
namespace {

constexpr int kPatience = 5000;  // milliseconds

// `output` is where the program's output goes; nowhere when it is negative.
pid_t start_quietly(const std::vector<std::string>& words, int output) {
  std::vector<char*> argv;
  for (const std::string& word : words) argv.push_back(const_cast<char*>(word.c_str()));
  argv.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  for (int stream = 0; stream <= 2; stream++) {
    posix_spawn_file_actions_addopen(&actions, stream, "/dev/null", O_RDWR, 0);
  }
  if (output >= 0) posix_spawn_file_actions_adddup2(&actions, output, STDOUT_FILENO);
  pid_t child = -1;
  if (posix_spawnp(&child, argv[0], &actions, nullptr, argv.data(), environ) != 0) child = -1;
  posix_spawn_file_actions_destroy(&actions);
  return child;
}

void wait_or_kill(pid_t child) {
  const int handle = static_cast<int>(syscall(SYS_pidfd_open, child, 0));
  if (handle < 0) return;
  pollfd ended{handle, POLLIN, 0};
  if (poll(&ended, 1, kPatience) == 0) kill(child, SIGKILL);
  close(handle);
}

void take_output(int sink, std::string& output) {
  char block[4096];
  off_t at = 0;
  output.clear();
  for (ssize_t size; (size = pread(sink, block, sizeof block, at)) > 0; at += size) {
    output.append(block, static_cast<size_t>(size));
  }
  if (sink >= 0) close(sink);
}

}  // namespace

void open_log(const char* program) {
  openlog(program, platform::is_journal(STDERR_FILENO) ? 0 : LOG_PERROR, LOG_DAEMON);
}

void log_line(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  vsyslog(priority, format, arguments);
  va_end(arguments);
}

bool take_turn(const char* lock_file) {
  const int fd = platform::open_lock_file(lock_file);
  return fd >= 0 && platform::take_lock(fd, LOCK_EX);
}

int run(const std::vector<std::string>& words, std::string* output) {
  const int sink = output != nullptr ? memfd_create("output", MFD_CLOEXEC) : -1;
  const pid_t child = start_quietly(words, sink);
  int status = -1;
  if (child >= 0) {
    wait_or_kill(child);
    if (waitpid(child, &status, 0) != child || !WIFEXITED(status)) status = -1;
  }
  if (output != nullptr) take_output(sink, *output);
  return status < 0 ? -1 : WEXITSTATUS(status);
}

bool is_installed(const char* program) {
  const char* path = getenv("PATH");
  for (std::string_view rest = path != nullptr ? path : "/usr/sbin:/usr/bin:/sbin:/bin"; !rest.empty();) {
    const size_t end = rest.find(':');
    const std::string file = std::string(rest.substr(0, end)) + "/" + program;
    if (access(file.c_str(), X_OK) == 0) return true;
    rest.remove_prefix(end == std::string_view::npos ? rest.size() : end + 1);
  }
  return false;
}

}  // namespace shares
