// When a target that is missing is tried again.
#include "keeper/schedule.h"

#include <gtest/gtest.h>

using namespace keeper;

namespace {

constexpr bool kConnected = true, kAbsent = false, kTaken = true;

class KeeperSchedule : public testing::Test {
 protected:
  // A look at one target; a second passes.
  void look(bool connected, bool is_taken = false) {
    now_++;
    schedule_.look({{"a", connected, is_taken, at_work_}}, now_);
  }

  Change change() {
    std::string target;
    return schedule_.next_change(target);
  }

  // The seconds, from now, at which it is tried, while it stays away.
  std::vector<long> tries(long seconds) {
    std::vector<long> found;
    const long start = now_;
    for (Try next; now_ < start + seconds; look(kAbsent)) {
      if (schedule_.next_try(next, now_)) found.push_back(now_ - start);
    }
    return found;
  }

  // The same while somebody works on it, for long enough.
  void take() {
    for (int i = 0; i < 2; i++) look(kAbsent, kTaken);
  }

  void lose() {
    look(kConnected);
    for (int i = 0; i < 3; i++) look(kAbsent);
  }

  // The same when what is tried lives for that many seconds, again and again; takes the changes.
  std::vector<long> tries_with_life(long life, long seconds, std::vector<Change>& changes) {
    std::vector<long> found;
    const long start = now_;
    for (long dies = start; now_ < start + seconds; look(now_ + 1 < dies)) {
      if (const Change one = change(); one != Change::kNone) changes.push_back(one);
      Try next;
      if (!schedule_.next_try(next, now_)) continue;
      EXPECT_GE(now_, dies) << "it is tried while it is there";
      found.push_back(now_ - start);
      dies = now_ + life;
    }
    return found;
  }

  Schedule schedule_;
  bool at_work_ = false;
  long now_ = 100;
};

TEST_F(KeeperSchedule, StepsGrowToAMinute) {
  lose();
  EXPECT_EQ(change(), Change::kMissing);
  EXPECT_EQ(tries(250), (std::vector<long>{0, 1, 3, 7, 15, 31, 63, 123, 183, 243}));
  EXPECT_EQ(change(), Change::kNone);
}

TEST_F(KeeperSchedule, TwoLooksAreEnoughForWhoSaysSo) {
  schedule_ = Schedule({.looks = 2});
  look(kConnected);
  look(kAbsent);
  EXPECT_EQ(change(), Change::kNone);
  look(kAbsent);
  EXPECT_EQ(change(), Change::kMissing);
}

TEST_F(KeeperSchedule, WhatARecoveryIsAtIsNotMissingYet) {
  look(kConnected);
  at_work_ = true;
  for (int i = 0; i < 59; i++) look(kAbsent);
  EXPECT_EQ(change(), Change::kNone);
  at_work_ = false;
  look(kAbsent);
  EXPECT_EQ(change(), Change::kMissing);
}

TEST_F(KeeperSchedule, ARecoveryThatDoesNotEndIsNotWaitedForForEver) {
  look(kConnected);
  at_work_ = true;
  for (int i = 0; i < 60; i++) look(kAbsent);
  EXPECT_EQ(change(), Change::kMissing);
}

TEST_F(KeeperSchedule, OnlyTheFirstTryIsTheFirst) {
  lose();
  Try next;
  ASSERT_TRUE(schedule_.next_try(next, now_));
  EXPECT_TRUE(next.first);
  EXPECT_EQ(next.name, "a");
  look(kAbsent);
  ASSERT_TRUE(schedule_.next_try(next, now_));
  EXPECT_FALSE(next.first);
}

TEST_F(KeeperSchedule, WhatIsBackIsToldAndBeginsAnew) {
  lose();
  EXPECT_EQ(change(), Change::kMissing);
  tries(100);
  look(kConnected);
  EXPECT_EQ(change(), Change::kBack);
  EXPECT_EQ(change(), Change::kNone);
  EXPECT_FALSE(schedule_.anything_missing());
  lose();
  EXPECT_EQ(tries(5), (std::vector<long>{0, 1, 3}));
}

TEST_F(KeeperSchedule, WhatIsToLastIsTriedWithGrowingPausesAndToldOfOnceWhileItDoesNot) {
  schedule_ = Schedule({.looks = 2, .lasting = Schedule::kLongestPause});
  lose();
  std::vector<Change> changes;
  EXPECT_EQ(tries_with_life(2, 250, changes), (std::vector<long>{0, 2, 4, 8, 16, 32, 64, 124, 184, 244}));
  EXPECT_EQ(changes, std::vector<Change>{Change::kMissing});
}

TEST_F(KeeperSchedule, WhatIsToLastAndIsLostOnceIsSoonToldAsBack) {
  schedule_ = Schedule({.looks = 2, .lasting = Schedule::kLongestPause});
  lose();
  std::vector<Change> changes;
  EXPECT_EQ(tries_with_life(1000, 5, changes), std::vector<long>{0});
  EXPECT_EQ(changes, (std::vector<Change>{Change::kMissing, Change::kBack}));
}

TEST_F(KeeperSchedule, WhatIsToLastBeginsAnewWhenItHasLasted) {
  schedule_ = Schedule({.looks = 2, .lasting = Schedule::kLongestPause});
  lose();
  std::vector<Change> changes;
  tries_with_life(2, 100, changes);
  tries_with_life(1000, 120, changes);
  EXPECT_EQ(changes, (std::vector<Change>{Change::kMissing, Change::kBack}));
  lose();
  EXPECT_EQ(tries(5), (std::vector<long>{0, 1, 3}));
}

TEST_F(KeeperSchedule, ASessionThatIsMadeAnewIsNotMissing) {
  look(kConnected);
  look(kAbsent);
  look(kAbsent);
  EXPECT_TRUE(schedule_.anything_missing());
  look(kConnected);
  EXPECT_EQ(change(), Change::kNone);
  EXPECT_EQ(tries(2), std::vector<long>());
}

TEST_F(KeeperSchedule, WhatIsTakenAwayStaysAwayUntilItWasConnected) {
  look(kConnected);
  look(kAbsent, kTaken);
  EXPECT_EQ(tries(100), std::vector<long>());
  EXPECT_FALSE(schedule_.anything_missing());
  lose();
  EXPECT_EQ(change(), Change::kMissing);
}

TEST_F(KeeperSchedule, WhatIsMissingIsNotTakenAwayWithOthers) {
  lose();
  look(kAbsent, kTaken);
  EXPECT_EQ(tries(2), (std::vector<long>{0, 1}));
}

TEST_F(KeeperSchedule, WhatIsNotWantedAnyMoreIsForgotten) {
  lose();
  schedule_.look({}, ++now_);
  EXPECT_EQ(change(), Change::kNone);
  Try next;
  EXPECT_FALSE(schedule_.next_try(next, now_));
}

TEST_F(KeeperSchedule, WhatWasNotThereYetIsNotMissing) {
  schedule_ = Schedule({.once_there = true});
  for (int i = 0; i < 10; i++) look(kAbsent);
  EXPECT_EQ(change(), Change::kNone);
  EXPECT_FALSE(schedule_.anything_missing());
  lose();
  EXPECT_EQ(change(), Change::kMissing);
}

TEST_F(KeeperSchedule, WhatIsLeftIsTriedAgainOnlyWhenItWasThere) {
  lose();
  EXPECT_EQ(change(), Change::kMissing);
  EXPECT_EQ(tries(2), (std::vector<long>{0, 1}));
  schedule_.leave("a");
  EXPECT_EQ(tries(100), std::vector<long>{});
  EXPECT_FALSE(schedule_.anything_missing());
  look(kConnected);
  EXPECT_EQ(change(), Change::kBack);
  lose();
  EXPECT_FALSE(tries(5).empty());
}

TEST_F(KeeperSchedule, WhatSomebodyWorksOnLaterIsLeftToHim) {
  schedule_ = Schedule({.once_there = true, .taken_looks = 2});
  look(kConnected);
  look(kAbsent);
  take();
  EXPECT_EQ(change(), Change::kLeft);
  for (int i = 0; i < 10; i++) look(kAbsent);
  EXPECT_EQ(change(), Change::kNone);
  EXPECT_FALSE(schedule_.anything_missing());
  look(kConnected);
  EXPECT_EQ(change(), Change::kNone);
  lose();
  EXPECT_EQ(change(), Change::kMissing);
  take();
  EXPECT_EQ(change(), Change::kLeft);
  EXPECT_EQ(tries(100), std::vector<long>{});
}

TEST_F(KeeperSchedule, WhatWasNotThereYetIsNotSaidToBeLeft) {
  schedule_ = Schedule({.once_there = true, .taken_looks = 2});
  take();
  EXPECT_EQ(change(), Change::kNone);
}

TEST_F(KeeperSchedule, WhoLooksAtWhatIsAwayNowAndThenDoesNotWorkOnIt) {
  schedule_ = Schedule({.once_there = true, .taken_looks = 2});
  look(kConnected);
  for (int i = 0; i < 5; i++) {
    look(kAbsent, kTaken);
    look(kAbsent);
  }
  EXPECT_EQ(change(), Change::kMissing);
  EXPECT_EQ(change(), Change::kNone);
}

TEST_F(KeeperSchedule, ALookAtItCountsOnlyUntilItIsThereAgain) {
  schedule_ = Schedule({.once_there = true, .taken_looks = 2});
  for (int i = 0; i < 5; i++) {
    look(kConnected);
    look(kAbsent, kTaken);
  }
  EXPECT_EQ(change(), Change::kNone);
}

TEST_F(KeeperSchedule, WhatIsUnclearForAWhileStaysAsItWas) {
  schedule_ = Schedule({.once_there = true});
  lose();
  EXPECT_EQ(change(), Change::kMissing);
  for (int i = 0; i < 100; i++) {
    schedule_.look({{.name = "a", .connected = false, .is_unclear = true}}, ++now_);
    Try next;
    EXPECT_FALSE(schedule_.next_try(next, now_));
  }
  look(kAbsent);
  EXPECT_EQ(tries(5), (std::vector<long>{0, 1, 3}));
}

TEST_F(KeeperSchedule, WhatWasForgottenHasToBeThereOnce) {
  schedule_ = Schedule({.once_there = true});
  lose();
  EXPECT_EQ(tries(5), (std::vector<long>{0, 1, 3}));
  schedule_.look({}, now_);
  EXPECT_EQ(tries(100), std::vector<long>{});
  lose();
  EXPECT_FALSE(tries(5).empty());
}

}  // namespace
