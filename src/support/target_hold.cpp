#include "support/target_hold.h"

#include <unistd.h>

#include <cstring>

#include "support/format_semaphore.h"
#include "support/text.h"

namespace remvol {

namespace {

constexpr useconds_t kBriefPoll = 100000;  // microseconds
constexpr int kBriefPolls = 600;

// What this run holds; empty: nothing.
char held_target[256];

LockName target_lock(const char* target_name) {
  return hashed_lock_name(kTargetLock, target_name);
}

LockName lun_lock(const char* target_name, int lun) {
  return hashed_lock_name(Text<32>(kLunLock, lun), target_name);
}

// Returns whether this run did not hold the target before.
bool enter(const char* target_name) {
  if (strcmp(held_target, target_name) == 0) return false;
  copy_text(held_target, target_name);
  return true;
}

// Takes the lock. Returns whether it had to be waited for. Whoever holds it may itself wait for the format
// semaphore, of which this run may have kept hold.
bool take_waiting(RunLock* lock, const char* name, LockMode mode) {
  if (lock->try_take(name, mode) != LockTry::kBusy) return false;
  format_sem_release_leftover();
  lock->take(name, mode);
  return true;
}

}  // namespace

void mark_target(const char* target_name) {
  RunLock lock;
  (void)lock.try_take(target_lock(target_name), LockMode::kShared);
}

TargetHold::TargetHold(const char* target_name) : outermost_(enter(target_name)), held_(true) {
  if (outermost_) waited_ = take_waiting(&target_, target_lock(target_name), LockMode::kExclusive);
}

TargetHold::TargetHold(const char* target_name, int lun, HoldWait wait)
    : lun_number_(lun), outermost_(enter(target_name)) {
  held_ = !outermost_ || (target_.try_take(target_lock(target_name), LockMode::kShared) != LockTry::kBusy &&
                          lun_.try_take(lun_lock(target_name, lun), LockMode::kExclusive) != LockTry::kBusy);
  if (held_) return;
  target_.release();
  if (wait == HoldWait::kAtOnce) await();
}

void TargetHold::await() {
  if (held_) return;
  (void)take_waiting(&target_, target_lock(held_target), LockMode::kShared);
  (void)take_waiting(&lun_, lun_lock(held_target, lun_number_), LockMode::kExclusive);
  held_ = waited_ = true;
}

TargetHold::~TargetHold() {
  if (outermost_) held_target[0] = '\0';
}

BriefTargetHold::BriefTargetHold(const char* target_name, bool (*may_wait)(const char* target_name))
    : outermost_(enter(target_name)) {
  if (!outermost_) return;
  const LockName name = target_lock(target_name);
  for (int polls = 0; target_.try_take(name, LockMode::kExclusive) == LockTry::kBusy; polls++) {
    waited_ = true;
    given_up_ = polls == kBriefPolls || !may_wait(target_name);
    if (given_up_) return;
    usleep(kBriefPoll);
  }
}

BriefTargetHold::~BriefTargetHold() {
  if (outermost_) held_target[0] = '\0';
}

IdleTarget::IdleTarget(const char* target_name)
    : idle_(target_.try_existing(target_lock(target_name), LockMode::kExclusive) == LockTry::kTaken) {}

IdleTarget::IdleTarget(const char* target_name, int lun) {
  const LockTry target = target_.try_existing(target_lock(target_name), LockMode::kShared);
  idle_ = target == LockTry::kTaken &&
          lun_.try_take(lun_lock(target_name, lun), LockMode::kExclusive) != LockTry::kBusy;
}

}  // namespace remvol
