// What the configuration tree says of targets and volumes.
#ifndef PLATFORM_VVSTAT_STATUS_H
#define PLATFORM_VVSTAT_STATUS_H

#include <string>
#include <vector>

namespace vvstat {

struct Volume {
  int lun;
  std::string share;
  std::string status;  // the text of the tool
  bool enabled;
  bool read_only;
  int format_state;         // -1: unknown, 0: none, 1: running, 3: failed, 4: waiting
  int progress;             // percent of the format
  int volume_state;         // -1: unknown, 0: ready, 1: being created, 2: offline, 3: failed, 5: unsupported
  unsigned long long used;  // bytes, 0 while it is not mounted
  unsigned long long size;
  std::string file_system;
  std::string device;
  std::string mount_point;
};

struct Target {
  std::string name;
  std::string address;
  int port;
  bool wanted;        // it should be connected
  int connect_state;  // -1: unknown, 0: disconnected, 1: connected, 2: connecting, 3: recovering, 4: error
  std::string status;
  std::vector<Volume> volumes;
};

struct Status {
  bool reachable;  // false: the tree does not answer, and the list is empty
  std::vector<Target> targets;
};

inline constexpr int kFormatRunning = 1;
inline constexpr int kRecovering = 3;

Status read_status();

bool is_connected(const Target& target);

// True when every target that should be connected is.
bool all_connected(const Status& status);

}  // namespace vvstat

#endif
