#include "support/target_hold.h"

#include <unistd.h>

#include <cstdint>
#include <cstring>

#include "support/format_semaphore.h"
#include "support/text.h"

namespace remvol {

namespace {

using LockName = Text<64>;

constexpr useconds_t kBriefPoll = 100000;  // microseconds
constexpr int kBriefPolls = 600;

// What this run holds; empty: nothing.
char held_target[256];

// A file name of fixed length for names of any form; the hash is FNV-1a.
uint64_t hash_of(const char* text) {
  uint64_t hash = 14695981039346656037U;
  for (; *text != '\0'; text++) hash = (hash ^ static_cast<unsigned char>(*text)) * 1099511628211U;
  return hash;
}

LockName target_lock(const char* target_name) {
  return LockName("target-%016llx.lock", static_cast<unsigned long long>(hash_of(target_name)));
}

LockName lun_lock(const char* target_name, int lun) {
  return LockName("target-%016llx-%d.lock", static_cast<unsigned long long>(hash_of(target_name)), lun);
}

// Takes the lock. Returns whether it had to be waited for. Who holds it may itself wait for the format
// semaphore, of which this run may have kept hold.
bool take_waiting(RunLock* lock, const char* name, LockMode mode) {
  if (lock->try_take(name, mode) != LockTry::kBusy) return false;
  format_sem_release_leftover();
  lock->take(name, mode);
  return true;
}

}  // namespace

bool TargetHold::enter(const char* target_name) {
  if (strcmp(held_target, target_name) == 0) return false;
  copy_text(held_target, target_name);
  outermost_ = true;
  return true;
}

TargetHold::TargetHold(const char* target_name) {
  if (enter(target_name)) waited_ = take_waiting(&target_, target_lock(target_name), LockMode::kExclusive);
}

TargetHold::TargetHold(const char* target_name, int lun) {
  if (!enter(target_name)) return;
  waited_ = take_waiting(&target_, target_lock(target_name), LockMode::kShared);
  waited_ |= take_waiting(&lun_, lun_lock(target_name, lun), LockMode::kExclusive);
}

TargetHold::~TargetHold() {
  if (outermost_) held_target[0] = '\0';
}

BriefTargetHold::BriefTargetHold(const char* target_name, bool (*may_wait)(int dbidx), int dbidx) {
  const LockName name = target_lock(target_name);
  for (int polls = 0; target_.try_take(name, LockMode::kExclusive) == LockTry::kBusy; polls++) {
    if (polls == kBriefPolls || !may_wait(dbidx)) return;
    usleep(kBriefPoll);
  }
}

IdleTarget::IdleTarget(const char* target_name)
    : idle_(target_.try_existing(target_lock(target_name), LockMode::kExclusive) == LockTry::kTaken) {}

IdleTarget::IdleTarget(const char* target_name, int lun) {
  const LockTry target = target_.try_existing(target_lock(target_name), LockMode::kShared);
  idle_ = target == LockTry::kTaken &&
          lun_.try_existing(lun_lock(target_name, lun), LockMode::kExclusive) != LockTry::kBusy;
}

}  // namespace remvol
