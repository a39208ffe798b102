#include "ktree/path.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace ktree {
namespace {

TEST(Path, ElementsAreNamesWithNumbers) {
  Path path;
  ASSERT_TRUE(parse_path("/iscsi/id:12/lun/_a.b-c9:4096", path));
  ASSERT_EQ(path.depth, 4U);
  EXPECT_EQ(path.elements[0].name(), "iscsi");
  EXPECT_EQ(path.elements[0].number, 1);
  EXPECT_EQ(path.elements[1].name(), "id");
  EXPECT_EQ(path.elements[1].number, 12);
  EXPECT_EQ(path.elements[3].name(), "_a.b-c9");
  EXPECT_EQ(path.elements[3].number, 4096);
}

TEST(Path, ABareNameIsNumberOne) {
  Path bare;
  Path numbered;
  ASSERT_TRUE(parse_path("/a", bare));
  ASSERT_TRUE(parse_path("/a:1", numbered));
  EXPECT_EQ(bare.elements[0].number, numbered.elements[0].number);
}

class BadPath : public testing::TestWithParam<const char*> {};

TEST_P(BadPath, IsRefused) {
  Path path;
  EXPECT_FALSE(parse_path(GetParam(), path)) << GetParam();
}

INSTANTIATE_TEST_SUITE_P(Path, BadPath,
                         testing::Values("", "/", "//", "a", "a/b", "/a/", "/a//b", "//a", " /a", "/a ",
                                         "/a b", "/1a", "/-a", "/.a", "/a/.", "/a/..", "/:1", "/a:", "/a:0",
                                         "/a:00", "/a:01", "/a:+1", "/a:-1", "/a: 1", "/a:1 ", "/a:1x",
                                         "/a:x", "/a:1:1", "/a:4097", "/a:10000", "/a:4294967297",
                                         "/a:18446744073709551617", "/a:99999999999999999999999999999999",
                                         "/\xC3\xA4", "/a\n", "/a\tb", "/a&", "/<a", "/a=b", "/*", "/a[1]"));

TEST(Path, NulBytesAreRefused) {
  Path path;
  EXPECT_FALSE(parse_path(std::string_view("/a\0b", 4), path));
  EXPECT_FALSE(parse_path(std::string_view("/a\0", 3), path));
}

TEST(Path, MayBe1023BytesLong) {
  Path path;
  const std::string longest = "/" + std::string(1022, 'a');
  EXPECT_TRUE(parse_path(longest, path));
  EXPECT_FALSE(parse_path(longest + "a", path));
}

TEST(Path, MayHaveAsManyElementsAsFit) {
  std::string text;
  for (int i = 0; i < 511; i++) text += "/a";
  Path path;
  ASSERT_TRUE(parse_path(text, path));
  EXPECT_EQ(path.depth, 511U);
  EXPECT_FALSE(parse_path(text + "/", path));
}

TEST(Path, NumberLengthIsThatOfTheShortestSpelling) {
  EXPECT_EQ(number_length(1), 0U);
  EXPECT_EQ(number_length(2), 2U);
  EXPECT_EQ(number_length(9), 2U);
  EXPECT_EQ(number_length(10), 3U);
  EXPECT_EQ(number_length(4096), 5U);
}

}  // namespace
}  // namespace ktree
