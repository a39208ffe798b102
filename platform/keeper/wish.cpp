#include "keeper/wish.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>

#include "common/fd.h"
#include "common/tree_reader.h"
#include "ktree/client/calls.h"
#include "run_files.h"

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

}  // namespace

void want_again(const std::string& target, VolumeState given_up) {
  const std::string path = std::string(kRunDir) + "/" + kSlotsLock;
  const platform::Fd slots(open(path.c_str(), O_RDWR | O_NOFOLLOW | O_CLOEXEC));
  while (slots.ok() && flock(slots.get(), LOCK_SH) != 0 && errno == EINTR) continue;
  const TreeReader tree;
  for (int n = 1; n <= kMaxTargets; n++) {
    if (!target.empty() && tree.value(key::kTargetName, n) != target) continue;
    if (tree.number(1, key::kTargetConnSet, n) != 0) continue;
    for (int m = 1; m <= kMaxLunsPerTarget; m++) {
      if (tree.number(kVolumeNormal, key::kLunVolumeState, n, m) != given_up) continue;
      store(kVolumeOffline, key::kLunVolumeState, n, m);
      store(kConnectError, key::kTargetConnState, n);
      store(1, key::kTargetConnSet, n);
    }
  }
}

}  // namespace keeper
