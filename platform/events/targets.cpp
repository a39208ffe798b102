#include "events/targets.h"

#include <algorithm>

namespace events {
namespace {

// After a connection error of a session that stays logged in all the same: 30 seconds of looks in much hurry,
// more than a logout may take.
constexpr int kSuspectLooks = 600;

constexpr int kMostRetries = 3;
constexpr int kRetryPause = 3;  // looks, a second apart when nothing else happens

// Seconds. A recovery that was put off comes back after ten.
constexpr time_t kFirstDoubtPause = 15, kLongestDoubtPause = 600;

struct Links {
  bool any = false, any_down = false, all_up = true;
};

Links links_of(const std::string& target, const std::vector<Session>& sessions) {
  Links links;
  for (const Session& session : sessions) {
    if (session.target != target) continue;
    links.any = true;
    links.any_down = links.any_down || session.link == Link::kDown;
    links.all_up = links.all_up && session.link == Link::kUp;
  }
  return links;
}

}  // namespace

Targets::FollowedTarget& Targets::find(const std::string& name) {
  for (FollowedTarget& target : targets_) {
    if (target.name == name) return target;
  }
  targets_.push_back({});
  targets_.back().name = name;
  return targets_.back();
}

// A recovery that has not begun is pointless once the connection is lost again.
void Targets::order_reopen(FollowedTarget& target) {
  target.wants_reopen = true;
  target.wants_recover = false;
  target.retries = target.pause = 0;
  target.doubt_due = target.doubt_pause = 0;
}

void Targets::take(const KernelEvent& event, const std::vector<Session>& sessions) {
  const auto session = std::find_if(sessions.begin(), sessions.end(),
                                    [&event](const Session& other) { return other.number == event.session; });
  if (event.kind != KernelEventKind::kOther && session != sessions.end() && session->link != Link::kNew) {
    FollowedTarget& target = find(session->target);
    target.answered = event.kind == KernelEventKind::kLoggedIn && (target.suspect > 0 || target.lost);
    // A logout ends in a connection error as well: the session is then gone a moment later.
    if (event.kind == KernelEventKind::kConnectionLost && !target.lost) target.suspect = kSuspectLooks;
  }
  look(sessions);
}

void Targets::settle(FollowedTarget& target, const std::vector<Session>& sessions) {
  const Links links = links_of(target.name, sessions);
  target.present = links.any;
  if (target.suspect > 0) --target.suspect;
  // Also without a session: a recovery that was killed may have closed it.
  if (target.pause > 0 && --target.pause == 0) target.wants_recover = true;
  if (!links.any) {
    target.suspect = 0;
    target.answered = false;
  } else if (links.any_down) {
    if (!target.lost) order_reopen(target);
    target.lost = true;
    target.suspect = 0;
  } else if (links.all_up && (target.lost || (target.suspect > 0 && target.answered))) {
    // The connection may be back before its loss was seen.
    if (!target.lost) order_reopen(target);
    target.wants_recover = true;
    target.lost = target.answered = false;
    target.suspect = 0;
  }
}

void Targets::look(const std::vector<Session>& sessions) {
  for (const Session& session : sessions) find(session.target);
  for (FollowedTarget& target : targets_) settle(target, sessions);
  std::erase_if(targets_, [](const FollowedTarget& target) {
    return !target.present && !target.lost && !target.busy && !target.wants_reopen && !target.wants_recover &&
           target.pause == 0 && target.doubt_due == 0;
  });
}

void Targets::look_after_a_gap(const std::vector<Session>& sessions) {
  look(sessions);
  for (FollowedTarget& target : targets_) {
    if (target.present && links_of(target.name, sessions).all_up) target.wants_recover = true;
  }
}

bool Targets::next(Order& order) {
  for (FollowedTarget& target : targets_) {
    if (target.busy || (!target.wants_reopen && !target.wants_recover)) continue;
    order = {target.name, target.wants_reopen ? Action::kReopen : Action::kRecover};
    (target.wants_reopen ? target.wants_reopen : target.wants_recover) = false;
    target.busy = true;
    target.recovering = order.action == Action::kRecover;
    target.doubt_due = 0;
    return true;
  }
  return false;
}

void Targets::started(const std::string& target, pid_t process) {
  FollowedTarget& chosen = find(target);
  chosen.process = process;
  chosen.busy = process > 0;
}

OrderEnd Targets::ended(pid_t process, bool failed, time_t now) {
  OrderEnd end;
  for (FollowedTarget& target : targets_) {
    if (!target.busy || target.process != process) continue;
    end.ordered = true;
    target.busy = false;
    if (!target.recovering) continue;
    if (!failed) {
      target.retries = 0;
      if (!target.lost) target.doubt_due = now + target.doubt_pause;
    } else if (!target.lost && target.retries < kMostRetries) {
      target.retries++;
      target.pause = kRetryPause;
    } else if (!target.lost) {
      end.given_up = target.name;
      target.doubt_pause = 0;
    }
  }
  return end;
}

bool Targets::next_doubt(std::string& name, time_t now) const {
  for (const FollowedTarget& target : targets_) {
    if (target.doubt_due == 0 || target.doubt_due > now) continue;
    name = target.name;
    return true;
  }
  return false;
}

bool Targets::settle_doubt(const std::string& name, Recovery recovery, const std::vector<Session>& sessions,
                           time_t now) {
  FollowedTarget& target = find(name);
  const time_t pause = target.doubt_pause;
  target.doubt_due = target.doubt_pause = 0;
  if (recovery == Recovery::kOver) return false;
  target.doubt_pause = std::clamp(2 * pause, kFirstDoubtPause, kLongestDoubtPause);
  const Links links = links_of(name, sessions);
  const bool again = recovery == Recovery::kMissing && pause > 0 && links.any && links.all_up;
  if (again) {
    target.wants_recover = true;
  } else {
    target.doubt_due = now + target.doubt_pause;
  }
  return again;
}

time_t Targets::next_doubt_due() const {
  time_t due = 0;
  for (const FollowedTarget& target : targets_) {
    if (target.doubt_due != 0 && (due == 0 || target.doubt_due < due)) due = target.doubt_due;
  }
  return due;
}

Hurry Targets::hurry() const {
  Hurry hurry = Hurry::kNone;
  for (const FollowedTarget& target : targets_) {
    if (target.present && (target.suspect > 0 || target.answered)) return Hurry::kMuch;
    if ((target.present && target.lost) || target.pause > 0) hurry = Hurry::kSome;
  }
  return hurry;
}

}  // namespace events
