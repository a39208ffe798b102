// Keeping sessions open for as long as a disk is meant by its name.
//
// A disk's kernel name is its own only while its session is there: it goes to another disk with the next
// login. So whoever looks whose disk a name is and then does something to that disk keeps the session open in
// between, and whoever closes a session first looks whether a volume is mounted from it, with nobody mounting
// meanwhile. Held for some commands that end soon, never while a disk is formatted; inside of itself it is
// one hold. Where the other side does not come to an end within a minute, the run goes on without.
#ifndef REMVOL_SUPPORT_SESSION_HOLD_H
#define REMVOL_SUPPORT_SESSION_HOLD_H

#include "support/run_lock.h"

namespace remvol {

class SessionHold {
 public:
  SessionHold(const SessionHold&) = delete;
  SessionHold& operator=(const SessionHold&) = delete;

 protected:
  // `target_name` null: all sessions.
  SessionHold(const char* target_name, LockMode mode);
  ~SessionHold();

 private:
  RunLock all_;
  RunLock one_;
};

// While it lives no other run closes the target's session.
class SessionKept : SessionHold {
 public:
  explicit SessionKept(const char* target_name) : SessionHold(target_name, LockMode::kShared) {}
};

// While it lives no other run does anything to a disk of the target's session, or of any for null.
class SessionClosing : SessionHold {
 public:
  explicit SessionClosing(const char* target_name) : SessionHold(target_name, LockMode::kExclusive) {}
};

// A login, which gives names to disks. Logins go on beside each other.
class LoginUnderWay {
 public:
  LoginUnderWay();

 private:
  RunLock lock_;
};

// From begin() on no other run logs in: a name that is nobody's stays so. Logins that are under way are
// waited for, 5 seconds at most. Not for a run that logs in itself.
class LoginsHeldOff {
 public:
  void begin();

 private:
  RunLock lock_;
};

}  // namespace remvol

#endif
