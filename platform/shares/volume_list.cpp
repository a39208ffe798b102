#include "shares/volume_list.h"

#include <fcntl.h>
#include <sys/stat.h>

#include "common/tree_reader.h"
#include "tree_layout.h"

namespace shares {
namespace {

namespace key = remvol::key;

bool keeps_user_attributes(const std::string& file_system) {
  return file_system != "vfat";
}

// Why a volume is not mounted that should be; null when nothing is wrong.
const char* failure_of(const platform::TreeReader& tree, int target, int lun) {
  if (tree.number(0, key::kTargetConnState, target) != remvol::kConnected) return nullptr;
  if (tree.number(0, key::kLunEnable, target, lun) == 0) return nullptr;
  switch (tree.number(0, key::kLunVolumeState, target, lun)) {
    case remvol::kVolumeFailed:
      return "it could not be made or mounted";
    case remvol::kVolumeLost:
      return "its target showed no disk of it";
    case remvol::kVolumeUnsupported:
      return "its file system is not supported";
    default:
      return nullptr;
  }
}

void add_volume(const platform::TreeReader& tree, int target, int lun, std::vector<SharedVolume>& volumes) {
  const std::string name = tree.value(key::kLunShare, target, lun);
  const std::string path = remvol::kMountRoot + name;
  if (name.empty()) return;
  if (!is_mounted(path)) {
    volumes.push_back({name, path, true, false, false, failure_of(tree, target, lun)});
    return;
  }
  const bool writable =
      tree.number(remvol::VOL_AC_RW, key::kLunAccessRight, target, lun) != remvol::VOL_AC_RO;
  const std::string type = tree.value(key::kLunFsType, target, lun);
  volumes.push_back({name, path, !writable, keeps_user_attributes(type), true, nullptr});
}

}  // namespace

bool is_mounted(const std::string& path) {
  struct statx entry {};
  return statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, STATX_TYPE, &entry) == 0 &&
         (entry.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

bool read_volumes(std::vector<SharedVolume>& volumes) {
  const platform::TreeReader tree;
  if (!tree.answered()) return false;
  // The slots in use are the first ones; one that was damaged must not hide those behind it.
  for (int target = 1; target <= remvol::kMaxTargets; target++) {
    if (tree.value(key::kTargetName, target).empty()) continue;
    for (int lun = 1; lun <= remvol::kMaxLunsPerTarget; lun++) {
      if (tree.value(key::kLunNumber, target, lun).empty()) continue;
      add_volume(tree, target, lun, volumes);
    }
  }
  return true;
}

}  // namespace shares
