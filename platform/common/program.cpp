#include "common/program.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>

#include <cerrno>
#include <csignal>

namespace platform {
namespace {

// Duplicates come before what is closed by being replaced: /dev/null last.
class Files {
 public:
  explicit Files(const Streams& streams) {
    posix_spawn_file_actions_init(&actions_);
    const int wanted[] = {streams.input, streams.output, streams.error};
    for (int stream = STDIN_FILENO; stream <= STDERR_FILENO; stream++) {
      if (wanted[stream] >= 0 && wanted[stream] != stream) {
        posix_spawn_file_actions_adddup2(&actions_, wanted[stream], stream);
      }
    }
    for (int stream = STDIN_FILENO; stream <= STDERR_FILENO; stream++) {
      if (wanted[stream] < 0) posix_spawn_file_actions_addopen(&actions_, stream, "/dev/null", O_RDWR, 0);
    }
  }
  Files(const Files&) = delete;
  Files& operator=(const Files&) = delete;
  ~Files() { posix_spawn_file_actions_destroy(&actions_); }
  const posix_spawn_file_actions_t* get() const { return &actions_; }

 private:
  posix_spawn_file_actions_t actions_;
};

pid_t start(const char* file, const char* const* argv, const Streams& streams, short flags) {
  posix_spawnattr_t attributes;
  sigset_t none;
  sigemptyset(&none);
  posix_spawnattr_init(&attributes);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setpgroup(&attributes, 0);
  posix_spawnattr_setflags(&attributes, static_cast<short>(flags | POSIX_SPAWN_SETSIGMASK));
  const Files files(streams);
  pid_t process = -1;
  const int error =
      posix_spawnp(&process, file, files.get(), &attributes, const_cast<char* const*>(argv), environ);
  posix_spawnattr_destroy(&attributes);
  errno = error;
  return error == 0 ? process : -1;
}

}  // namespace

pid_t start(const char* file, const char* const* argv, const Streams& streams) {
  return start(file, argv, streams, 0);
}

pid_t start_apart(const char* file, const char* const* argv) {
  return start(file, argv, {}, POSIX_SPAWN_SETPGROUP);
}

std::vector<const char*> arguments_of(const std::vector<std::string>& words) {
  std::vector<const char*> arguments;
  for (const std::string& word : words) arguments.push_back(word.c_str());
  arguments.push_back(nullptr);
  return arguments;
}

bool ends_within(pid_t child, int milliseconds) {
  const auto handle = static_cast<int>(syscall(SYS_pidfd_open, child, 0));
  if (handle < 0) return true;
  pollfd ended{handle, POLLIN, 0};
  const bool has_ended = poll(&ended, 1, milliseconds) != 0;
  close(handle);
  return has_ended;
}

int end_of(pid_t child) {
  int status = -1;
  while (waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) return -1;
  }
  return status;
}

int exit_status(int status) {
  return status >= 0 && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace platform
