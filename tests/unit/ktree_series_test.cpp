#include "ktree/series.h"

#include <gtest/gtest.h>

namespace ktree {
namespace {

int replies_until_start(Series& series) {
  int replies = 1;
  while (!series.starts()) {
    replies++;
  }
  return replies;
}

int wake_ups_until_end(Series& series, bool came) {
  for (int wake_ups = 1; wake_ups <= 10000; wake_ups++) {
    if (series.ends(came)) {
      return wake_ups;
    }
  }
  return 0;
}

TEST(Series, AClientOfFewRequestsHasNone) {
  Series series;
  EXPECT_FALSE(series.running());
  EXPECT_EQ(replies_until_start(series), 64);
  EXPECT_TRUE(series.running());
  EXPECT_FALSE(series.starts());
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
    ASSERT_FALSE(series.ends(i % 9 != 0)) << i;
  }
  for (int i = 0; series.running(); i++) {
    ASSERT_LT(i, 1000);
    static_cast<void>(series.ends(i % 8 != 0));
  }
}

}  // namespace
}  // namespace ktree
