#include "keeper/volumes.h"

#include <fcntl.h>

#include <algorithm>
#include <string_view>

#include "common/fd.h"
#include "common/mounts.h"
#include "common/processes.h"
#include "common/program.h"
#include "keeper/attempt.h"
#include "sysaux.h"
#include "tree_layout.h"

namespace keeper {
namespace {

using platform::Session;
using platform::TreeReader;
using namespace remvol;

// A run that may unmount volumes of the target because somebody wants it to.
bool is_unmounting(const std::string& target) {
  return platform::runs(platform::kTool,
                        {"--disconnect", "--system_off", "--deinit", "--del", "--del_lun", "--format",
                         "--modify", "--modify_address"},
                        target);
}

// A run that may mount them.
bool is_mounting(const std::string& target) {
  return platform::runs(platform::kTool, {"--oiscsi_evt_recover", "--connect", "--add", "--init"}, target);
}

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
    if (!share.empty() && tree.number(0, key::kLunEnable, target, lun) == 1) {
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

// The session of a target that is wanted and connected; null when there is none.
const Session* session_of(const TreeReader& tree, int target, const std::vector<Session>& sessions) {
  if (tree.number(0, key::kTargetConnSet, target) == 0 ||
      tree.number(kDisconnected, key::kTargetConnState, target) != kConnected) {
    return nullptr;
  }
  const std::string name = tree.value(key::kTargetName, target);
  const auto found = std::find_if(sessions.begin(), sessions.end(), [&name](const Session& session) {
    return session.target == name && session.link == platform::Link::kUp;
  });
  return found == sessions.end() ? nullptr : &*found;
}

// A disk that nobody has for himself, as who checks or changes a file system does, and that shows one, or
// something else that is not overwritten.
bool is_ready(const std::string& disk) {
  const std::string node = "/dev/" + disk;
  char names[1024];
  char content[16];
  if (!platform::Fd(open(node.c_str(), O_RDONLY | O_EXCL | O_NONBLOCK | O_CLOEXEC)).ok() ||
      sys_get_partition_list(names, node.c_str()) <= 0) {
    return false;
  }
  for (std::string_view rest = names; !rest.empty();) {
    const size_t end = std::min(rest.find(','), rest.size());
    const std::string partition = "/dev/" + std::string(rest.substr(0, end));
    if (sys_get_fs_type(content, partition.c_str()) == 0) return true;
    rest.remove_prefix(std::min(end + 1, rest.size()));
  }
  return false;
}

bool can_connect(const TreeReader& tree, int target) {
  const std::vector<Session> sessions = platform::read_sessions();
  const Session* session = session_of(tree, target, sessions);
  if (session == nullptr) return false;
  const std::vector<platform::Mount> mounts = platform::read_mounts();
  const std::vector<Volume> volumes = volumes_of(tree, target);
  return std::all_of(volumes.begin(), volumes.end(), [&](const Volume& volume) {
    const int lun = tree.number(-1, key::kLunNumber, volume.target, volume.lun);
    const std::string disk = platform::running_disk(*session, lun);
    return !disk.empty() && (is_mounted(mounts, volume) || (is_normal(tree, volume) && is_ready(disk)));
  });
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
    if (session_of(tree, target, sessions) == nullptr) continue;
    const std::string name = tree.value(key::kTargetName, target);
    for (const Volume& volume : volumes_of(tree, target)) {
      const bool mounted = is_mounted(mounts, volume);
      if (!is_normal(tree, volume) || (!mounted && is_unmounting(name))) continue;
      wanted.push_back({volume.share, mounted, false, !mounted && is_mounting(name)});
    }
  }
  return wanted;
}

int mount_again(const std::string& share) {
  const TreeReader tree;
  const int target = target_of(tree, share);
  if (target == 0) return 1;
  const std::string name = tree.value(key::kTargetName, target);
  if (!can_connect(tree, target) || is_unmounting(name) || is_mounting(name)) return 1;
  return run_silently({"--connect", "-n", name.c_str()});
}

}  // namespace keeper
