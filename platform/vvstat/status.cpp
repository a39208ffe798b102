#include "vvstat/status.h"

#include <algorithm>

#define TARGET "/iscsi/initiator/id:%d/"
#define LUN TARGET "lun/id:%d/"

namespace vvstat {
namespace {

using platform::TreeReader;

Volume read_volume(const TreeReader& tree, int target, int lun) {
  Volume volume{};
  volume.lun = tree.number(-1, LUN "lun", target, lun);
  volume.share = tree.value(LUN "share", target, lun);
  volume.status = tree.value(LUN "status", target, lun);
  volume.enabled = tree.number(0, LUN "enable", target, lun) != 0;
  volume.read_only = tree.number(1, LUN "vol_access_right", target, lun) == 0;
  volume.format_state = tree.number(-1, LUN "format_state", target, lun);
  volume.progress = std::clamp(tree.number(0, LUN "format_progress", target, lun), 0, 100);
  volume.volume_state = tree.number(-1, LUN "volume_state", target, lun);
  volume.file_system = tree.value(LUN "fs_type", target, lun);
  volume.device = tree.value(LUN "dev", target, lun);
  volume.mount_point = tree.value(LUN "mnt", target, lun);
  return volume;
}

Target read_target(const TreeReader& tree, int index) {
  Target target{};
  target.name = tree.value(TARGET "target", index);
  target.address = tree.value(TARGET "ip", index);
  target.port = tree.number(0, TARGET "port", index);
  target.wanted = tree.number(0, TARGET "conn_set", index) != 0;
  target.connect_state = tree.number(-1, TARGET "conn_state", index);
  target.status = tree.value(TARGET "status", index);
  for (int lun = 1; lun <= platform::kLuns; lun++) {
    if (tree.value(LUN "lun", index, lun).empty()) break;
    target.volumes.push_back(read_volume(tree, index, lun));
  }
  return target;
}

}  // namespace

Status read_status(const TreeReader& tree) {
  Status status{tree.answered(), {}};
  for (int index = 1; index <= platform::kTargets; index++) {
    if (tree.value(TARGET "target", index).empty()) break;
    status.targets.push_back(read_target(tree, index));
  }
  return status;
}

}  // namespace vvstat
