// What the configuration tree says of targets and volumes.
#ifndef PLATFORM_VVSTAT_STATUS_H
#define PLATFORM_VVSTAT_STATUS_H

#include <string>
#include <vector>

#include "common/tree_reader.h"

namespace vvstat {

struct Volume {
  int lun;
  std::string share;
  std::string status;  // the text of the tool
  bool enabled;
  bool read_only;
  int format_state;  // -1: unknown, 0: none, 1: running, 3: failed, 4: waiting
  int progress;      // percent of the format
  int volume_state;  // -1: unknown, 0: ready, 1: being created, 2: offline, 3: failed, 5: unsupported
  std::string file_system;
  std::string device;
  std::string mount_point;
};

struct Target {
  std::string name;
  std::string address;
  int port;
  bool wanted;        // it is to be connected at start-up
  int connect_state;  // -1: unknown, 0: disconnected, 1: connected, 2: connecting, 3: lost, 4: login failed
  std::string status;
  std::vector<Volume> volumes;
};

struct Status {
  bool reachable;  // false: the tree does not answer, and the list is empty
  std::vector<Target> targets;
};

// Values of connect_state, format_state and volume_state.
inline constexpr int kConnected = 1, kConnecting = 2, kRecovering = 3, kConnectError = 4;
inline constexpr int kFormatRunning = 1, kFormatFailed = 3, kFormatWaiting = 4;
inline constexpr int kBeingCreated = 1, kVolumeFailed = 3, kGivenUp = 4, kUnsupported = 5;

Status read_status(const platform::TreeReader& tree);

}  // namespace vvstat

#endif
