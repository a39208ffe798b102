// Reading and writing the tree, and the debug level that is read from it.
#include "tree/access.h"

#include <string>
#include <vector>

#include "fakes.h"
#include "frontend/remvol_debug.h"
#include "log_lines.h"

namespace {

using namespace remvol;
using Texts = std::vector<std::string>;

class Access : public fakes::Test {};

TEST_F(Access, AnEmptyValueIsMissing) {
  char value[8];
  fakes::tree_set({{"/full", "text"}, {"/empty", ""}});
  EXPECT_TRUE(tree_read("/full", value));
  EXPECT_STREQ(value, "text");
  EXPECT_FALSE(tree_read("/empty", value));
  EXPECT_STREQ(value, "");
  EXPECT_FALSE(tree_read("/missing", value));
  EXPECT_FALSE(tree_present("/empty"));
}

TEST_F(Access, NumbersHaveADefault) {
  fakes::tree_set({{"/n", "-12"}, {"/text", "x"}, {"/empty", ""}});
  EXPECT_EQ(tree_read_number("/n", 5), -12);
  EXPECT_EQ(tree_read_number("/text", 5), 0);
  EXPECT_EQ(tree_read_number("/empty", 5), 5);
  EXPECT_EQ(tree_read_number("/missing", 5), 5);
}

TEST_F(Access, ASlotIsFreeWhenMissingOrEmptyAlone) {
  fakes::tree_set({{"/full", "1"}, {"/empty", ""}});
  fakes::on("ktreec_get_wb", "/odd").returns(-2).text("x");
  EXPECT_FALSE(tree_slot_is_free("/full"));
  EXPECT_TRUE(tree_slot_is_free("/empty"));
  EXPECT_TRUE(tree_slot_is_free("/missing"));
  EXPECT_FALSE(tree_slot_is_free("/odd"));
}

// A rule gives -1 without errno, as a read that failed does.
TEST_F(Access, AReadThatMayHaveFailedIsDoneAgain) {
  fakes::tree_set({{"/k", "7"}});
  fakes::on("ktreec_get_wb", "/k").returns(-1).times(1);
  EXPECT_TRUE(tree_present("/k"));
  fakes::on("ktreec_get_wb", "/k").returns(-1).times(1);
  EXPECT_EQ(tree_read_number("/k", 0), 7);
  fakes::on("ktreec_get_wb", "/k").returns(-1).times(1);
  EXPECT_FALSE(tree_slot_is_free("/k"));
  fakes::on("ktreec_get_wb", "/k").returns(-1).times(1);
  EXPECT_FALSE(tree_is_missing("/k", "/k"));
  fakes::on("ktreec_get_wb", "/k").returns(-1).times(2);
  EXPECT_FALSE(tree_present("/k"));
}

TEST_F(Access, WhatTheTreeSaysIsMissingIsAskedForOnce) {
  fakes::on("ktreec_get_wb", "/k").text("v").returns(1).skip(1);  // it is there at a second look
  EXPECT_FALSE(tree_present("/k"));
  EXPECT_TRUE(tree_present("/k"));
}

TEST_F(Access, AWriteIsTriedThreeTimes) {
  fakes::on("ktreec_set", "/a").returns(-1).times(2);
  EXPECT_EQ(tree_write_with_tries("/a", "1"), 0);
  EXPECT_EQ(fakes::tree_get("/a"), "1");
  EXPECT_EQ(fakes::writes().size(), 3U);
  fakes::on("ktreec_set", "/b").returns(-1);
  EXPECT_EQ(fakes::logged(0, [] { EXPECT_EQ(tree_write_with_tries("/b", "1"), -103); }).size(), 3U);
}

TEST_F(Access, OtherRefusalsAreFailuresToo) {
  fakes::on("ktreec_set", "/a").returns(5);
  EXPECT_EQ(tree_write("/a", "1"), -103);
  EXPECT_EQ(tree_delete("/missing"), -103);
}

class DebugLevel : public fakes::Test {};

TEST_F(DebugLevel, IsTheStoredNumberOrZero) {
  EXPECT_EQ(dbg_get_remvol_debug_lv(), 0);
  for (const auto& [text, level] :
       std::vector<std::pair<const char*, int>>{{"3", 3}, {"-1", -1}, {"", 0}, {"abc", 0}, {"2x", 2}}) {
    fakes::tree_set({{"/iscsi/initiator/dbg", text}});
    EXPECT_EQ(dbg_get_remvol_debug_lv(), level) << text;
  }
}

TEST_F(DebugLevel, IsCutToTheSizeOfAStateNumber) {
  fakes::tree_set({{"/iscsi/initiator/dbg", std::string(126, '0') + "2"}});
  EXPECT_EQ(dbg_get_remvol_debug_lv(), 2);
  fakes::tree_set({{"/iscsi/initiator/dbg", std::string(127, '0') + "2"}});
  EXPECT_EQ(dbg_get_remvol_debug_lv(), 0);
}

TEST_F(DebugLevel, IsLoggedUnderItsOwnFileName) {
  fakes::tree_set({{"/iscsi/initiator/dbg", "7"}});
  EXPECT_EQ(fakes::logged(1, [] { (void)dbg_get_remvol_debug_lv(); }),
            Texts{"remvol_debug.cpp:dbg_get_remvol_debug_lv: get debug level = 7"});
  EXPECT_EQ(fakes::logged(0, [] { (void)dbg_get_remvol_debug_lv(); }), Texts{});
}

}  // namespace
