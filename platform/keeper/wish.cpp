#include "keeper/wish.h"

#include <fcntl.h>
#include <sys/file.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>

#include "common/fd.h"
#include "keeper/tool_runs.h"
#include "ktree/client/calls.h"
#include "run_files.h"
#include "tree_layout.h"

namespace keeper {
namespace {

using platform::TreeReader;
using namespace remvol;

// Stores the number at the path that printf(format, ...) would print.
__attribute__((format(printf, 2, 3))) void store(int number, const char* format, ...) {
  char path[128];
  va_list slots;
  va_start(slots, format);
  vsnprintf(path, sizeof path, format, slots);
  va_end(slots);
  (void)ktree::client::set(kVolumesSocket, path, std::to_string(number).c_str());
}

bool is_wanted(const TreeReader& tree, int target) {
  return tree.number(0, key::kTargetConnSet, target) != 0;
}

// The volumes of a target in one of the states that a target which is given up has: kVolumeLost at start-up,
// kVolumeFailed otherwise. Also those that could not be mounted. A bit for each slot.
unsigned failed_volumes(const TreeReader& tree, int target) {
  unsigned failed = 0;
  for (int lun = 1; lun <= kMaxLunsPerTarget; lun++) {
    const int state = tree.number(kVolumeNormal, key::kLunVolumeState, target, lun);
    if (state == kVolumeFailed || state == kVolumeLost) failed |= 1U << lun;
  }
  return failed;
}

bool has_lost_volume(const TreeReader& tree, int target) {
  int lun = 1;
  while (lun <= kMaxLunsPerTarget &&
         tree.number(kVolumeNormal, key::kLunVolumeState, target, lun) != kVolumeLost) {
    lun++;
  }
  return lun <= kMaxLunsPerTarget;
}

bool has_session(const std::vector<platform::Session>& sessions, const std::string& target) {
  return std::any_of(sessions.begin(), sessions.end(),
                     [&target](const platform::Session& session) { return session.target == target; });
}

}  // namespace

// By what is stored now, while no target moves to another slot.
void want_again(const std::string& target) {
  const std::string path = std::string(kRunDir) + "/" + kSlotsLock;
  const platform::Fd slots(open(path.c_str(), O_RDWR | O_NOFOLLOW | O_CLOEXEC));
  while (slots.ok() && flock(slots.get(), LOCK_SH) != 0 && errno == EINTR) continue;
  const TreeReader tree;
  for (int n = 1; n <= kMaxTargets; n++) {
    if (tree.value(key::kTargetName, n) != target || is_wanted(tree, n)) continue;
    // The wish first: it is what must not be lost when the tree goes.
    store(1, key::kTargetConnSet, n);
    store(kConnectError, key::kTargetConnState, n);
    const unsigned failed = failed_volumes(tree, n);
    for (int m = 1; m <= kMaxLunsPerTarget; m++) {
      if ((failed >> m & 1U) != 0) store(kVolumeOffline, key::kLunVolumeState, n, m);
    }
  }
}

bool Wishes::look(const TreeReader& tree, const std::vector<platform::Session>& sessions, bool starting) {
  first_ = first_ || starting;
  std::map<std::string, unsigned> wanted;
  bool changed = false;
  for (int n = 1; n <= kMaxTargets; n++) {
    const std::string name = tree.value(key::kTargetName, n);
    if (name.empty()) break;
    const bool wish = is_wanted(tree, n);
    const unsigned failed = failed_volumes(tree, n);
    const auto before = wanted_.find(name);
    const bool was_wanted = before != wanted_.end();
    if (was_wanted && wish && failed == before->second && has_session(sessions, name)) {
      wanted.insert(*before);  // nothing has changed, so that nobody needs to be looked for
    } else if (is_unwanted(name)) {
      continue;
    } else if (first_ && !wish && has_lost_volume(tree, n)) {
      want_again(name);
      changed = true;
    } else if (is_busy(name)) {  // what is between two steps counts when they are done
      if (was_wanted || (first_ && wish)) wanted[name] = was_wanted ? before->second : failed;
    } else if (wish) {
      wanted[name] = failed;
    } else if (was_wanted && (failed & ~before->second) != 0) {
      want_again(name);
      wanted[name] = 0;
      changed = true;
    }
  }
  wanted_ = std::move(wanted);
  first_ = starting;
  return changed;
}

}  // namespace keeper
