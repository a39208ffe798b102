#include "support/command.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>

namespace remvol {

int run_command(const char* command, Weight failure) {
  const int status = system(command);
  if (status != 0) LOG(failure, "system() of cmd '%s' failed", command);
  return status;
}

// Each has some faults at its start. It is the kernel that counts, so whoever runs a command need not.
long command_mark() {
  rusage children = {};
  getrusage(RUSAGE_CHILDREN, &children);
  return children.ru_minflt;
}

ErrorsHidden::ErrorsHidden() : kept_(fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1)) {
  const int nowhere = kept_ >= 0 ? open("/dev/null", O_WRONLY | O_CLOEXEC) : -1;
  if (nowhere < 0) return;
  dup2(nowhere, STDERR_FILENO);
  close(nowhere);
}

ErrorsHidden::~ErrorsHidden() {
  if (kept_ < 0) return;
  dup2(kept_, STDERR_FILENO);
  close(kept_);
}

int command_exit_code(int status) {
  return (status >> 8) & 0xff;
}

void log_command_status(int status) {
  const int exited = (status & 0x7f) == 0 ? 1 : 0;
  LOG(2, "!!!ret=%d, WIFEXITED=%d, WEXITSTATUS=%d", status, exited, command_exit_code(status));
}

int process_system_cmd_mt(const char* command, int cycles, int max_wait_us) {
  const LogScope scope;
  srand(static_cast<unsigned>(time(nullptr)));
  int status = 0;
  for (int cycle = 0; cycle < cycles; cycle++) {
    if (cycle > 0 && max_wait_us >= 2) {
      const int wait = rand() % max_wait_us;
      LOG(kNote, "retry cmd : cycle = %d, time = %d", cycle, wait);
      usleep(static_cast<useconds_t>(wait));
    }
    status = run_command(command, kNote);
    if (status == 0) return 0;
    log_command_status(status);
  }
  return status;
}

}  // namespace remvol
