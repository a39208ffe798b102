#include "keeper/schedule.h"

#include <algorithm>

namespace keeper {
namespace {

// While somebody brings a target up, which takes all the longer where the machine is slow.
constexpr int kLooksAtWork = 60;

}  // namespace

Schedule::AwaitedTarget& Schedule::find(const std::string& name) {
  for (AwaitedTarget& target : targets_) {
    if (target.name == name) return target;
  }
  targets_.push_back({});
  targets_.back().name = name;
  targets_.back().taken = terms_.once_there;
  return targets_.back();
}

void Schedule::settle(AwaitedTarget& target, const Wanted& wanted, time_t now) const {
  target.unclear = wanted.is_unclear;
  if (wanted.is_unclear || wanted.connected) target.taken_looks = 0;
  if (wanted.is_unclear) return;
  if (wanted.connected && !target.connected) target.since = now;
  target.connected = wanted.connected;
  if (wanted.connected) {
    const time_t there = now - target.since;
    if (there >= terms_.lasting) {
      target.pause = kFirstPause;
      target.due = now;
    }
    if (target.missing && there < std::min(terms_.lasting, target.pause)) return;
    target.tell = target.missing && !target.tell;
    target.missing = target.taken = false;
    target.absent = 0;
    return;
  }
  if (target.taken) return;
  target.taken_looks = wanted.is_taken ? target.taken_looks + 1 : 0;
  const bool later = terms_.taken_looks != 0;
  // Of targets only one that loses its session while somebody is at it is meant.
  if (wanted.is_taken && (later ? target.taken_looks >= terms_.taken_looks : target.absent == 0)) {
    target.taken = true;
    target.missing = false;
    target.tell = later;
    return;
  }
  if (target.missing) return;
  if (++target.absent < (wanted.at_work ? kLooksAtWork : terms_.looks)) return;
  target.missing = target.tell = true;
}

void Schedule::look(const std::vector<Wanted>& wanted, time_t now) {
  for (AwaitedTarget& target : targets_) target.seen = false;
  for (const Wanted& one : wanted) {
    AwaitedTarget& target = find(one.name);
    target.seen = true;
    settle(target, one, now);
  }
  std::erase_if(targets_, [](const AwaitedTarget& target) { return !target.seen; });
}

Change Schedule::next_change(std::string& name) {
  for (AwaitedTarget& target : targets_) {
    if (!target.tell) continue;
    target.tell = false;
    name = target.name;
    if (target.taken) return Change::kLeft;
    return target.missing ? Change::kMissing : Change::kBack;
  }
  return Change::kNone;
}

bool Schedule::next_try(Try& next, time_t now) {
  for (AwaitedTarget& target : targets_) {
    if (!target.missing || target.taken || target.connected || target.unclear || now < target.due) continue;
    next = {target.name, target.pause == kFirstPause};
    target.due = now + target.pause;
    target.pause = std::min(2 * target.pause, kLongestPause);
    return true;
  }
  return false;
}

void Schedule::leave(const std::string& name) {
  for (AwaitedTarget& target : targets_) {
    if (target.name == name) target.taken = true;
  }
}

bool Schedule::anything_missing() const {
  return std::any_of(targets_.begin(), targets_.end(),
                     [](const AwaitedTarget& target) { return !target.taken && target.absent > 0; });
}

}  // namespace keeper
