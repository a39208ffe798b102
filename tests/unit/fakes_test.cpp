// The fake platform keeps its promises.
#include "fakes.h"

#include <gtest/gtest-spi.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "ktreec.h"
#include "sysaux.h"

namespace {

using Texts = std::vector<std::string>;

class Fakes : public fakes::Test {};

std::string read(const char* path, size_t size = 64) {
  std::string buffer(size, 'x');
  const int result = ktreec_get_wb(fakes::kMainSocket, 0, path, buffer.data(), buffer.size());
  return std::to_string(result) + " " + buffer.c_str();
}

TEST_F(Fakes, TreeIsPositional) {
  fakes::tree_set({{"/a/id:1/name", "one"}, {"/a/id:3/name", "three"}, {"/a/id:2/name", "two"}});
  EXPECT_EQ(read("/a/id/name"), "3 one");
  EXPECT_EQ(ktreec_del(fakes::kMainSocket, 0, "/a/id:2"), 0);
  EXPECT_EQ(read("/a/id:2/name"), "5 three");
  EXPECT_EQ(read("/a/id:3/name"), "-1 ");
  EXPECT_EQ(ktreec_del(fakes::kMainSocket, 0, "/a/id:3"), -1);
  EXPECT_EQ(fakes::tree_dump(),
            (std::map<std::string, std::string>{{"/a/id:1/name", "one"}, {"/a/id:2/name", "three"}}));
}

TEST_F(Fakes, TreeTellsEmptyFromMissingAndCutsToTheBuffer) {
  fakes::tree_set({{"/empty", ""}, {"/long", "0123456789"}});
  EXPECT_EQ(read("/empty"), "0 ");
  EXPECT_EQ(read("/missing"), "-1 ");
  EXPECT_EQ(read("/long", 5), "4 0123");
}

TEST_F(Fakes, TreeRefusesBadPaths) {
  for (const char* path : {"", "/", "a", "/a/", "/a:0", "/a:4097", "/a:x", "/1", "//a"}) {
    EXPECT_EQ(ktreec_set(fakes::kMainSocket, 0, path, "v"), -1) << path;
  }
  EXPECT_TRUE(fakes::tree_dump().empty());
}

TEST_F(Fakes, TreesOfTwoSocketsAreApart) {
  ktreec_set("/other", 0, "/a", "1");
  EXPECT_EQ(read("/a"), "-1 ");
  EXPECT_EQ(fakes::tree_get("/a", "/other"), "1");
}

TEST_F(Fakes, ChosenWritesFail) {
  fakes::on("ktreec_set", "/a").returns(-1).skip(1).times(1);
  EXPECT_EQ(ktreec_set(fakes::kMainSocket, 0, "/a", "1"), 0);
  EXPECT_EQ(ktreec_set(fakes::kMainSocket, 0, "/a", "2"), -1);
  EXPECT_EQ(ktreec_set(fakes::kMainSocket, 0, "/a", "3"), 0);
  EXPECT_EQ(fakes::writes(), (Texts{"set /a=1", "set /a=2", "set /a=3"}));
}

TEST_F(Fakes, CallsAreRecordedInOrderAndSleepsAreInstant) {
  EXPECT_EQ(system("rm -rf /"), 0);
  EXPECT_EQ(sleep(100000), 0U);
  System("umount -f \"%s\"", "/mnt/VV/a");
  EXPECT_EQ(fakes::calls(), (Texts{"system rm -rf /", "sleep 100000", "system umount -f \"/mnt/VV/a\""}));
  EXPECT_EQ(fakes::commands(), (Texts{"rm -rf /", "umount -f \"/mnt/VV/a\""}));
}

TEST_F(Fakes, RulesAnswerInOrder) {
  fakes::otherwise("system").returns(1);
  fakes::on("system", fakes::Expression{"^b"}).returns(2).times(1);
  fakes::on("system", "a").returns(3).error(EAGAIN);
  EXPECT_EQ(system("bb"), 2);
  EXPECT_EQ(system("bb"), 1);
  EXPECT_EQ(system("a"), 3);
  EXPECT_EQ(errno, EAGAIN);
}

TEST_F(Fakes, AnActionChangesTheWorldAtAChosenCall) {
  fakes::on("sleep").skip(1).times(1).does([] { fakes::tree_set({{"/a", "changed"}}); }).then_real();
  sleep(1);
  EXPECT_EQ(read("/a"), "-1 ");
  sleep(1);
  EXPECT_EQ(read("/a"), "7 changed");
}

TEST_F(Fakes, PopenGivesTextAndStatus) {
  char line[32] = "";
  fakes::on("popen", "iscsiadm -m session").text("one\ntwo\n").returns(21 << 8);
  FILE* stream = popen("iscsiadm -m session", "r");
  ASSERT_NE(stream, nullptr);
  EXPECT_STREQ(fgets(line, sizeof line, stream), "one\n");
  EXPECT_EQ(pclose(stream), 21 << 8);
}

TEST_F(Fakes, WhatAForkedChildDoesIsSeen) {
  if (const pid_t child = fork(); child == 0) {
    if (system("mke2fs") != 0) _exit(1);
    ktreec_set(fakes::kMainSocket, 0, "/progress", "50");
    _exit(0);
  } else {
    waitpid(child, nullptr, 0);
  }
  EXPECT_EQ(fakes::commands(), Texts{"mke2fs"});
  EXPECT_EQ(fakes::tree_get("/progress"), "50");
}

TEST_F(Fakes, OutputIsCaught) {
  EXPECT_EQ(fakes::output_of([] { puts("here"); }), "here\n");
}

TEST_F(Fakes, AnswersOfTheUtilities) {
  char text[16];
  unsigned long long total, used, available;
  fakes::on("sys_get_fs_type", "/dev/sdb1").text("ext4");
  fakes::on("sys_get_df_info").text("30 20 10");
  EXPECT_EQ(sys_get_fs_type(text, "/dev/sdb1"), 0);
  EXPECT_STREQ(text, "ext4");
  EXPECT_EQ(sys_get_df_info("/mnt", &total, &used, &available), 0);
  EXPECT_EQ(total - used - available, 0U);
}

// The test of a refusal ends as it would: its TearDown fails.
class Refused : public fakes::Test {
 protected:
  void TearDown() override {
    EXPECT_NONFATAL_FAILURE(fakes::Test::TearDown(), "unanswered sys_check_dev /dev/sdb");
  }
};

TEST_F(Refused, WhatNobodyAnswersFailsTheTest) {
  EXPECT_NE(sys_check_dev("/dev/sdb"), 0);
}

}  // namespace
