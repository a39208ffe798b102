#include "support/disk_look.h"

namespace remvol {

namespace {

constexpr int kWait = 5;  // seconds

void take(RunLock* lock, const char* node, LockMode mode) {
  if (node[0] != '\0') lock->take_in_time(hashed_lock_name("look", node), mode, kWait);
}

}  // namespace

DiskLook::DiskLook(const char* node) {
  take(&lock_, node, LockMode::kShared);
}

DiskLooksHeldOff::DiskLooksHeldOff(const char* node) {
  take(&lock_, node, LockMode::kExclusive);
}

}  // namespace remvol
