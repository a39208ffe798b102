#include "ktree/tree.h"

#include <gtest/gtest.h>

#include <string>

#include "ktree_support.h"

namespace ktree {
namespace {

TEST(Tree, StartsEmpty) {
  Tree tree;
  EXPECT_EQ(get(tree, "/a"), std::nullopt);
  EXPECT_EQ(list(tree), "");
  EXPECT_EQ(tree.node_count(), 0U);
}

TEST(Tree, SettingMakesWhatIsMissingOnTheWay) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a/b/c", "x"));
  EXPECT_EQ(get(tree, "/a/b/c"), "x");
  EXPECT_TRUE(exists(tree, "/a/b"));
  EXPECT_EQ(get(tree, "/a/b"), std::nullopt);
}

TEST(Tree, ANodeMayHoldAValueAndChildren) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a/b", "below"));
  ASSERT_TRUE(set(tree, "/a", "above"));
  EXPECT_EQ(get(tree, "/a"), "above");
  EXPECT_EQ(get(tree, "/a/b"), "below");
}

TEST(Tree, AnEmptyValueIsAValue) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a", ""));
  EXPECT_EQ(get(tree, "/a"), "");
}

TEST(Tree, AValueIsReplaced) {
  Tree tree;
  for (const char* value : {"short", "a longer one", "", "x", "y"}) {
    ASSERT_TRUE(set(tree, "/a", value));
    EXPECT_EQ(get(tree, "/a"), value);
  }
}

TEST(Tree, SettingANumberMakesTheOnesBeforeItEmpty) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/q/id:3/name", "third"));
  EXPECT_TRUE(exists(tree, "/q/id:1"));
  EXPECT_TRUE(exists(tree, "/q/id:2"));
  EXPECT_EQ(get(tree, "/q/id:1"), std::nullopt);
  EXPECT_FALSE(exists(tree, "/q/id:1/name"));
  EXPECT_FALSE(exists(tree, "/q/id:4"));
  EXPECT_EQ(tree.node_count(), 5U);
}

TEST(Tree, DeletingTheSecondOfThreeMovesTheThirdDown) {
  Tree tree;
  for (const char* n : {"1", "2", "3"}) ASSERT_TRUE(set(tree, std::string("/id:") + n + "/target", n));
  ASSERT_TRUE(remove(tree, "/id:2"));
  EXPECT_EQ(get(tree, "/id:1/target"), "1");
  EXPECT_EQ(get(tree, "/id:2/target"), "3");
  EXPECT_FALSE(exists(tree, "/id:3"));
}

TEST(Tree, DeletingMovesOnlyTheSameNameDown) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a:1", "a1"));
  ASSERT_TRUE(set(tree, "/b:1", "b1"));
  ASSERT_TRUE(set(tree, "/a:2", "a2"));
  ASSERT_TRUE(set(tree, "/b:2", "b2"));
  ASSERT_TRUE(remove(tree, "/a"));
  EXPECT_EQ(list(tree), "/b=b1\n/a=a2\n/b:2=b2\n");
}

TEST(Tree, DeletingTakesAllBelow) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a/b/c", "x"));
  ASSERT_TRUE(set(tree, "/a/d", "y"));
  ASSERT_TRUE(remove(tree, "/a"));
  EXPECT_EQ(tree.node_count(), 0U);
  EXPECT_FALSE(exists(tree, "/a/b/c"));
  EXPECT_FALSE(remove(tree, "/a"));
}

TEST(Tree, DeletingWhatIsNotThereChangesNothing) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a", "x"));
  EXPECT_FALSE(remove(tree, "/b"));
  EXPECT_FALSE(remove(tree, "/a:2"));
  EXPECT_FALSE(remove(tree, "/a/b"));
  EXPECT_EQ(list(tree), "/a=x\n");
}

TEST(Tree, TheHighestNumberIs4096) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/n:4096", "last"));
  EXPECT_EQ(tree.node_count(), 4096U);
  EXPECT_EQ(get(tree, "/n:4096"), "last");
  EXPECT_FALSE(set(tree, "/n:4097", "x"));
  EXPECT_EQ(tree.append_child(tree.root(), "n"), nullptr);
  EXPECT_NE(tree.append_child(tree.root(), "m"), nullptr);
}

TEST(Tree, ASetThatGoesBeyondTheNodesOfATreeChangesNothing) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a", "kept"));
  std::string path;
  for (int i = 0; i < 100; i++) path += "/b:4096";
  EXPECT_FALSE(set(tree, path, "x"));
  EXPECT_EQ(tree.node_count(), 1U);
  EXPECT_EQ(list(tree), "/a=kept\n");
}

TEST(Tree, ASetThatGoesBeyondTheBytesOfATreeChangesNothing) {
  Tree tree;
  const std::string value(kMaxValueBytes, 'x');
  size_t stored = 0;
  while (set(tree, "/v:" + std::to_string(stored + 1), value)) stored++;
  EXPECT_EQ(stored, kMaxTreeBytes / (kMaxValueBytes + 1));
  EXPECT_EQ(tree.node_count(), stored);
  // What was deleted makes room again.
  ASSERT_TRUE(remove(tree, "/v:1"));
  EXPECT_TRUE(set(tree, "/v:" + std::to_string(stored), value));
  // A full tree can still be changed where it does not grow.
  EXPECT_TRUE(set(tree, "/v:1", "short"));
}

TEST(Listing, PrintsChildrenInTheOrderInWhichTheyWereMade) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/z", "1"));
  ASSERT_TRUE(set(tree, "/a", "2"));
  ASSERT_TRUE(set(tree, "/z:2/m", "3"));
  ASSERT_TRUE(set(tree, "/z/y", "4"));
  EXPECT_EQ(list(tree), "/z=1\n/z/y=4\n/a=2\n/z:2/m=3\n");
}

TEST(Listing, TheElementIdAlwaysCarriesItsNumber) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/id/id/name", "x"));
  ASSERT_TRUE(set(tree, "/id:2/idx:2", "y"));
  EXPECT_EQ(list(tree), "/id:1/id:1/name=x\n/id:2/idx:2=y\n");
  EXPECT_EQ(list(tree, "/id:1/id"), "/id:1/id:1/name=x\n");
}

TEST(Listing, OfALeafIsItsLine) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a:2/b", ""));
  EXPECT_EQ(list(tree, "/a:2/b:1"), "/a:2/b=\n");
  EXPECT_EQ(list(tree, "/a"), "");
}

TEST(Listing, EscapesControlsAndTheBackslash) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/a", "\x01\n\x1F\\ =\x7F\xC3\xA4\xFF"));
  EXPECT_EQ(list(tree), "/a=\\x01\\x0A\\x1F\\x5C =\x7F\xC3\xA4\xFF\n");
}

}  // namespace
}  // namespace ktree
