#include "iscsi/daemon.h"

#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "support/command.h"
#include "support/files.h"
#include "support/text.h"
#include "sysaux.h"

namespace remvol {

namespace {

// Returns whether the process that `pid_file` names is a ktree.
bool find_tree_daemon(const char* pid_file, pid_t* pid) {
  char text[32] = "";
  File file(fopen(pid_file, "re"));
  if (file == nullptr || fgets(text, sizeof text, file.get()) == nullptr) return false;
  const long long number = str2ll(text);
  if (number <= 1 || number > INT_MAX) return false;
  *pid = static_cast<pid_t>(number);
  file.reset(fopen(Text<64>("/proc/%d/comm", *pid), "re"));
  return file != nullptr && fgets(text, sizeof text, file.get()) != nullptr && strcmp(text, "ktree\n") == 0;
}

CommandText start_tree_command(const char* socket) {
  return CommandText("ktree -n config -s %s 1>/dev/null 2>/dev/null &", socket);
}

}  // namespace

// When iscsid (2.1.8) ends on a SIGTERM it sends the signal on to its whole process group. Started in the
// group of the script that runs the tool, it would take that script and its other children along, this
// tool's tree daemon among them. The tool itself may be a session leader, which cannot change its group, so a
// child does.
int start_daemon(const char* command) {
  fflush(stdout);
  const pid_t child = fork();
  if (child < 0) return run_command(command);
  if (child == 0) {
    setpgid(0, 0);
    _exit(run_command(command) == 0 ? EXIT_SUCCESS : EXIT_FAILURE);
  }
  int status = 0;
  while (waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) return -1;
  }
  return status;
}

void start_tree_daemon(const char* socket) {
  (void)start_daemon(start_tree_command(socket));
  sleep(1);
}

bool stop_tree_daemon(const char* pid_file) {
  // dash, and bash as sh, know the signal only as TERM, and say so.
  if (const ErrorsHidden hidden; System("%s", stop_tree_command(pid_file).c_str()) == 0) return true;
  pid_t pid = 0;
  return find_tree_daemon(pid_file, &pid) && kill(pid, SIGTERM) == 0;
}

CommandText stop_tree_command(const char* pid_file) {
  return CommandText("kill -SIGTERM `cat %s`", pid_file);
}

CommandText load_tree_command(const char* socket, const char* file) {
  return CommandText("ktreec -S %s -l %s", socket, file);
}

}  // namespace remvol
