// The private tree daemon of a search that was given an output file. It holds the results of that search
// alone and ends with it. Its socket and pid file have fixed names, so two searches of one kind with output
// files must not run at once.
#ifndef REMVOL_ISCSI_RESULT_DAEMON_H
#define REMVOL_ISCSI_RESULT_DAEMON_H

namespace remvol {

struct ResultDaemon {
  const char* socket;
  const char* pid_file;
};

inline constexpr ResultDaemon kTargetResults = {"/var/run/ktree_sock_vv_search",
                                                "/var/run/ktree_sock_vv_search_config.pid"};
inline constexpr ResultDaemon kLunResults = {"/var/run/ktree_sock_vv_search_lun",
                                             "/var/run/ktree_sock_vv_search_lun_config.pid"};

// With an output file (not null): starts the daemon, after stopping one that an earlier search left behind,
// and returns its socket. Without one: returns null, the client library's default tree.
[[nodiscard]] const char* open_results(const ResultDaemon& daemon, const char* output_file);

// With an output file: dumps the tree behind `socket` into it and stops the daemon.
void close_results(const ResultDaemon& daemon, const char* socket, const char* output_file);

}  // namespace remvol

#endif
