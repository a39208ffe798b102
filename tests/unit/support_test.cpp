// Support services: commands with retries, files, network probes, the LUN list.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "fakes.h"
#include "log_lines.h"
#include "support/command.h"
#include "support/files.h"
#include "support/lun_list.h"
#include "support/net.h"
#include "support/ping.h"
#include "support/text.h"

namespace {

using namespace remvol;
using fakes::logged;
using Texts = std::vector<std::string>;

class Retries : public fakes::Test {};

TEST_F(Retries, ASuccessEndsThem) {
  fakes::on("system", "cmd").returns(256).times(1);
  EXPECT_EQ(process_system_cmd_mt("cmd", 3, 100), 0);
  EXPECT_EQ(fakes::calls({"system"}), (Texts{"system cmd", "system cmd"}));
  EXPECT_EQ(fakes::calls({"usleep"}).size(), 1U);
}

TEST_F(Retries, GiveUpWithTheLastStatus) {
  fakes::on("system").returns(256).times(2);
  fakes::on("system").returns(512);
  EXPECT_EQ(process_system_cmd_mt("cmd", 3, 200000), 512);
  const Texts calls = fakes::calls();
  ASSERT_EQ(calls.size(), 5U);
  for (size_t i : {0U, 2U, 4U}) EXPECT_EQ(calls[i], "system cmd");
  for (size_t i : {1U, 3U}) {
    ASSERT_EQ(calls[i].find("usleep "), 0U);
    EXPECT_LT(std::stol(calls[i].substr(7)), 200000);
  }
}

TEST_F(Retries, AreLogged) {
  fakes::on("system").returns(0x200 | 9);
  const Texts texts = logged(2, [] { (void)process_system_cmd_mt("cmd", 2, 2); });
  const std::string wait = fakes::calls({"usleep"}).at(0).substr(7);
  const Texts failure = {"src.cpp:process_system_cmd_mt: system() of cmd 'cmd' failed",
                         "src.cpp:process_system_cmd_mt: !!!ret=521, WIFEXITED=0, WEXITSTATUS=2"};
  EXPECT_EQ(texts, (Texts{failure[0], failure[1],
                          "src.cpp:process_system_cmd_mt: retry cmd : cycle = 1, time = " + wait, failure[0],
                          failure[1]}));
}

TEST_F(Retries, AnExitIsToldFromASignal) {
  fakes::on("system").returns(256);
  EXPECT_EQ(logged(2, [] { (void)process_system_cmd_mt("cmd", 1, 2); }).back(),
            "src.cpp:process_system_cmd_mt: !!!ret=256, WIFEXITED=1, WEXITSTATUS=1");
}

TEST_F(Retries, WithoutAWaitAboveOneComeAtOnce) {
  fakes::on("system").returns(256);
  for (int wait : {1, 0, -5}) {
    EXPECT_EQ(logged(0, [&] { (void)process_system_cmd_mt("cmd", 3, wait); }).size(), 3U);
  }
  EXPECT_EQ(fakes::calls({"usleep"}), Texts{});
}

TEST_F(Retries, NoCyclesRunNothing) {
  EXPECT_EQ(process_system_cmd_mt("cmd", 0, 100), 0);
  EXPECT_EQ(process_system_cmd_mt("cmd", -1, 100), 0);
  EXPECT_EQ(fakes::calls(), Texts{});
}

class Command : public fakes::Test {};

TEST_F(Command, AFailureIsLoggedInTheCallersName) {
  fakes::on("system", "bad").returns(512);
  const auto caller_of_it = [] {
    const LogScope scope("task_add");
    EXPECT_EQ(run_command("bad"), 512);
  };
  EXPECT_EQ(logged(0, caller_of_it), Texts{"src.cpp:task_add: system() of cmd 'bad' failed"});
  EXPECT_EQ(logged(3, [] { EXPECT_EQ(run_command("good"), 0); }), Texts{});
  EXPECT_EQ(command_exit_code(512), 2);
}

class Scope : public fakes::Test {};

TEST_F(Scope, AHelperLogsInTheNameOfTheInnermostFunctionWithOne) {
  const auto helper = [] { LOG(0, "told"); };
  const auto told = logged(0, [&] {
    const LogScope task("task_add");
    {
      const LogScope step("Target_mount");
      helper();
    }
    helper();
  });
  EXPECT_EQ(told, (Texts{"src.cpp:Target_mount: told", "src.cpp:task_add: told"}));
}

std::string function_of_a_scope() {
  const LogScope scope;
  return LogScope::function();
}

TEST_F(Scope, HasTheNameOfTheFunctionThatItStandsIn) {
  EXPECT_EQ(function_of_a_scope(), "function_of_a_scope");
  EXPECT_STREQ(LogScope::function(), "main");
}

// A folder of its own for a test.
class Files : public fakes::Test {
 protected:
  Files() {
    char name[] = "/tmp/files_test.XXXXXX";
    folder_ = mkdtemp(name);
  }
  ~Files() override { std::filesystem::remove_all(folder_); }

  std::string at(const std::string& name) const { return folder_ + "/" + name; }
  static mode_t mode_of(const std::string& path) {
    struct stat st = {};
    return stat(path.c_str(), &st) == 0 ? st.st_mode & 07777 : 0;
  }

 private:
  std::string folder_;
};

TEST_F(Files, PresenceIsChecked) {
  EXPECT_EQ(check_path_exist(at("").c_str()), 0);
  EXPECT_EQ(check_path_exist(nullptr), -1);
  EXPECT_EQ(check_path_exist(""), -1);
  const std::string absent = at("absent");
  EXPECT_EQ(logged(2, [&] { EXPECT_EQ(check_path_exist(absent.c_str()), -1); }),
            Texts{"src.cpp:check_path_exist: file path is not vaild : " + absent});
}

TEST_F(Files, ADirectoryComesWithItsParentsInOrder) {
  const std::string a = at("a");
  EXPECT_EQ(logged(2, [&] { EXPECT_EQ(make_dir_include_parent((a + "/b/c").c_str(), 0750), 0); }),
            (Texts{"src.cpp:make_dir_include_parent: mkdir " + a + " - successed",
                   "src.cpp:make_dir_include_parent: mkdir " + a + "/b - successed",
                   "src.cpp:make_dir_include_parent: mkdir " + a + "/b/c - successed"}));
  for (const char* made : {"a", "a/b", "a/b/c"}) EXPECT_EQ(mode_of(at(made)), 0750U) << made;
}

TEST_F(Files, ADirectoryThatExistsIsFine) {
  EXPECT_EQ(logged(2, [&] { EXPECT_EQ(make_dir_include_parent(at("").c_str(), 0), 0); }), Texts{});
}

TEST_F(Files, ModeZeroMeans0700) {
  EXPECT_EQ(make_dir_include_parent(at("x").c_str(), 0), 0);
  EXPECT_EQ(mode_of(at("x")), 0700U);
}

TEST_F(Files, ARelativeNameHasNoParent) {
  const std::string here = std::filesystem::current_path();
  std::filesystem::current_path(at(""));
  EXPECT_EQ(make_dir_include_parent("plain", 0), 0);
  std::filesystem::current_path(here);
  EXPECT_EQ(mode_of(at("plain")), 0700U);
}

TEST_F(Files, ADirectoryThatCannotBeMadeFailsWithItsParent) {
  std::ofstream(at("file")) << "x";
  EXPECT_EQ(make_dir_include_parent(nullptr, 0), -1);
  const std::string below = at("file/b");
  EXPECT_EQ(logged(0, [&] { EXPECT_EQ(make_dir_include_parent((below + "/c").c_str(), 0), -1); }),
            Texts{"src.cpp:make_dir_include_parent: mkdir " + below + " failed"});
}

TEST_F(Files, WithoutMemoryNoDirectoryIsMade) {
  fakes::on("strdup").returns(0);
  EXPECT_EQ(logged(0, [&] { EXPECT_EQ(make_dir_include_parent(at("x").c_str(), 0), -1); }),
            Texts{"src.cpp:make_dir_include_parent: strdup fail"});
}

TEST_F(Files, RemovalOfAFile) {
  const std::string path = at("file");
  std::ofstream(path) << "x";
  EXPECT_EQ(logged(2, [&] { EXPECT_EQ(_remove_file(path.c_str()), 0); }),
            Texts{"src.cpp:_remove_file: unlink " + path + " "});
  EXPECT_FALSE(std::filesystem::exists(path));
  EXPECT_EQ(_remove_file(path.c_str()), 0);
  EXPECT_EQ(_remove_file(at("").c_str()), -1);
}

TEST_F(Files, ARemovedPathTakesNothingBehindLinksAlong) {
  std::ofstream(at("victim")) << "kept";
  std::filesystem::create_symlink(at("victim"), at("link"));
  std::filesystem::create_hard_link(at("victim"), at("hard"));
  std::filesystem::create_directories(at("tree/below"));
  std::filesystem::create_directories(at("outside"));
  std::ofstream(at("outside/file")) << "kept";
  std::filesystem::create_directory_symlink(at("outside"), at("tree/below/link"));
  ASSERT_EQ(mkfifo(at("fifo").c_str(), 0600), 0);
  std::ofstream(at("own")) << "kept";
  for (const char* name : {"link", "hard", "tree", "fifo", "own", "absent"}) remove_path(at(name).c_str());
  for (const char* name : {"link", "hard", "tree", "fifo", "own"}) {
    EXPECT_FALSE(std::filesystem::exists(std::filesystem::symlink_status(at(name)))) << name;
  }
  EXPECT_EQ(std::filesystem::file_size(at("victim")), 4U);
  EXPECT_EQ(std::filesystem::file_size(at("outside/file")), 4U);
}

TEST_F(Files, AClaimedFolderIsOurOwnAlone) {
  ASSERT_TRUE(claim_folder(at("new").c_str()));
  EXPECT_EQ(std::filesystem::status(at("new")).permissions(), std::filesystem::perms::owner_all);
  std::ofstream(at("new/file")) << "kept";
  std::filesystem::permissions(at("new"), std::filesystem::perms(0755));
  ASSERT_TRUE(claim_folder(at("new").c_str()));
  EXPECT_EQ(std::filesystem::status(at("new")).permissions(), std::filesystem::perms::owner_all);
  EXPECT_TRUE(std::filesystem::exists(at("new/file")));
  EXPECT_FALSE(claim_folder(at("absent/below").c_str()));
}

TEST_F(Files, WhatStandsInAClaimedFoldersPlaceIsReplaced) {
  std::filesystem::create_directory(at("elsewhere"));
  std::ofstream(at("elsewhere/file")) << "kept";
  std::filesystem::create_directory_symlink(at("elsewhere"), at("link"));
  std::ofstream(at("plain")) << "x";
  for (const char* name : {"link", "plain"}) {
    ASSERT_TRUE(claim_folder(at(name).c_str())) << name;
    EXPECT_TRUE(std::filesystem::is_directory(std::filesystem::symlink_status(at(name)))) << name;
  }
  EXPECT_TRUE(std::filesystem::exists(at("elsewhere/file")));
  std::filesystem::create_directory(at("foreign"));
  std::ofstream(at("foreign/file")) << "x";
  if (chown(at("foreign").c_str(), 12345, 12345) != 0) GTEST_SKIP() << "needs root";
  ASSERT_TRUE(claim_folder(at("foreign").c_str()));
  EXPECT_FALSE(std::filesystem::exists(at("foreign/file")));
}

struct PingCase {
  const char* address;
  const char* interface;
  const char* command;
};

class Ping : public fakes::Test, public testing::WithParamInterface<PingCase> {};

TEST_P(Ping, RunsOneCommand) {
  const auto& [address, interface, command] = GetParam();
  EXPECT_EQ(ping_ip(address, interface), 1);
  EXPECT_EQ(fakes::commands(), Texts{command});
}

INSTANTIATE_TEST_SUITE_P(Commands, Ping,
                         testing::Values(PingCase{"10.0.0.1", "eth0", "ping -W 1 -c 2 -I eth0 10.0.0.1"},
                                         PingCase{"10.0.0.1", nullptr, "ping -W 1 -c 2 10.0.0.1"},
                                         PingCase{"10.0.0.1", "", "ping -W 1 -c 2 10.0.0.1"},
                                         PingCase{"[fe80::1]", "eth0", "ping -6 -W 1 -c 2 -I eth0 fe80::1"},
                                         PingCase{"fe80::1", "eth0", "ping -6 -W 1 -c 2 -I eth0 fe80::1"},
                                         PingCase{"[2001:db8::1]", nullptr, "ping -6 -W 1 -c 2 2001:db8::1"},
                                         PingCase{"2001:db8::1", "", "ping -6 -W 1 -c 2 2001:db8::1"}));

class Probe : public fakes::Test {};

TEST_F(Probe, AnyFailureOfPingIsNoAnswer) {
  fakes::on("system").returns(256).times(1);
  fakes::on("system").returns(-1);
  EXPECT_EQ(ping_ip("10.0.0.1", nullptr), 0);
  EXPECT_EQ(ping_ip("10.0.0.1", nullptr), 0);
}

TEST_F(Probe, NoAddressIsNotAsked) {
  EXPECT_EQ(ping_ip("", "eth0"), 0);
  EXPECT_EQ(ping_ip(nullptr, "eth0"), 0);
  EXPECT_EQ(fakes::calls(), Texts{});
}

TEST_F(Probe, TheCommandIsLoggedForIpv6Alone) {
  EXPECT_EQ(logged(2, [] { (void)ping_ip("fe80::1", nullptr); }),
            Texts{"src.cpp:ping_ip: run cmd = ping -6 -W 1 -c 2 fe80::1"});
  EXPECT_EQ(logged(3, [] { (void)ping_ip("10.0.0.1", nullptr); }), Texts{});
}

TEST(Ipv6Text, HasAColon) {
  EXPECT_NE(is_ipv6_text("::1"), 0);
  EXPECT_NE(is_ipv6_text("[::1]"), 0);
  EXPECT_EQ(is_ipv6_text("10.0.0.1"), 0);
  EXPECT_EQ(is_ipv6_text(""), 0);
}

std::string parsed(const char* text) {
  unsigned char bytes[16];
  memset(bytes, 0xaa, sizeof bytes);
  if (parse_ipv6_text(bytes, sizeof bytes, text) != 0) return "refused";
  std::string hex;
  for (unsigned char byte : bytes) {
    char two[3];
    snprintf(two, sizeof two, "%02x", byte);
    hex += two;
  }
  return hex;
}

TEST(Ipv6Text, IsParsedGroupByGroup) {
  EXPECT_EQ(parsed("2001:db8:1:22:333:4444:f00:ffff"),
            "20010db8000100220333"
            "44440f00ffff");
  EXPECT_EQ(parsed("fe80::1"), "fe800000000000000000000000000001");
  EXPECT_EQ(parsed("fe80::1:2:3"), "fe800000000000000000000100020003");
  EXPECT_EQ(parsed("1:2::7:8"), "00010002000000000000000000070008");
  EXPECT_EQ(parsed("FE80:0:0:1::1"), "fe800000000000010000000000000001");
}

TEST(Ipv6Text, TooShortOrNothingIsRefused) {
  unsigned char bytes[16];
  EXPECT_EQ(parsed("::"), "refused");
  EXPECT_EQ(parsed(""), "refused");
  EXPECT_EQ(parse_ipv6_text(bytes, sizeof bytes, nullptr), -1);
  EXPECT_EQ(parse_ipv6_text(bytes, 15, "fe80::1"), -1);
}

TEST(Ipv6Text, NoTextWritesBeyondTheBuffer) {
  const std::string many(1000, ':');
  EXPECT_NE(parsed(many.c_str()), "");
  EXPECT_NE(parsed("1:2:3:4:5:6:7:8:9:a:b:c"), "");
  EXPECT_NE(parsed("ffffffffffffffffffff:g:::x"), "");
}

TEST(LinkLocal, IsToldByItsFirstEightBytes) {
  for (const char* yes : {"fe80::1", "[fe80::1]", "FE80::abcd:1", "febf::1", "fe80:0:0:0:1:2:3:4"}) {
    EXPECT_EQ(is_ipv6_link_local(yes), 1) << yes;
  }
  for (const char* no :
       {"fe80:0:0:1::1", "2001:db8::1", "[2001:db8::1]", "fec0::1", "fe40::1", "::1", "fe80:1::1"}) {
    EXPECT_EQ(is_ipv6_link_local(no), 0) << no;
  }
}

TEST(LinkLocal, ABadArgumentIsRefused) {
  EXPECT_EQ(is_ipv6_link_local(nullptr), -1);
  EXPECT_EQ(is_ipv6_link_local(""), -1);
  EXPECT_EQ(is_ipv6_link_local("[]"), -1);
}

TEST(LunList, GrowsAtItsEndAndIsFreedWhole) {
  LunNode* head = lun_node_new();
  ASSERT_NE(head, nullptr);
  const LunNode zero = {};
  EXPECT_EQ(memcmp(head, &zero, sizeof zero), 0);
  LunNode* second = lun_node_new();
  LunNode* third = lun_node_new();
  lun_node_append(head, second);
  lun_node_append(head, third);
  EXPECT_EQ(head->next, second);
  EXPECT_EQ(second->next, third);
  EXPECT_EQ(third->next, nullptr);
  lun_node_append(nullptr, third);
  lun_node_append(head, nullptr);
  EXPECT_EQ(third->next, nullptr);
  lun_node_free_list(head);
  lun_node_free_list(nullptr);
}

TEST(BoundedText, IsCut) {
  char field[4];
  copy_text(field, "abcdef");
  EXPECT_STREQ(field, "abc");
  memset(field, 'x', sizeof field);
  copy_text(field, "a");
  EXPECT_EQ(memcmp(field, "a\0\0", 4), 0);
  EXPECT_STREQ(Text<4>("%d", 123456), "123");
  EXPECT_TRUE(Text<4>().empty());
}

}  // namespace
