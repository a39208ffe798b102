// What the configuration tree says of targets and volumes.
#ifndef PLATFORM_VVSTAT_STATUS_H
#define PLATFORM_VVSTAT_STATUS_H

#include <string>
#include <vector>

#include "common/tree_listing.h"

namespace vvstat {

struct Volume {
  int lun = -1;
  std::string share;
  std::string status;  // the text of the tool
  bool enabled = false;
  bool read_only = false;
  int format_state = -1;  // a remvol::FormatState; -1: unknown
  int progress = 0;       // percent of the format
  int volume_state = -1;  // a remvol::VolumeState; -1: unknown
  std::string file_system;
  std::string device;
  std::string mount_point;
};

struct Target {
  std::string name;
  std::string address;
  int port = 0;
  bool wanted = false;     // it is to be connected at start-up
  int connect_state = -1;  // a remvol::ConnectState; -1: unknown
  std::string status;
  std::vector<Volume> volumes;
};

struct Status {
  bool reachable;  // false: the tree does not answer, and the list is empty
  std::vector<Target> targets;
};

Status read_status(const platform::TreeListing& tree);

}  // namespace vvstat

#endif
