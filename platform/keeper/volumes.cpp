#include "keeper/volumes.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <string_view>

#include "common/fd.h"
#include "common/mounts.h"
#include "common/processes.h"
#include "common/program.h"
#include "keeper/attempt.h"
#include "keeper/tool_runs.h"
#include "sysaux.h"
#include "tree_layout.h"

namespace keeper {
namespace {

using platform::Session;
using platform::TreeReader;
using namespace remvol;

// A volume that stands in the settings.
struct Volume {
  int target, lun;  // its slots
  std::string share;
};

// The volumes that are switched on, of the target in a slot.
std::vector<Volume> volumes_of(const TreeReader& tree, int target) {
  std::vector<Volume> volumes;
  for (int lun = 1; lun <= kMaxLunsPerTarget; lun++) {
    const std::string share = tree.value(key::kLunShare, target, lun);
    if (!share.empty() && tree.number(0, key::kLunEnable, target, lun) != 0) {
      volumes.push_back({target, lun, share});
    }
  }
  return volumes;
}

bool is_normal(const TreeReader& tree, const Volume& volume) {
  return tree.number(kVolumeFailed, key::kLunVolumeState, volume.target, volume.lun) == kVolumeNormal &&
         tree.number(kFormatting, key::kLunFormatState, volume.target, volume.lun) == kFormatIdle;
}

bool is_mounted(const std::vector<platform::Mount>& mounts, const Volume& volume) {
  return platform::mount_on(mounts, kMountRoot + volume.share) != nullptr;
}

// The session of a target that is connected; null when there is none that works, or several, whose disks are
// the same ones under other names.
const Session* session_of(const TreeReader& tree, int target, const std::vector<Session>& sessions) {
  if (tree.number(kDisconnected, key::kTargetConnState, target) != kConnected) return nullptr;
  const std::string name = tree.value(key::kTargetName, target);
  const Session* found = nullptr;
  for (const Session& session : sessions) {
    if (session.target != name) continue;
    if (found != nullptr || session.link != platform::Link::kUp) return nullptr;
    found = &session;
  }
  return found;
}

// The partitions of a disk, such as /dev/sdb1, as the tool takes them.
std::vector<std::string> partitions_of(const std::string& disk) {
  char names[1024];
  std::vector<std::string> partitions;
  if (sys_get_partition_list(names, disk.c_str()) <= 0) return partitions;
  for (std::string_view rest = names; !rest.empty();) {
    const size_t end = std::min(rest.find(','), rest.size());
    partitions.push_back("/dev/" + std::string(rest.substr(0, end)));
    rest.remove_prefix(std::min(end + 1, rest.size()));
  }
  return partitions;
}

// Whether one of the partitions is what is mounted there.
bool is_mounted_from(const std::vector<platform::Mount>& mounts, const Volume& volume,
                     const std::vector<std::string>& partitions) {
  const platform::Mount* mount = platform::mount_on(mounts, kMountRoot + volume.share);
  struct stat node {};
  return mount != nullptr &&
         std::any_of(partitions.begin(), partitions.end(), [mount, &node](const std::string& partition) {
           return stat(partition.c_str(), &node) == 0 && node.st_rdev == mount->device;
         });
}

bool is_free(const std::string& disk) {
  return platform::Fd(open(disk.c_str(), O_RDONLY | O_EXCL | O_NONBLOCK | O_CLOEXEC)).ok();
}

// Whether the disk can be mounted from: nobody has it for himself, as who checks a file system does, nor
// open; and the partition that the tool takes shows something, which does not say that it wants a check. An
// ext file system says so also while another machine has it mounted.
bool is_ready(const std::string& disk, const std::vector<std::string>& partitions) {
  char content[16];
  if (!is_free(disk) || platform::has_open(disk)) return false;
  const auto first = std::find_if(
      partitions.begin(), partitions.end(),
      [&content](const std::string& partition) { return sys_get_fs_type(content, partition.c_str()) == 0; });
  return first != partitions.end() && sys_check_fs_state(first->c_str()) == 0;
}

// The volume's disk, such as /dev/sdb; empty when none runs.
std::string disk_of(const TreeReader& tree, const Session& session, const Volume& volume) {
  const int lun = tree.number(-1, key::kLunNumber, volume.target, volume.lun);
  const std::string name = platform::running_disk(session, lun);
  return name.empty() ? name : "/dev/" + name;
}

// Whether the volume is mounted, or would be by a connection, and no more would happen to it.
bool is_safe(const TreeReader& tree, const Session& session, const Volume& volume) {
  const std::string disk = disk_of(tree, session, volume);
  if (disk.empty()) return false;
  const std::vector<std::string> partitions = partitions_of(disk);
  const std::vector<platform::Mount> mounts = platform::read_mounts();
  if (is_mounted_from(mounts, volume, partitions)) return true;
  return !is_mounted(mounts, volume) && is_normal(tree, volume) && is_ready(disk, partitions);
}

bool can_connect(const TreeReader& tree, int target) {
  const std::vector<Session> sessions = platform::read_sessions();
  const Session* session = session_of(tree, target, sessions);
  const std::vector<Volume> volumes = volumes_of(tree, target);
  return session != nullptr && tree.number(0, key::kTargetConnSet, target) != 0 &&
         std::all_of(volumes.begin(), volumes.end(),
                     [&](const Volume& volume) { return is_safe(tree, *session, volume); });
}

// Whether somebody works on the disk of a volume that is not mounted. The tool looks at it for its texts, and
// udev whenever something happens to it.
bool has_stranger(const std::string& disk) {
  return !disk.empty() &&
         platform::has_open(disk, {platform::kTool, "remvol-keeper", "(udev-worker)", "systemd-udevd"});
}

// The slot of the target that has a volume of that share; 0 when there is none.
int target_of(const TreeReader& tree, const std::string& share) {
  for (int target = 1; target <= kMaxTargets; target++) {
    for (const Volume& volume : volumes_of(tree, target)) {
      if (volume.share == share) return target;
    }
  }
  return 0;
}

}  // namespace

std::vector<Wanted> wanted_volumes(const TreeReader& tree, const std::vector<Session>& sessions) {
  const std::vector<platform::Mount> mounts = platform::read_mounts();
  std::vector<Wanted> wanted;
  for (int target = 1; target <= kMaxTargets; target++) {
    if (tree.number(0, key::kTargetConnSet, target) == 0) continue;
    const Session* session = session_of(tree, target, sessions);
    const std::string name = tree.value(key::kTargetName, target);
    for (const Volume& volume : volumes_of(tree, target)) {
      Wanted one = {.name = volume.share, .connected = is_mounted(mounts, volume)};
      one.is_unclear = session == nullptr;
      if (!is_normal(tree, volume) || (!one.connected && is_unmounting(name))) continue;
      if (!one.connected && !one.is_unclear) {
        one.at_work = is_brought_up(name);
        one.is_taken = !one.at_work && has_stranger(disk_of(tree, *session, volume));
      }
      wanted.push_back(one);
    }
  }
  return wanted;
}

int mount_again(const std::string& share) {
  if (!end_with_keeper()) return 1;
  const TreeReader tree;
  const int target = target_of(tree, share);
  if (target == 0) return 1;
  const std::string name = tree.value(key::kTargetName, target);
  if (!can_connect(tree, target) || is_unmounting(name) || is_brought_up(name)) return 1;
  return bring_up("--connect", name);
}

}  // namespace keeper
