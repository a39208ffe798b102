// What is told of a volume, and how often.
#include "notify/history.h"

#include <gtest/gtest.h>

namespace notify {
namespace {

using vvstat::history_of, vvstat::text_of;
using vvstat::Row;
using vvstat::Target;
using vvstat::Volume;

constexpr time_t kStart = 1'000'000;

class Told : public testing::Test {
 protected:
  Told() {
    target_.name = "iqn.t1";
    volume_.lun = 1;
    volume_.share = "Photos";
    row_ = {&target_, &volume_, "", "", "", true, false, 0, 100, true, {}};
  }

  // What is told when the volume is so, that long after the beginning.
  std::vector<std::string> at(time_t seconds, Ailment ailment) {
    row_.problem.ailment = ailment;
    row_.problem.what = ailment == Ailment::kNone ? "" : "is ill";
    std::vector<std::string> names;
    for (const Event& event : compare({row_}, kStart + seconds, last_look_, history_)) {
      names.push_back(form_of(event.kind).name);
      message_ = event.message;
    }
    last_look_ = kStart + seconds;
    return names;
  }

  // The row with what is remembered of it, by way of the file's text.
  Row recalled() {
    std::vector<Row> rows{row_};
    recall(history_of(text_of(history_)), rows);
    return rows.front();
  }

  using Names = std::vector<std::string>;
  Target target_{};
  Volume volume_{};
  Row row_{};
  History history_;
  time_t last_look_ = 0;
  std::string message_;
};

TEST_F(Told, NothingOfAHealthyVolume) {
  EXPECT_EQ(at(0, Ailment::kNone), Names{});
  EXPECT_EQ(at(600, Ailment::kNone), Names{});
}

TEST_F(Told, ALossAtOnceAndTheReturnAfterAMinute) {
  at(0, Ailment::kNone);
  EXPECT_EQ(at(1, Ailment::kLost), Names{"lost"});
  EXPECT_EQ(message_, "Volume Photos: is ill; ");
  EXPECT_EQ(at(10, Ailment::kLost), Names{});
  EXPECT_EQ(at(20, Ailment::kNone), Names{});
  EXPECT_EQ(at(79, Ailment::kNone), Names{});
  EXPECT_EQ(at(80, Ailment::kNone), Names{"back"});
  EXPECT_EQ(message_, "Volume Photos: is well again");
  EXPECT_EQ(at(200, Ailment::kNone), Names{});
}

TEST_F(Told, OneLossHoweverOftenItFlaps) {
  at(0, Ailment::kNone);
  EXPECT_EQ(at(1, Ailment::kLost), Names{"lost"});
  for (time_t time = 10; time < 1000; time += 50) {
    EXPECT_EQ(at(time, Ailment::kNone), Names{});
    EXPECT_EQ(at(time + 10, Ailment::kBusy), Names{});
    EXPECT_EQ(at(time + 20, Ailment::kLost), Names{});
  }
  at(1000, Ailment::kNone);
  EXPECT_EQ(at(1060, Ailment::kNone), Names{"back"});
}

// The file system is read-only each time that the connection was away for long, until it is mounted anew.
TEST_F(Told, OneLossAndOneReadOnlyHoweverOftenItFlaps) {
  EXPECT_EQ(at(1, Ailment::kLost), Names{"lost"});
  EXPECT_EQ(at(2, Ailment::kReadOnly), Names{"read-only"});
  for (time_t time = 10; time < 1000; time += 50) {
    EXPECT_EQ(at(time, Ailment::kNone), Names{});
    EXPECT_EQ(at(time + 20, Ailment::kLost), Names{});
    EXPECT_EQ(at(time + 30, Ailment::kReadOnly), Names{});
  }
  at(1000, Ailment::kNone);
  EXPECT_EQ(at(1060, Ailment::kNone), Names{"back"});
  EXPECT_EQ(at(1100, Ailment::kLost), Names{"lost"});
}

TEST_F(Told, WhatGetsWorseOnTheWay) {
  EXPECT_EQ(at(0, Ailment::kLost), Names{"lost"});
  EXPECT_EQ(at(1, Ailment::kReadOnly), Names{"read-only"});
  EXPECT_EQ(at(2, Ailment::kFailed), Names{"volume-failed"});
  EXPECT_EQ(at(3, Ailment::kBusy), Names{});
  EXPECT_EQ(at(4, Ailment::kNone), Names{});
  EXPECT_EQ(at(64, Ailment::kNone), Names{"back"});
}

TEST_F(Told, WorkThatEndsWellIsNoNews) {
  EXPECT_EQ(at(0, Ailment::kBusy), Names{});
  EXPECT_EQ(at(100, Ailment::kNone), Names{});
  EXPECT_EQ(at(200, Ailment::kNone), Names{});
}

TEST_F(Told, TheEndOfAFormat) {
  volume_.format_state = remvol::kFormatting;
  EXPECT_EQ(at(0, Ailment::kBusy), Names{});
  volume_.format_state = 0;
  EXPECT_EQ(at(5, Ailment::kBusy), Names{});  // it is being mounted
  EXPECT_EQ(at(10, Ailment::kNone), Names{"format-done"});
  EXPECT_EQ(at(20, Ailment::kNone), Names{});
}

// Between two looks: no look has seen it under way.
TEST_F(Told, TheEndOfAFormatThatNobodySaw) {
  row_.made = kStart - 1000;
  at(0, Ailment::kNone);
  row_.made = kStart + 30;
  EXPECT_EQ(at(60, Ailment::kNone), Names{"format-done"});
  EXPECT_EQ(message_, "Volume Photos: its format is done");
  EXPECT_EQ(at(120, Ailment::kNone), Names{});
}

TEST_F(Told, AFormatThatWasSeenIsToldOnce) {
  at(0, Ailment::kNone);
  volume_.format_state = remvol::kFormatting;
  at(10, Ailment::kBusy);
  volume_.format_state = 0;
  row_.made = kStart + 12;
  EXPECT_EQ(at(20, Ailment::kNone), Names{"format-done"});
  EXPECT_EQ(at(30, Ailment::kNone), Names{});
}

TEST_F(Told, AFormatInTheSecondOfALook) {
  row_.mounted = false;
  at(0, Ailment::kFailed);
  row_.mounted = true;
  row_.made = kStart;
  EXPECT_EQ(at(1, Ailment::kNone), Names{"format-done"});
}

// It was unmounted, or could not be asked, for some looks.
TEST_F(Told, AFormatBeforeAnEarlierLook) {
  row_.made = kStart - 1000;
  at(0, Ailment::kNone);
  row_.mounted = false;
  row_.made = 0;
  at(60, Ailment::kFailed);
  at(120, Ailment::kFailed);
  row_.mounted = true;
  row_.made = kStart + 90;
  EXPECT_EQ(at(180, Ailment::kNone), Names{"format-done"});
}

TEST_F(Told, AVolumeThatCameWithItsFormat) {
  compare({}, kStart, kStart - 60, history_);
  last_look_ = kStart;
  row_.made = kStart + 20;
  EXPECT_EQ(at(60, Ailment::kNone), Names{"format-done"});
}

TEST_F(Told, NoFormatOfAFileSystemThatIsOlder) {
  row_.made = kStart - 10;  // than the first look
  EXPECT_EQ(at(0, Ailment::kNone), Names{});
  compare({}, kStart + 60, kStart, history_);
  last_look_ = kStart + 60;
  row_.made = kStart + 50;  // than the volume
  EXPECT_EQ(at(120, Ailment::kNone), Names{});
  row_.made = kStart - 1000;  // a disk of before
  EXPECT_EQ(at(180, Ailment::kNone), Names{});
  row_.made = 0;  // it cannot be told
  EXPECT_EQ(at(240, Ailment::kNone), Names{});
}

TEST_F(Told, NoFormatOfAVolumeWhosePastDoesNotTell) {
  history_ = history_of("0 7 0 0 0 iqn.t1 1 Photos\n");
  last_look_ = kStart - 60;
  row_.made = kStart - 30;
  EXPECT_EQ(at(0, Ailment::kNone), Names{});
  row_.made = kStart + 30;
  EXPECT_EQ(at(60, Ailment::kNone), Names{"format-done"});
}

TEST_F(Told, AFormatOfAVolumeThatIsIllIsToldWhenItIsWell) {
  row_.made = kStart - 1000;
  at(0, Ailment::kNone);
  row_.made = kStart + 30;
  EXPECT_EQ(at(60, Ailment::kReadOnly), Names{"read-only"});
  EXPECT_EQ(at(120, Ailment::kNone), Names{"format-done"});
}

TEST_F(Told, AFormatThatFailedIsNotDone) {
  volume_.format_state = remvol::kFormatting;
  at(0, Ailment::kBusy);
  volume_.format_state = remvol::kFormatFailed;
  EXPECT_EQ(at(10, Ailment::kFailed), Names{"volume-failed"});
}

TEST_F(Told, AVolumeThatIsNotWantedIsForgotten) {
  EXPECT_EQ(at(0, Ailment::kLost), Names{"lost"});
  row_.wanted = false;
  EXPECT_EQ(at(1, Ailment::kNone), Names{});
  row_.wanted = true;
  EXPECT_EQ(at(2, Ailment::kLost), Names{"lost"});
}

TEST_F(Told, NearlyFullOnceUntilThereIsRoom) {
  row_.used = 94;
  EXPECT_EQ(at(0, Ailment::kNone), Names{});
  row_.used = 95;
  EXPECT_EQ(at(1, Ailment::kNone), Names{"nearly-full"});
  row_.used = 90;
  at(2, Ailment::kNone);
  row_.used = 96;
  EXPECT_EQ(at(3, Ailment::kNone), Names{});
  row_.used = 89;
  at(4, Ailment::kNone);
  row_.used = 96;
  EXPECT_EQ(at(5, Ailment::kNone), Names{"nearly-full"});
}

TEST_F(Told, ATargetWithoutVolumes) {
  row_.volume = nullptr;
  row_.size = 0;
  EXPECT_EQ(at(0, Ailment::kFailed), Names{"volume-failed"});
  EXPECT_EQ(message_, "Target iqn.t1: is ill; ");
}

TEST_F(Told, TheHistoryIsKeptAsText) {
  volume_.share = "two words\n\x1b";
  row_.made = kStart;
  at(0, Ailment::kLost);
  row_.used = 99;
  at(5, Ailment::kReadOnly);
  const std::string text = text_of(history_);
  EXPECT_EQ(text, "3 1000005 12 0 1 iqn.t1 1 two words\\x0A\\x1B\t1000000\t1000005 is ill\n");
  EXPECT_EQ(history_of(text), history_);
}

TEST_F(Told, SinceWhenItIsSo) {
  at(0, Ailment::kNone);
  at(10, Ailment::kLost);
  at(20, Ailment::kLost);
  EXPECT_EQ(recalled().since, kStart + 10);
  row_.problem.ailment = Ailment::kReadOnly;  // the notifier has not seen that yet
  EXPECT_EQ(recalled().since, 0);
  at(30, Ailment::kReadOnly);
  EXPECT_EQ(recalled().since, kStart + 30);
  at(40, Ailment::kNone);
  EXPECT_EQ(recalled().since, kStart + 40);
}

TEST_F(Told, OfWhatNobodyWantsItDoesNotMatter) {
  at(0, Ailment::kNone);
  row_.wanted = false;
  at(10, Ailment::kNone);
  EXPECT_EQ(recalled().since, 0);
  row_.wanted = true;
  at(20, Ailment::kNone);
  EXPECT_EQ(recalled().since, kStart + 10);
}

TEST_F(Told, TheLastErrorIsRemembered) {
  at(0, Ailment::kNone);
  at(1, Ailment::kBusy);
  EXPECT_EQ(recalled().error, "");
  at(2, Ailment::kFailed);
  at(3, Ailment::kFailed);
  EXPECT_EQ(recalled().error, "is ill");
  EXPECT_EQ(recalled().error_time, kStart + 2);
  at(4, Ailment::kNone);
  EXPECT_EQ(recalled().error_time, kStart + 2);
  at(5, Ailment::kFailed);
  EXPECT_EQ(recalled().error_time, kStart + 5);
}

TEST_F(Told, AnotherErrorTakesItsPlace) {
  at(0, Ailment::kFailed);
  row_.problem.what = "is worse\t";
  compare({row_}, kStart + 5, kStart, history_);
  EXPECT_EQ(recalled().error, "is worse\\x09");
  EXPECT_EQ(recalled().error_time, kStart + 5);
  EXPECT_EQ(recalled().since, kStart);
}

TEST_F(Told, NothingIsKnownOfAStranger) {
  EXPECT_EQ(recalled().since, 0);
  EXPECT_EQ(recalled().error_time, 0);
}

TEST(History, ALineOfAnEarlierVersionHasAnErrorAlone) {
  const Past past = history_of("3 7 8 0 1 iqn.t1 1 two words\t9 is ill\n")["iqn.t1 1 two words"];
  EXPECT_EQ(past, (Past{Ailment::kReadOnly, 7, 8, false, true, "is ill", 9, 0}));
}

TEST(History, ALineOfAnEarlierVersionHasNoError) {
  const History history = history_of("3 7 8 0 1 iqn.t1 1 two words\n");
  ASSERT_EQ(history.size(), 1U);
  EXPECT_EQ(history.begin()->first, "iqn.t1 1 two words");
  EXPECT_EQ(history.begin()->second, (Past{Ailment::kReadOnly, 7, 8, false, true, "", 0, 0}));
}

TEST(History, AnErrorWithoutItsTimeIsLeftOut) {
  for (const char* text : {"0 7 0 0 0 a\t", "0 7 0 0 0 a\tx", "0 7 0 0 0 a\t-"}) {
    EXPECT_EQ(history_of(text)["a"].error, "") << text;
  }
}

TEST(History, ALineThatIsNoneIsLeftOut) {
  for (const char* text :
       {"", "\n", "x", "1 2 3", "9 1 0 0 0 k\n", "0 1 32 0 0 k", "-1 0 0 0 0 k", "0 0 0 0 0 "}) {
    EXPECT_TRUE(history_of(text).empty()) << text;
  }
  EXPECT_EQ(history_of("rubbish\n1 7 0 0 0 a b\n2 8").size(), 1U);
}

}  // namespace
}  // namespace notify
