#include "vvstat/status.h"

#include <algorithm>

#include "tree_layout.h"

namespace vvstat {
namespace {

using platform::TreeReader;
namespace key = remvol::key;

Volume read_volume(const TreeReader& tree, int target, int lun) {
  Volume volume{};
  volume.lun = tree.number(-1, key::kLunNumber, target, lun);
  volume.share = tree.value(key::kLunShare, target, lun);
  volume.status = tree.value(key::kLunStatus, target, lun);
  volume.enabled = tree.number(0, key::kLunEnable, target, lun) != 0;
  volume.read_only = tree.number(remvol::VOL_AC_RW, key::kLunAccessRight, target, lun) == remvol::VOL_AC_RO;
  volume.format_state = tree.number(-1, key::kLunFormatState, target, lun);
  volume.progress = std::clamp(tree.number(0, key::kLunFormatProgress, target, lun), 0, 100);
  volume.volume_state = tree.number(-1, key::kLunVolumeState, target, lun);
  volume.file_system = tree.value(key::kLunFsType, target, lun);
  volume.device = tree.value(key::kLunDev, target, lun);
  volume.mount_point = tree.value(key::kLunMnt, target, lun);
  return volume;
}

Target read_target(const TreeReader& tree, int index) {
  Target target{};
  target.name = tree.value(key::kTargetName, index);
  target.address = tree.value(key::kTargetIp, index);
  target.port = tree.number(0, key::kTargetPort, index);
  target.wanted = tree.number(0, key::kTargetConnSet, index) != 0;
  target.connect_state = tree.number(-1, key::kTargetConnState, index);
  target.status = tree.value(key::kTargetStatus, index);
  for (int lun = 1; lun <= remvol::kMaxLunsPerTarget; lun++) {
    if (tree.value(key::kLunNumber, index, lun).empty()) break;
    target.volumes.push_back(read_volume(tree, index, lun));
  }
  return target;
}

}  // namespace

Status read_status(const TreeReader& tree) {
  Status status{tree.answered(), {}};
  for (int index = 1; index <= remvol::kMaxTargets; index++) {
    if (tree.value(key::kTargetName, index).empty()) break;
    status.targets.push_back(read_target(tree, index));
  }
  return status;
}

}  // namespace vvstat
