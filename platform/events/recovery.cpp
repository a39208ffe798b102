#include "events/recovery.h"

#include "common/processes.h"
#include "common/start.h"
#include "common/tree_reader.h"
#include "tree_layout.h"

namespace events {
namespace {

using platform::kTool;
using platform::runs;
using platform::TreeReader;

constexpr char kWholeTree[] = "/";

// A target that was taken out meanwhile is not lost.
bool is_lost(const TreeReader& tree, const std::string& target) {
  for (int n = 1; n <= remvol::kMaxTargets; n++) {
    if (tree.value(remvol::key::kTargetName, n) != target) continue;
    return tree.number(0, remvol::key::kTargetConnSet, n) != 0 &&
           tree.number(remvol::kDisconnected, remvol::key::kTargetConnState, n) == remvol::kRecovering;
  }
  return false;
}

bool is_queued(const TreeReader& tree, const std::string& target) {
  for (int q = 1; q <= remvol::kMaxRecoverQueue; q++) {
    if (tree.value(remvol::key::kRecoverName, q) == target) return true;
  }
  return false;
}

// Whatever names the target is at it, also a run that waits before it begins. What is queued is recovered by
// any run that recovers.
bool is_at_work(const TreeReader& tree, const std::string& target) {
  return runs(kTool, {target}) || (is_queued(tree, target) && runs(kTool, {"--oiscsi_evt_recover"}));
}

}  // namespace

Recovery recovery_of(const std::string& target) {
  const TreeReader tree(remvol::kVolumesSocket, kWholeTree);
  if (!tree.answered()) return Recovery::kUnderWay;
  if (!is_lost(tree, target)) return Recovery::kOver;
  return is_at_work(tree, target) ? Recovery::kUnderWay : Recovery::kMissing;
}

}  // namespace events
