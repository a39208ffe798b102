#include "iscsi/result_daemon.h"

#include <unistd.h>

#include "frontend/log.h"
#include "iscsi/daemon.h"
#include "ktreec.h"
#include "support/files.h"

namespace remvol {

namespace {

void stop(const ResultDaemon& daemon) {
  if (stop_tree_daemon(daemon.pid_file)) return;
  LOG(0, "system() of cmd '%s' failed", stop_tree_command(daemon.pid_file).c_str());
}

}  // namespace

const char* open_results(const ResultDaemon& daemon, const char* output_file) {
  if (output_file == nullptr) return nullptr;
  if (check_path_exist(daemon.socket) == 0) {
    stop(daemon);
    sleep(1);
    (void)_remove_file(daemon.socket);
    (void)_remove_file(daemon.pid_file);
  }
  start_tree_daemon(daemon.socket);
  return daemon.socket;
}

void close_results(const ResultDaemon& daemon, const char* socket, const char* output_file) {
  if (output_file == nullptr) return;
  if (ktreec_dump(socket, 0, output_file) != 0 && socket != nullptr) {
    LOG(0, "ktreec_dump(%s) failed", output_file);
  }
  stop(daemon);
}

}  // namespace remvol
