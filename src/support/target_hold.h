// Bringing a target up, one run after another.
//
// Every run that logs a target in, makes its node record, or formats or mounts one of its LUNs holds the
// target meanwhile. A run that takes something away holds it when that can be had soon, and goes on without
// when it cannot: it may end a format. A run that was killed holds nothing, and what it left half done can be
// told by that.
#ifndef REMVOL_SUPPORT_TARGET_HOLD_H
#define REMVOL_SUPPORT_TARGET_HOLD_H

#include "support/run_lock.h"

namespace remvol {

// Leaves a sign that a run works on the target, for IdleTarget.
void mark_target(const char* target_name);

enum class HoldWait { kAtOnce, kLater };

class TargetHold {
 public:
  // For the whole target. Waits for every run that brings it, or a LUN of it, up. A target that this run
  // holds already is held on.
  explicit TargetHold(const char* target_name);

  // For one LUN of the target. Runs that bring other LUNs of it up go on meanwhile. With kLater the LUN is
  // held from now on where no run is in the way, and everywhere once await() has waited for those.
  TargetHold(const char* target_name, int lun, HoldWait wait = HoldWait::kAtOnce);

  TargetHold(const TargetHold&) = delete;
  TargetHold& operator=(const TargetHold&) = delete;
  ~TargetHold();

  void await();

  // Whether another run held it: what was read before may have changed.
  bool waited() const { return waited_; }

 private:
  RunLock target_;
  RunLock lun_;
  int lun_number_ = -1;
  bool outermost_ = false;
  bool held_ = false;
  bool waited_ = false;
};

// Holds the whole target for a run that takes something away, or is there for a moment, unless that needs a
// long wait.
class BriefTargetHold {
 public:
  // A target that this run holds already is held on. Waits for as long as `may_wait` says of the target,
  // asked again and again while another run holds it, and never longer than a minute.
  BriefTargetHold(const char* target_name, bool (*may_wait)(const char* target_name));
  BriefTargetHold(const BriefTargetHold&) = delete;
  BriefTargetHold& operator=(const BriefTargetHold&) = delete;
  ~BriefTargetHold();

  // Whether another run held it: what was read before may have changed.
  bool waited() const { return waited_; }

  // Whether another run holds it still, and this one goes on without.
  bool given_up() const { return given_up_; }

 private:
  RunLock target_;
  bool outermost_ = false;
  bool waited_ = false;
  bool given_up_ = false;
};

// Holds the whole target, or one LUN of it (0 or more), when a run has held or marked it before and none
// holds it now.
class IdleTarget {
 public:
  explicit IdleTarget(const char* target_name);
  IdleTarget(const char* target_name, int lun);

  explicit operator bool() const { return idle_; }

 private:
  RunLock target_;
  RunLock lun_;
  bool idle_;
};

}  // namespace remvol

#endif
