// Which targets lost their connection and which have it back: decides what is to be run, without running it.
#ifndef PLATFORM_EVENTS_TARGETS_H
#define PLATFORM_EVENTS_TARGETS_H

#include <sys/types.h>

#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

#include "common/sessions.h"
#include "events/kernel_event.h"

namespace events {

using platform::Link;
using platform::Session;

enum class Action { kReopen, kRecover };

struct Order {
  std::string target;
  Action action;
};

// What the end of a process means.
struct OrderEnd {
  bool ordered = false;  // it carried out an order
  std::string given_up;  // the target whose recovery failed for the last time; empty for none
};

// How a recovery stands whose run has ended well: that run may have left the work to another one.
enum class Recovery {
  kOver,      // nothing is to be recovered
  kUnderWay,  // another run is at it, or that cannot be told
  kMissing,   // the target is lost, and no run is at it
};

// How soon the sessions must be looked at again although no event came.
enum class Hurry { kNone, kSome, kMuch };

class Targets {
 public:
  // Takes an event; `sessions` is what the machine has now.
  void take(const KernelEvent& event, const std::vector<Session>& sessions);

  // Compares with what the machine has now.
  void look(const std::vector<Session>& sessions);

  // As look(), and has every connected target recovered: events may have been missed. Recovering a target
  // that is not waiting for it changes nothing.
  void look_after_a_gap(const std::vector<Session>& sessions);

  // Takes the next order that may be run now: one at a time for each target, in the order of the events.
  // Returns false when there is none. The caller says with started() which process does it, -1 for none.
  bool next(Order& order);
  void started(const std::string& target, pid_t process);

  // The process has ended. A recovery that failed is tried again some seconds later, a few times: runs that
  // come together wait for each other only so long. One that ended well is in doubt from then on.
  OrderEnd ended(pid_t process, bool failed, time_t now);

  // Takes a target whose recovery is to be looked up now. Returns false when there is none. The caller says
  // with settle_doubt() how it stands: what is not over is looked up again, less and less often.
  bool next_doubt(std::string& target, time_t now) const;

  // Returns whether the recovery is ordered again: it is missing, was so some time ago, and the target has
  // its session.
  bool settle_doubt(const std::string& target, Recovery recovery, const std::vector<Session>& sessions,
                    time_t now);

  // When the next one is to be looked up; 0: none is.
  time_t next_doubt_due() const;

  Hurry hurry() const;

 private:
  struct FollowedTarget {
    std::string name;
    bool present = false;       // it has a session
    int suspect = 0;            // a connection error came, the session still counts as logged in: looks left
    bool answered = false;      // the target accepted a login since then
    bool lost = false;          // reopening, as the tool was told
    bool wants_reopen = false;  // orders not yet given, in this order
    bool wants_recover = false;
    int retries = 0;          // of a recovery that failed
    int pause = 0;            // looks until it is tried again; 0: it is not to be
    time_t doubt_due = 0;     // when a recovery that ended well is looked up; 0: it is not to be
    time_t doubt_pause = 0;   // seconds to the next time; 0: it was not looked up yet
    bool busy = false;        // an order is being run
    bool recovering = false;  // the order is a recovery
    pid_t process = -1;
  };

  FollowedTarget& find(const std::string& name);
  static void order_reopen(FollowedTarget& target);
  static void settle(FollowedTarget& target, const std::vector<Session>& sessions);

  std::vector<FollowedTarget> targets_;
};

}  // namespace events

#endif
