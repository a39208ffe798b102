#include "iscsi/result_daemon.h"

#include <unistd.h>

#include "frontend/request.h"
#include "iscsi/daemon.h"
#include "ktreec.h"
#include "support/files.h"

namespace remvol {

namespace {

void stop(const ResultDaemon& daemon, Caller caller) {
  if (stop_tree_daemon(daemon.pid_file)) return;
  LOG_AT(caller, 0, "system() of cmd 'kill -SIGTERM `cat %s`' failed", daemon.pid_file);
}

}  // namespace

const char* open_results(const ResultDaemon& daemon, Caller caller) {
  if (output_file == nullptr) return nullptr;
  if (check_path_exist(daemon.socket) == 0) {
    stop(daemon, caller);
    sleep(1);
    _remove_file(daemon.socket);
    _remove_file(daemon.pid_file);
  }
  start_tree_daemon(daemon.socket, caller);
  return daemon.socket;
}

void close_results(const ResultDaemon& daemon, const char* socket, Caller caller) {
  if (output_file == nullptr) return;
  ktreec_dump(socket, 0, output_file);
  stop(daemon, caller);
}

}  // namespace remvol
