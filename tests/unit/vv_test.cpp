// What the front end knows: portals, the tool's words, its steps, and why it failed.
#include <gtest/gtest.h>

#include <fstream>
#include <sstream>

#include "vv/explanation.h"
#include "vv/kernel_log.h"
#include "vv/portal.h"
#include "vv/progress.h"
#include "vv/searches.h"
#include "vv/tool.h"
#include "vv/volumes.h"

namespace vv {
namespace {

using vvstat::Target;
using vvstat::Volume;

std::string sample(const std::string& name) {
  std::stringstream text;
  text << std::ifstream(SAMPLES "/iscsiadm/" + name).rdbuf();
  EXPECT_NE(text.str(), "") << name;
  return text.str();
}

// --- portals ---

TEST(Portal, IsReadAsPeopleWriteIt) {
  struct {
    const char* given;
    const char* text;
  } const kCases[] = {{"10.9.0.2", "10.9.0.2:3260"},
                      {"10.9.0.2:1", "10.9.0.2:1"},
                      {"10.9.0.2:65535", "10.9.0.2:65535"},
                      {"fd00:9::2", "[fd00:9::2]:3260"},
                      {"::1", "[::1]:3260"},
                      {"[fd00:9:0:0::2]:3261", "[fd00:9::2]:3261"},
                      {"[fe80::2]", "[fe80::2]:3260"}};
  for (const auto& one : kCases) {
    Portal portal;
    std::string why;
    ASSERT_TRUE(read_portal(one.given, portal, why)) << one.given << ": " << why;
    EXPECT_EQ(portal.text(), one.text);
    EXPECT_EQ(stored_portal(portal.stored_address(), portal.port).text(), one.text);
  }
}

TEST(Portal, SaysWhatIsNone) {
  for (const char* given :
       {"", ":", ":3260", "10.9.0.2:", "10.9.0.2:0", "10.9.0.2:65536", "10.9.0.2:3260x", "10.9.0.2:-1", "[",
        "[]", "[]:3260", "[fd00::2", "[fd00::2]:", "[fd00::2]x:1", "10.9.0.2:99999999999999999999"}) {
    Portal portal{"before", 7};
    std::string why;
    EXPECT_FALSE(read_portal(given, portal, why)) << given;
    EXPECT_NE(why, "") << given;
    EXPECT_EQ(portal.address, "before") << given;
  }
}

// --- the tool's words ---

TEST(Tool, CredentialsStandBehindTheSwitch) {
  Credentials credentials;
  credentials.user = "maria";
  credentials.secret = "the secret";
  const Portal portal{"fd00::2", 3261};
  EXPECT_EQ(add_arguments("iqn.t", 0, "Ton & Film", portal, credentials),
            (Arguments{"--add", "-n", "iqn.t", "-l", "0", "-i", "fd00::2", "-p", "3261", "-s", "Ton & Film",
                       "-c", "1", "-U", "maria", "-P", "the secret"}));
  EXPECT_EQ(modify_arguments("iqn.t", credentials),
            (Arguments{"--modify", "-n", "iqn.t", "-c", "1", "-U", "maria", "-P", "the secret"}));
  EXPECT_EQ(search_lun_arguments("iqn.t", portal, Credentials()),
            (Arguments{"--search_lun", "-n", "iqn.t", "-i", "fd00::2", "-p", "3261", "-c", "0"}));
  EXPECT_EQ(modify_address_arguments("iqn.t", portal),
            (Arguments{"--modify_address", "-n", "iqn.t", "-i", "fd00::2", "-p", "3261"}));
}

// --- steps ---

Target target_with(int connect_state, std::vector<Volume> volumes) {
  Target target{};
  target.name = "iqn.t";
  target.address = "10.9.0.2";
  target.port = 3260;
  target.connect_state = connect_state;
  target.volumes = std::move(volumes);
  return target;
}

Volume volume_with(int lun, int format_state, int volume_state, int progress = 0) {
  Volume volume{};
  volume.lun = lun;
  volume.share = "Photos";
  volume.format_state = format_state;
  volume.volume_state = volume_state;
  volume.progress = progress;
  return volume;
}

using Steps = std::vector<std::string>;

TEST(Progress, AChangeOfTheTreeIsAStep) {
  EXPECT_EQ(steps_between(target_with(0, {}), target_with(2, {})),
            Steps{"logging in to iqn.t at 10.9.0.2:3260"});
  EXPECT_EQ(steps_between(target_with(2, {}), target_with(1, {})), Steps{"logged in to iqn.t"});
  EXPECT_EQ(steps_between(target_with(2, {}), target_with(4, {})), Steps{});
  struct {
    int format_before, format_now, volume_before, volume_now;
    Steps steps;
  } const kCases[] = {{0, 0, 0, 0, {}},
                      {-1, -1, -1, 1, {"Photos: looking at its disk"}},
                      {0, 4, 1, 1, {"Photos: waiting until another volume is formatted"}},
                      {4, 1, 1, 1, {"Photos: formatting"}},
                      {1, 0, 1, 1, {"Photos: formatted"}},
                      {1, 3, 1, 3, {}},
                      {1, 0, 1, 0, {"Photos: formatted", "Photos: its disk is ready"}},
                      {0, 0, 1, 5, {}},
                      {0, 0, 2, 0, {}}};
  for (const auto& one : kCases) {
    EXPECT_EQ(steps_between(target_with(1, {volume_with(1, one.format_before, one.volume_before)}),
                            target_with(1, {volume_with(1, one.format_now, one.volume_now)})),
              one.steps)
        << one.format_before << one.format_now << one.volume_before << one.volume_now;
  }
}

TEST(Progress, AVolumeIsKnownByItsLunNotByItsSlot) {
  const Target before = target_with(1, {volume_with(1, 0, 0), volume_with(2, 0, 1)});
  EXPECT_EQ(steps_between(before, target_with(1, {volume_with(2, 0, 0)})),
            Steps{"Photos: its disk is ready"});
  EXPECT_EQ(steps_between(target_with(1, {}), target_with(1, {volume_with(3, 1, 1)})),
            (Steps{"Photos: looking at its disk", "Photos: formatting"}));
}

TEST(Progress, ABarFitsIntoItsLine) {
  EXPECT_EQ(bar(volume_with(1, 1, 1, 50), 80),
            "Photos: formatting [####################                    ] 50%");
  EXPECT_EQ(bar(volume_with(1, 1, 1, 0), 80).find('#'), std::string::npos);
  EXPECT_EQ(bar(volume_with(1, 1, 1, 100), 80).find("# "), std::string::npos);
  for (size_t width = 5; width < 100; width++) {
    for (const int progress : {0, 1, 99, 100}) {
      EXPECT_LT(bar(volume_with(1, 1, 1, progress), width).size(), width);
    }
  }
}

TEST(Progress, OnlyARunningFormatHasABar) {
  EXPECT_EQ(formatting(target_with(1, {volume_with(1, 0, 0), volume_with(2, 4, 1)})), nullptr);
  const Target target = target_with(1, {volume_with(1, 0, 0), volume_with(2, 1, 1)});
  EXPECT_EQ(formatting(target), &target.volumes[1]);
}

// --- why it failed ---

TEST(Explanation, RealOutputOfTheInitiatorIsUnderstood) {
  struct {
    const char* file;
    const char* why;
  } const kCases[] = {
      {"login-no-secret.err", "the target refused the user name or the password"},
      {"discovery-refused.err", "the storage server's machine answers, but nothing listens at that port"},
      {"discovery-ipv6.err", "no network of this machine leads to that address"},
      {"login-unknown-target.err", "the target's record could not be made"},
  };
  for (const char* release : {"bookworm", "trixie"}) {
    for (const auto& one : kCases) {
      const std::string file = std::string(release) + "/" + one.file;
      const Failure failure = explain_output(sample(file), kLoginStep);
      EXPECT_EQ(failure.why, one.why) << file;
      EXPECT_NE(failure.advice, "") << file;
      EXPECT_EQ(failure.details.size(), 1U) << file;
      EXPECT_EQ(failure.step, kLoginStep);
    }
  }
}

TEST(Explanation, WhatTheInitiatorSaysInEveryRunIsNotShown) {
  for (const char* file : {"bookworm/login.out", "bookworm/new-t1.out", "trixie/login.out",
                           "trixie/new-t1.out", "trixie/new-t1.err", "trixie/logout.out"}) {
    EXPECT_EQ(telling_lines(sample(file)), Steps{}) << file;
  }
}

TEST(Explanation, WhatIsNotUnderstoodIsShown) {
  const Failure failure = explain_output(
      "\nLogging in to x\n(src.cpp:task_x:1): a\n(src.cpp:task_x:2): a\nb\r\nexecute failed.\n", kMountStep);
  EXPECT_EQ(failure.why, "");
  EXPECT_EQ(failure.details, (Steps{"a", "b"}));
}

TEST(Explanation, OnlyTheLastLinesAreShown) {
  EXPECT_EQ(explain_output("1\n2\n3\n4\n5\n6\n", kMountStep).details, (Steps{"3", "4", "5", "6"}));
  EXPECT_EQ(explain_output("", kMountStep).details, Steps{});
  EXPECT_EQ(explain_output("(a", kMountStep).details, Steps{"(a"});
}

// --- the kernel's log ---

TEST(KernelLog, AMessageIsBetweenSemicolonAndEndOfLine) {
  EXPECT_EQ(message_of("3,42,99,-;EXT4-fs (sdb1): error\n SUBSYSTEM=block\n"), "EXT4-fs (sdb1): error");
  EXPECT_EQ(message_of("no record"), "");
  EXPECT_EQ(message_of(""), "");
  EXPECT_EQ(message_of("3,1,2,-;\x1b[2J"), "\\x1B[2J");
}

TEST(KernelLog, ADiskIsToldByItsName) {
  EXPECT_TRUE(tells_of("sd 2:0:0:1: [sdb] Write Protect is on", "sdb"));
  EXPECT_TRUE(tells_of("EXT4-fs (sdb1): error", "sdb"));
  EXPECT_TRUE(tells_of("sdb12", "sdb"));
  EXPECT_FALSE(tells_of("EXT4-fs (sdbc1): error", "sdb"));
  EXPECT_FALSE(tells_of("EXT4-fs (asdb1): error", "sdb"));
  EXPECT_FALSE(tells_of("sdb1x", "sdb"));
  EXPECT_FALSE(tells_of("anything", ""));
}

// --- what the searches have found ---

TEST(Searches, NamesComeOnceAndInOrder) {
  const FoundTargets found = found_targets(platform::TreeReader(
      "/temp/vv_search/id:1/name=a\n/temp/vv_search/id:2/name=b\n/temp/vv_search/id:3/name=b\n"
      "/temp/vv_search/search_done=1\n"));
  EXPECT_TRUE(found.done);
  EXPECT_EQ(found.names, (Steps{"a", "b"}));
  EXPECT_FALSE(found_targets(platform::TreeReader("/temp/vv_search/id:1/name=a\n")).done);
}

TEST(Searches, LunsAreThoseOfTheTargetThatWasAskedFor) {
  const std::string list =
      "/temp/vv_search_lun/target_name=a\n/temp/vv_search_lun/lun/count=1\n/temp/vv_search_lun/lun/id:1/"
      "lun=5\n"
      "/temp/vv_search_lun/lun/id:1/size=18446744073709551615\n/temp/vv_search_lun/lun/id:1/avaliable=1\n"
      "/temp/vv_search_lun/lun/id:1/fstype=unknown\n/temp/vv_search_lun/lun/id:2/lun=6\n";
  const platform::TreeReader done(list + "/temp/vv_search_lun/err_code=0\n");
  const FoundLuns found = found_luns(done, "a");
  ASSERT_EQ(found.luns.size(), 1U);
  EXPECT_EQ(found.luns[0].number, 5);
  EXPECT_EQ(found.luns[0].size, 18446744073709551615ULL);
  EXPECT_EQ(found.luns[0].file_system, "");
  EXPECT_TRUE(found_luns(done, "b").luns.empty());
  const platform::TreeReader many(
      "/temp/vv_search_lun/target_name=a\n/temp/vv_search_lun/lun/count=2000000000\n"
      "/temp/vv_search_lun/err_code=0\n");
  EXPECT_TRUE(found_luns(many, "a").luns.empty());
  EXPECT_FALSE(found_luns(platform::TreeReader(list), "a").done);
  EXPECT_TRUE(
      found_luns(platform::TreeReader(list + "/temp/vv_search_lun/err_code=100\n"), "a").login_failed);
}

// --- names ---

TEST(Look, FindsByShareByTargetAndByLun) {
  const Look look(
      platform::TreeListing("/iscsi/initiator/id:1/target=iqn.t\n/iscsi/initiator/id:1/lun/id:1/lun=1\n"
                            "/iscsi/initiator/id:1/lun/id:1/share=A\n/iscsi/initiator/id:1/lun/id:2/lun=7\n"
                            "/iscsi/initiator/id:1/lun/id:2/share=B\n/iscsi/initiator/id:2/target=iqn.u\n"));
  EXPECT_EQ(look.share("B")->volume->lun, 7);
  EXPECT_EQ(look.share("b"), nullptr);
  EXPECT_EQ(look.target("iqn.u")->name, "iqn.u");
  EXPECT_EQ(look.target("iqn"), nullptr);
  EXPECT_EQ(look.lun("iqn.t", 1)->volume->share, "A");
  EXPECT_EQ(look.lun("iqn.u", 1), nullptr);
  EXPECT_EQ(look.volumes_of(*look.target("iqn.u")).size(), 0U);
  EXPECT_EQ(look.share_names(), "A, B");
}

}  // namespace
}  // namespace vv
