#include "support/session_hold.h"

namespace remvol {

namespace {

constexpr char kAllSessions[] = "sessions.lock";
constexpr char kLogins[] = "logins.lock";
constexpr int kLoginWait = 5;  // seconds

int holders = 0;  // of this run

}  // namespace

SessionHold::SessionHold(const char* target_name, LockMode mode) {
  if (holders++ > 0) return;
  all_.take_in_time(kAllSessions, target_name != nullptr ? LockMode::kShared : mode, kLongestHold);
  if (target_name == nullptr) return;
  one_.take_in_time(hashed_lock_name("session", target_name), mode, kLongestHold);
}

SessionHold::~SessionHold() {
  holders--;
}

LoginUnderWay::LoginUnderWay() {
  lock_.take_in_time(kLogins, LockMode::kShared, kLongestHold);
}

void LoginsHeldOff::begin() {
  lock_.take_in_time(kLogins, LockMode::kExclusive, kLoginWait);
}

}  // namespace remvol
