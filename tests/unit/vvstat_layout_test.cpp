// Reports on a screen that is too narrow for them.
#include <gtest/gtest.h>

#include "common/utf8.h"
#include "vvstat/folding.h"
#include "vvstat/widths.h"

namespace vvstat {
namespace {

using Widths = std::vector<size_t>;

const std::vector<Wish> kWishes{{12, 30}, {14, 14}, {4, 4}, {13, 20}};

TEST(Widths, EverythingWhereThereIsRoom) {
  EXPECT_EQ(fitting_widths(kWishes, 71), (Widths{30, 14, 4, 20}));
  EXPECT_EQ(fitting_widths(kWishes, 200), (Widths{30, 14, 4, 20}));
  EXPECT_EQ(fitting_widths({}, 10), Widths{});
}

TEST(Widths, TheLeastImportantIsCutFirst) {
  EXPECT_EQ(fitting_widths(kWishes, 70), (Widths{30, 14, 4, 19}));
  EXPECT_EQ(fitting_widths(kWishes, 64), (Widths{30, 14, 4, 13}));
  EXPECT_EQ(fitting_widths(kWishes, 63), (Widths{29, 14, 4, 13}));
}

TEST(Widths, ThenItIsLeftOut) {
  EXPECT_EQ(fitting_widths(kWishes, 46), (Widths{12, 14, 4, 13}));
  EXPECT_EQ(fitting_widths(kWishes, 45), (Widths{25, 14, 4, 0}));
  EXPECT_EQ(fitting_widths(kWishes, 31), (Widths{16, 14, 0, 0}));
  EXPECT_EQ(fitting_widths(kWishes, 26), (Widths{26, 0, 0, 0}));
  EXPECT_EQ(fitting_widths(kWishes, 5), (Widths{5, 0, 0, 0}));
  EXPECT_EQ(fitting_widths(kWishes, 0), (Widths{1, 0, 0, 0}));
}

// What is in the middle is not kept for a later one that would fit.
TEST(Widths, NothingBehindWhatIsLeftOut) {
  EXPECT_EQ(fitting_widths({{5, 5}, {9, 9}, {1, 1}}, 10), (Widths{10 - 5, 0, 0}));
}

TEST(Folding, BetweenWords) {
  EXPECT_EQ(folded("one two three", {}, 80), "one two three\n");
  EXPECT_EQ(folded("one two three four", {2, 4}, 20), "  one two three four\n");
  EXPECT_EQ(folded("one two three fours", {2, 4}, 20), "  one two three\n    fours\n");
  EXPECT_EQ(folded("", {}, 80), "\n");
}

TEST(Folding, AWordThatIsLongerThanALine) {
  EXPECT_EQ(folded("a 0123456789012345678901234567890", {0, 2}, 20),
            "a\n  012345678901234567\n  8901234567890\n");
  EXPECT_EQ(folded("日本日本", {}, 3), "日\n本\n日\n本\n");
  EXPECT_EQ(folded("日本", {}, 1), "日\n本\n");  // no screen is so narrow
}

TEST(Folding, ANarrowScreenHasNoIndents) {
  EXPECT_EQ(folded("one two three", {4, 6}, 8), "one two\nthree\n");
}

TEST(Folding, ACommandBetweenWords) {
  EXPECT_EQ(folded_command("vv connect Photos", {4, 6}, 80), "    vv connect Photos\n");
  EXPECT_EQ(folded_command("vv disconnect Photos && vv connect Photos", {4, 6}, 30),
            "    vv disconnect Photos && \\\n      vv connect Photos\n");
  EXPECT_EQ(folded_command("a 'two words' 'three more words'", {0, 0}, 20),
            "a 'two words' \\\n'three more words'\n");
}

TEST(Folding, ACommandWithinAWord) {
  EXPECT_EQ(folded_command("vv 0123456789", {}, 10), "vv 01234\\\n56789\n");
  EXPECT_EQ(folded_command("vv '01 3456789a'", {}, 10), "vv '01 '\\\n'345678'\\\n'9a'\n");
}

TEST(Folding, NoLineOfACommandIsLonger) {
  for (size_t width = 8; width < 30; width++) {
    const std::string text = folded_command("vv 'it'\\''s '\\'''\\''mine' '日本日本'", {}, width);
    for (size_t at = 0; at < text.size();) {
      const size_t end = text.find('\n', at);
      EXPECT_LE(platform::cells(text.substr(at, end - at)), width) << text;
      at = end + 1;
    }
  }
}

TEST(Utf8, TheFirstCells) {
  EXPECT_EQ(platform::first_cells("abc", 2), 2U);
  EXPECT_EQ(platform::first_cells("abc", 9), 3U);
  EXPECT_EQ(platform::first_cells("日本", 3), 3U);
  EXPECT_EQ(platform::first_cells("日本", 1), 0U);
  EXPECT_EQ(platform::first_cells("e\xcc\x81x", 1), 3U);
  EXPECT_EQ(platform::first_cells("\xff\xff\xff", 2), 2U);
}

}  // namespace
}  // namespace vvstat
