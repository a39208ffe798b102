// When a recovery whose run has ended well is ordered again.
#include "events/targets.h"

#include <gtest/gtest.h>

using namespace events;

namespace {

constexpr pid_t kProcess = 7;

class RecoveryInDoubt : public testing::Test {
 protected:
  RecoveryInDoubt() { targets_.look_after_a_gap(sessions_); }

  static std::vector<Session> session(Link link) { return {{1, "iqn.a", "", link}}; }

  // Runs the next order to its end. Returns whether it was a recovery.
  bool recovers(bool failed = false) {
    Order order;
    if (!targets_.next(order)) return false;
    targets_.started(order.target, kProcess);
    targets_.ended(kProcess, failed, now_);
    return order.action == Action::kRecover;
  }

  // The seconds, from now, at which a recovery is looked up that is never over, and ordered again.
  struct Times {
    std::vector<time_t> looked_up, ordered;
  };

  Times times(time_t seconds, Recovery recovery) {
    Times found;
    std::string target;
    const time_t start = now_;
    for (; now_ < start + seconds; now_++) {
      while (targets_.next_doubt(target, now_)) {
        EXPECT_EQ(target, "iqn.a");
        EXPECT_EQ(targets_.next_doubt_due(), now_);
        found.looked_up.push_back(now_ - start);
        if (targets_.settle_doubt(target, recovery, sessions_, now_)) found.ordered.push_back(now_ - start);
      }
      recovers();
    }
    return found;
  }

  using Seconds = std::vector<time_t>;

  Targets targets_;
  std::vector<Session> sessions_ = session(Link::kUp);
  time_t now_ = 100;
};

TEST_F(RecoveryInDoubt, OneThatIsOverIsLookedUpOnce) {
  EXPECT_EQ(targets_.next_doubt_due(), 0);
  EXPECT_TRUE(recovers());
  EXPECT_EQ(times(2000, Recovery::kOver).looked_up, (Seconds{0}));
  EXPECT_EQ(targets_.next_doubt_due(), 0);
}

TEST_F(RecoveryInDoubt, OneThatIsMissingIsOrderedLessAndLessOften) {
  EXPECT_TRUE(recovers());
  const Times found = times(2000, Recovery::kMissing);
  EXPECT_EQ(found.looked_up, (Seconds{0, 15, 45, 105, 225, 465, 945, 1545}));
  EXPECT_EQ(found.ordered, (Seconds{15, 45, 105, 225, 465, 945, 1545}));
}

TEST_F(RecoveryInDoubt, OneThatIsUnderWayIsWaitedFor) {
  EXPECT_TRUE(recovers());
  Times found = times(40, Recovery::kUnderWay);
  EXPECT_EQ(found.looked_up, (Seconds{0, 15}));
  EXPECT_EQ(found.ordered, Seconds());
  found = times(40, Recovery::kMissing);
  EXPECT_EQ(found.ordered, (Seconds{5}));
}

TEST_F(RecoveryInDoubt, WithoutItsSessionItIsNotOrdered) {
  EXPECT_TRUE(recovers());
  sessions_ = {};
  targets_.look(sessions_);
  EXPECT_EQ(times(40, Recovery::kMissing).ordered, Seconds());
  sessions_ = session(Link::kUp);
  targets_.look(sessions_);
  EXPECT_EQ(times(40, Recovery::kMissing).ordered, (Seconds{5}));
}

TEST_F(RecoveryInDoubt, TheNextLossBeginsAnew) {
  EXPECT_TRUE(recovers());
  EXPECT_EQ(times(20, Recovery::kMissing).ordered, (Seconds{15}));
  targets_.look(session(Link::kDown));
  EXPECT_EQ(targets_.next_doubt_due(), 0);
  EXPECT_FALSE(recovers());
  targets_.look(sessions_);
  EXPECT_TRUE(recovers());
  EXPECT_EQ(times(40, Recovery::kMissing).looked_up, (Seconds{0, 15}));
}

TEST_F(RecoveryInDoubt, OneThatFailsIsTriedAgainAsEver) {
  EXPECT_TRUE(recovers(true));
  EXPECT_EQ(targets_.next_doubt_due(), 0);
  for (int look = 0; look < 3; look++) targets_.look(sessions_);
  EXPECT_TRUE(recovers());
  EXPECT_EQ(targets_.next_doubt_due(), now_);
}

TEST_F(RecoveryInDoubt, TheFirstOfSeveralIsDue) {
  EXPECT_TRUE(recovers());
  std::string target;
  ASSERT_TRUE(targets_.next_doubt(target, now_));
  targets_.settle_doubt(target, Recovery::kUnderWay, sessions_, now_);
  sessions_.push_back({2, "iqn.b", "", Link::kUp});
  targets_.look_after_a_gap(sessions_);
  now_ += 5;
  while (recovers()) {
  }
  EXPECT_EQ(targets_.next_doubt_due(), now_);
}

}  // namespace
