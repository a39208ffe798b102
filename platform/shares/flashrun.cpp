// flashrun: runs a command while the configuration flash is writable.
//
// Three processes, so that the flash is read-only again whatever is killed: flashrun itself, which only
// waits; a guard in a process group of its own, which runs the command and closes the flash behind it; the
// command, in flashrun's group. When flashrun is killed the guard goes on; when the guard is killed flashrun
// closes the flash.

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <initializer_list>

#include "begin.h"
#include "common/report.h"
#include "shares/flash.h"
#include "shares/settings_copy.h"

namespace {

using flash::kFlashFolder;
constexpr char kFlashSettings[] = "/usr/local/config/vv.xml";
constexpr int kTorn = 1, kUsage = 2, kCannotRun = 126, kNotFound = 127, kKilled = 128;

// The settings hold secrets. A copy that is there already keeps its mode when cp writes into it, so everybody
// but its owner is shut out before it gets new ones.
void protect_settings() {
  struct stat info = {};
  const int fd = open(kFlashSettings, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
  if (fd < 0) return;
  if (fstat(fd, &info) == 0 && S_ISREG(info.st_mode) && (info.st_mode & 077) != 0 &&
      fchmod(fd, info.st_mode & 0700) != 0) {
    platform::report(LOG_WARNING, "flashrun: %s stays readable for others: %s", kFlashSettings,
                     strerror(errno));
  }
  close(fd);
}

[[noreturn]] void exec_command(char** command) {
  protect_settings();
  if (command[1] == nullptr) {
    execl("/bin/sh", "sh", "-c", command[0], nullptr);
  } else {
    execvp(command[0], command);
  }
  const int error = errno;
  platform::report(LOG_WARNING, "flashrun: %s: %s", command[0], strerror(error));
  _exit(error == ENOENT ? kNotFound : kCannotRun);
}

// The signals that end flashrun are passed on to the command instead, and waited for like its end.
sigset_t awaited_signals() {
  sigset_t set;
  sigemptyset(&set);
  for (int number : {SIGCHLD, SIGTERM, SIGINT, SIGHUP, SIGQUIT}) sigaddset(&set, number);
  return set;
}

// Waits for `child` and passes signals on to it. Returns its wait status; of one that cannot be waited for,
// as if it could not be run.
int wait_for(pid_t child) {
  const sigset_t awaited = awaited_signals();
  for (;;) {
    int status = 0;
    const pid_t ended = waitpid(child, &status, WNOHANG);
    if (ended != 0) return ended == child ? status : kCannotRun << 8;
    const int number = sigwaitinfo(&awaited, nullptr);
    if (number > 0 && number != SIGCHLD) kill(child, number);
  }
}

int exit_status(int wait_status) {
  return WIFSIGNALED(wait_status) ? kKilled + WTERMSIG(wait_status) : WEXITSTATUS(wait_status);
}

void leave(flash::UserLock& lock) {
  if (!lock.leave(kFlashFolder)) {
    platform::report(LOG_WARNING, "flashrun: %s stays writable: %s", kFlashFolder, strerror(errno));
  }
}

// Starts the command in the process group `group`, waits for its end and puts back settings that it left
// torn. Returns an exit status. A command that is to take the place of this process where nothing has to be
// watched does so.
int run_command(char** command, pid_t group, const sigset_t& callers_mask, bool may_replace) {
  flash::SettingsCopy copy;
  const bool is_copy = copy.parse(command);
  flash::KeptSettings kept;
  const bool watched = is_copy || kept.keep() || !may_replace;
  const pid_t child = watched ? fork() : 0;
  if (child == 0) {
    setpgid(0, group);
    sigprocmask(SIG_SETMASK, &callers_mask, nullptr);
    if (is_copy) _exit(copy.run());
    exec_command(command);
  }
  if (child < 0) platform::report(LOG_WARNING, "flashrun: fork: %s", strerror(errno));
  const int status = child < 0 ? kCannotRun : exit_status(wait_for(child));
  return kept.settle() || status != 0 ? status : kTorn;
}

[[noreturn]] void run_guard(char** command, flash::UserLock& lock, const sigset_t& callers_mask) {
  const pid_t group = getpgrp();
  setpgid(0, 0);
  const int status = run_command(command, group, callers_mask, false);
  leave(lock);
  _exit(status);
}

}  // namespace

int main(int argc, char** argv) {
  remvol::begin();
  if (argc < 2) {
    fprintf(stderr, "usage: flashrun COMMAND-LINE | COMMAND ARGUMENT...\n");
    return kUsage;
  }
  char** command = argv + 1;
  const sigset_t awaited = awaited_signals();
  sigset_t callers_mask;
  sigprocmask(SIG_BLOCK, &awaited, &callers_mask);
  if (!flash::is_mount(kFlashFolder)) return run_command(command, getpgrp(), callers_mask, true);
  flash::UserLock lock;
  if (!lock.enter(kFlashFolder)) {
    platform::report(LOG_WARNING, "flashrun: %s cannot be made writable: %s", kFlashFolder, strerror(errno));
  }
  const pid_t guard = fork();
  if (guard == 0) run_guard(command, lock, callers_mask);
  const int status = guard > 0 ? wait_for(guard) : kCannotRun << 8;
  if (guard < 0) platform::report(LOG_WARNING, "flashrun: fork: %s", strerror(errno));
  if (guard < 0 || WIFSIGNALED(status)) leave(lock);
  return exit_status(status);
}
