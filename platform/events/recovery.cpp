#include "events/recovery.h"

#include <fcntl.h>
#include <unistd.h>

#include "common/processes.h"
#include "common/program.h"
#include "run_files.h"
#include "tree_layout.h"

namespace events {
namespace {

using platform::kTool;
using platform::runs;
using platform::TreeReader;

constexpr char kWholeTree[] = "/";

// 0: the tree has no such target.
int slot_of(const TreeReader& tree, const std::string& target) {
  for (int n = 1; n <= remvol::kMaxTargets; n++) {
    if (tree.value(remvol::key::kTargetName, n) == target) return n;
  }
  return 0;
}

// A target that was taken out meanwhile is not lost.
bool is_lost(const TreeReader& tree, const std::string& target) {
  const int n = slot_of(tree, target);
  return n != 0 && tree.number(0, remvol::key::kTargetConnSet, n) != 0 &&
         tree.number(remvol::kDisconnected, remvol::key::kTargetConnState, n) == remvol::kRecovering;
}

// A run that recovers goes on with what is queued, and nothing names the target that it has taken from there.
bool is_recovering() {
  const int fd = open(remvol::kRecoverLock, O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;
  struct flock lock {};
  lock.l_type = F_WRLCK;
  lock.l_whence = SEEK_SET;
  const bool held = fcntl(fd, F_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
  close(fd);
  return held;
}

// Whatever names the target is at it, also a run that waits before it begins.
bool is_at_work(const std::string& target) {
  return runs(kTool, {target}) || is_recovering();
}

}  // namespace

bool is_others(const TreeReader& tree, const std::string& target) {
  return !tree.value(remvol::key::kVersion).empty() && slot_of(tree, target) == 0;
}

Recovery recovery_of(const std::string& target) {
  const TreeReader tree(remvol::kVolumesSocket, kWholeTree);
  if (!tree.answered()) return Recovery::kUnderWay;
  if (!is_lost(tree, target)) return Recovery::kOver;
  return is_at_work(target) ? Recovery::kUnderWay : Recovery::kMissing;
}

}  // namespace events
