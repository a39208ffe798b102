#include "shares/volume_list.h"

#include <fcntl.h>
#include <sys/stat.h>

#include "common/tree_reader.h"

namespace shares {
namespace {

constexpr char kMountRoot[] = "/mnt/VV/";

bool keeps_user_attributes(const std::string& file_system) {
  return file_system != "vfat";
}

// Why a volume that is not mounted should be; null when nothing is wrong with that.
const char* failure_of(const platform::TreeReader& tree, int target, int lun) {
  constexpr int kConnected = 1, kFailed = 3, kUnsupported = 5;
  if (tree.number(0, "/iscsi/initiator/id:%d/conn_state", target) != kConnected) return nullptr;
  if (tree.number(0, "/iscsi/initiator/id:%d/lun/id:%d/enable", target, lun) == 0) return nullptr;
  switch (tree.number(0, "/iscsi/initiator/id:%d/lun/id:%d/volume_state", target, lun)) {
    case kFailed:
      return "it could not be made or mounted";
    case kUnsupported:
      return "its file system is not supported";
    default:
      return nullptr;
  }
}

void add_volume(const platform::TreeReader& tree, int target, int lun, std::vector<SharedVolume>& volumes) {
  const std::string name = tree.value("/iscsi/initiator/id:%d/lun/id:%d/share", target, lun);
  const std::string path = kMountRoot + name;
  if (name.empty()) return;
  if (!is_mounted(path)) {
    volumes.push_back({name, path, true, false, false, failure_of(tree, target, lun)});
    return;
  }
  const bool writable = tree.number(1, "/iscsi/initiator/id:%d/lun/id:%d/vol_access_right", target, lun) != 0;
  const std::string type = tree.value("/iscsi/initiator/id:%d/lun/id:%d/fs_type", target, lun);
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
  for (int target = 1; target <= platform::kTargets; target++) {
    if (tree.value("/iscsi/initiator/id:%d/target", target).empty()) continue;
    for (int lun = 1; lun <= platform::kLuns; lun++) {
      if (tree.value("/iscsi/initiator/id:%d/lun/id:%d/lun", target, lun).empty()) continue;
      add_volume(tree, target, lun, volumes);
    }
  }
  return true;
}

}  // namespace shares
