#include "ktree/series.h"

#include <gtest/gtest.h>

namespace ktree {
namespace {

int replies_until_start(Series& series) {
  int replies = 0;
  while (!series.running() && replies < 10000) {
    series.count_reply();
    replies++;
  }
  return replies;
}

int wake_ups_until_end(Series& series, bool came) {
  for (int wake_ups = 1; wake_ups <= 10000; wake_ups++) {
    series.count_wake_up(came);
    if (!series.running()) return wake_ups;
  }
  return 0;
}

TEST(Series, AClientOfFewRequestsHasNone) {
  Series series;
  EXPECT_FALSE(series.running());
  EXPECT_EQ(replies_until_start(series), 64);
  EXPECT_TRUE(series.running());
}

TEST(Series, RepliesOfARunningOneDoNotCount) {
  Series series;
  replies_until_start(series);
  for (int i = 0; i < 4; i++) series.count_wake_up(false);
  for (int i = 0; i < 1000; i++) series.count_reply();
  EXPECT_EQ(wake_ups_until_end(series, false), 4);
}

TEST(Series, RunsForAsLongAsRequestsCome) {
  Series series;
  replies_until_start(series);
  EXPECT_EQ(wake_ups_until_end(series, true), 0);
  EXPECT_TRUE(series.running());
}

TEST(Series, EndsWhenTheyStayAwayAndIsHarderToStartAgain) {
  Series series;
  for (const int needed : {64, 128, 256, 512, 1024, 1024}) {
    EXPECT_EQ(replies_until_start(series), needed);
    EXPECT_EQ(wake_ups_until_end(series, false), 8);
    EXPECT_FALSE(series.running());
  }
}

TEST(Series, OneInVainIsMadeUpForByEight) {
  Series series;
  replies_until_start(series);
  for (int i = 0; i < 1000; i++) {
    series.count_wake_up(i % 9 != 0);
    ASSERT_TRUE(series.running()) << i;
  }
  for (int i = 0; series.running(); i++) {
    ASSERT_LT(i, 1000);
    series.count_wake_up(i % 8 != 0);
  }
}

}  // namespace
}  // namespace ktree
