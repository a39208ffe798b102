#include "support/disk_look.h"

namespace remvol {

namespace {

// Seconds. Whoever ends users may wait for udev with the lock held, which takes 5.
constexpr int kWaitForLooks = 5;
constexpr int kWaitToLook = 15;

void take(RunLock* lock, const char* node, LockMode mode, int seconds) {
  if (node[0] != '\0') lock->take_in_time(hashed_lock_name("look", node), mode, seconds);
}

}  // namespace

DiskLook::DiskLook(const char* node) {
  take(&lock_, node, LockMode::kShared, kWaitToLook);
}

DiskLooksHeldOff::DiskLooksHeldOff(const char* node) {
  take(&lock_, node, LockMode::kExclusive, kWaitForLooks);
}

}  // namespace remvol
