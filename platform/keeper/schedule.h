// When what should be there and is not is tried again, such as the session of a target: decides, without
// trying.
#ifndef PLATFORM_KEEPER_SCHEDULE_H
#define PLATFORM_KEEPER_SCHEDULE_H

#include <ctime>
#include <string>
#include <vector>

namespace keeper {

// What is to be there, as the machine has it now: a target that is to be connected, or a volume that is to be
// mounted.
struct Wanted {
  std::string name;
  bool connected;         // it has a session, working or not; or it is mounted
  bool is_taken = false;  // when it is not there: somebody takes it away on purpose
  bool at_work =
      false;  // when it is not there: a recovery or a connection is under way, perhaps this target's
  bool is_unclear = false;  // what it has cannot be said now, so that all stays as it was
};

struct Try {
  std::string name;
  bool first;  // since it went missing
};

enum class Change { kNone, kMissing, kLeft, kBack };

struct Terms {
  // It is missing when it stays away for that many looks: a recovery logs out and in again.
  int looks = 3;
  // What is back begins anew when it has been there for so many seconds: until then its pauses go on, and it
  // is told as back only when it has been there for as long as the next of them.
  time_t lasting = 0;
  // What has not been there since it was first looked for is not missing.
  bool once_there = false;
  // Somebody may take it away on purpose at any time until it is back, for that many looks in a row, and not
  // only as it goes. That is told.
  int taken_looks = 0;
};

class Schedule {
 public:
  explicit Schedule(const Terms& terms = {}) : terms_(terms) {}

  // Compares with what the machine has; to be called about once a second, `now` in seconds. A target that is
  // no longer wanted is forgotten.
  void look(const std::vector<Wanted>& wanted, time_t now);

  // Takes a change that is to be told: a target is missing, is left to somebody, or is back. Returns kNone
  // when there is none.
  Change next_change(std::string& target);

  // Takes a target that is to be tried now; the next try comes later, up to kLongestPause seconds.
  bool next_try(Try& next, time_t now);

  // It is not tried again until it has been there.
  void leave(const std::string& name);

  // True when something is missing, so that looking every second is worth it.
  bool anything_missing() const;

  static constexpr time_t kFirstPause = 1, kLongestPause = 60;

 private:
  struct AwaitedTarget {
    std::string name;
    bool seen = false;       // it is among those that are wanted
    bool connected = false;  // at the last look
    bool taken = false;      // it is not missed until it has been connected again
    bool missing = false;    // told, and not yet told as back
    bool tell = false;
    bool unclear = false;  // at the last look
    int absent = 0;        // looks in a row without a session
    int taken_looks = 0;   // looks in a row at which somebody took it away
    time_t since = 0, pause = kFirstPause, due = 0;
  };

  AwaitedTarget& find(const std::string& name);
  void settle(AwaitedTarget& target, const Wanted& wanted, time_t now) const;

  Terms terms_;
  std::vector<AwaitedTarget> targets_;
};

}  // namespace keeper

#endif
