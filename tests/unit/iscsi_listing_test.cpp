// What the listings of iscsiadm say: on samples of the older system, on those recorded on each release of
// Debian, and on what no system should print.
#include <gtest/gtest.h>

#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "iscsi/session_listing.h"

namespace remvol {
namespace {

using Texts = std::vector<std::string>;

constexpr char kT1[] = "iqn.2026-01.org.example:t1";
constexpr char kT10[] = "iqn.2026-01.org.example:t10";

std::string sample(const std::string& name) {
  std::ifstream file(SAMPLES "/iscsiadm/" + name);
  EXPECT_TRUE(file.is_open()) << name;
  std::ostringstream text;
  text << file.rdbuf();
  return text.str();
}

// What is recorded on each release.
class Recorded : public testing::TestWithParam<const char*> {
 protected:
  static std::string recorded(const std::string& name) {
    return sample(std::string(GetParam()) + "/" + name);
  }
};

INSTANTIATE_TEST_SUITE_P(Debian, Recorded, testing::Values("bookworm", "trixie"),
                         [](const auto& release) { return std::string(release.param); });

// The text in the pieces that fgets would give.
Texts pieces(const std::string& text) {
  Texts found;
  for (size_t at = 0; at < text.size();) {
    const size_t newline = text.find('\n', at);
    const size_t length = newline == std::string::npos ? text.size() - at : newline + 1 - at;
    const size_t taken = std::min(length, kListingLineSize - 1);
    found.push_back(text.substr(at, taken));
    at += taken;
  }
  return found;
}

// The usable LUNs of the target as "HOST:LUN DEVICE".
Texts usable_luns(const std::string& text, const char* name, DetailedListing listing = kLunListing) {
  Texts found;
  for (const std::string& line : pieces(text)) {
    const ListingLine what = read_listing_line(&listing, line.c_str(), name);
    if (what == ListingLine::kEnd) break;
    if (what != ListingLine::kDisk) continue;
    std::ostringstream lun;
    lun << listing.host << ':' << listing.lun << ' ' << std::string(listing.disk, listing.device_length);
    found.push_back(lun.str());
  }
  return found;
}

std::string lun(int host, int number, const char* device) {
  return std::to_string(host) + ":" + std::to_string(number) + " " + device;
}

// The block of one logged-in target with what `luns` says about its disks.
std::string block(const std::string& target_line, const std::string& luns,
                  const std::string& state = "LOGGED_IN") {
  return target_line + "\n\tCurrent Portal: 10.0.0.1:3260,1\n\t\tiSCSI Session State: " + state +
         "\n\t\tHost Number: 7\tState: running\n" + luns;
}

std::string disk(int lun, const std::string& device) {
  return "\t\tscsi7 Channel 00 Id 0 Lun: " + std::to_string(lun) + "\n\t\t\tAttached scsi disk " + device +
         "\t\tState: running\n";
}

std::string controller(int lun) {
  return "\t\tscsi7 Channel 00 Id 0 Lun: " + std::to_string(lun) + "\n";
}

std::string target(const char* name) {
  return std::string("Target: ") + name;
}

TEST(DetailedListing, OlderSystemsDisksThatRun) {
  const std::string text = sample("written-older-P3.txt");
  EXPECT_EQ(usable_luns(text, kT1), (Texts{"3:0 sdb", "3:2 sdd"}));
  EXPECT_EQ(usable_luns(text, kT10), (Texts{"4:0 sde"}));
}

TEST(DetailedListing, SessionThatIsNotLoggedInShowsNoLun) {
  EXPECT_EQ(usable_luns(sample("written-older-P3.txt"), "iqn.2026-01.org.example:lost"), Texts{});
}

TEST(DetailedListing, NamesAreComparedWhole) {
  const std::string text = sample("written-older-P3.txt");
  EXPECT_EQ(usable_luns(text, "iqn.2026-01.org.example:t"), Texts{});
  EXPECT_EQ(usable_luns(text, "t1"), Texts{});
  EXPECT_EQ(usable_luns(text, "iqn.2026-01.org.example:t100"), Texts{});
}

TEST(DetailedListing, FlashMarkBehindTheNameIsDropped) {
  for (const char* mark : {"", " (non-flash)", " (flash)"}) {
    EXPECT_EQ(usable_luns(block(target(kT1) + mark, disk(1, "sdb")), kT1), (Texts{"7:1 sdb"})) << mark;
  }
  EXPECT_EQ(usable_luns(block(target(kT1) + " (other)", disk(1, "sdb")), kT1), Texts{});
}

TEST(DetailedListing, LunsWithoutDiskHideNeitherTheNextLunNorTheNextTarget) {
  const std::string text = sample("written-controllers-P3.txt");
  EXPECT_EQ(usable_luns(text, kT1), (Texts{"3:1 sdb", "3:10 sdl", "4:1 sdm"}));
  EXPECT_EQ(usable_luns(text, kT10), (Texts{"5:1 sdc", "5:2 sdd"}));
}

TEST_P(Recorded, TwelveLunsInTheOrderOfTheirText) {
  EXPECT_EQ(usable_luns(recorded("two-targets-session-P3.out"), kT1),
            (Texts{lun(1, 1, "sda"), lun(1, 10, "sdj"), lun(1, 11, "sdk"), lun(1, 12, "sdl"),
                   lun(1, 2, "sdb"), lun(1, 3, "sdc"), lun(1, 4, "sdd"), lun(1, 5, "sde"), lun(1, 6, "sdf"),
                   lun(1, 7, "sdg"), lun(1, 8, "sdh"), lun(1, 9, "sdi")}));
}

// Its only line is directly followed by the line of the next target.
TEST_P(Recorded, TargetWithAControllerAloneHasNoLun) {
  for (const char* name : {"controller-only", "two-targets", "four-targets", "two-interfaces"}) {
    const std::string text = recorded(std::string(name) + "-session-P3.out");
    EXPECT_EQ(usable_luns(text, "iqn.2026-01.org.example:controller-only"), Texts{}) << name;
  }
}

TEST_P(Recorded, NamesThatBeginAlike) {
  const std::string text = recorded("four-targets-session-P3.out");
  EXPECT_EQ(usable_luns(text, kT1).size(), 12u);
  EXPECT_EQ(usable_luns(text, kT10), (Texts{lun(2, 1, "sdm"), lun(2, 2, "sdn")}));
  EXPECT_EQ(usable_luns(text, "iqn.2026-01.org.example:t1-x"), (Texts{lun(3, 1, "sdo")}));
}

TEST_P(Recorded, AllSessionsOfATargetCount) {
  EXPECT_EQ(
      usable_luns(recorded("two-interfaces-session-P3.out"), kT10),
      (Texts{lun(2, 1, "sdm"), lun(2, 2, "sdn"), lun(3, 1, "sdo"), lun(3, 2, "sdp"), lun(4, 1, "sdq"),
             lun(4, 2, "sdr"), lun(5, 1, "sds"), lun(5, 2, "sdt"), lun(6, 1, "sdu"), lun(6, 2, "sdv")}));
}

TEST_P(Recorded, LostSessionsShowNoLun) {
  for (const char* name : {"cable-cut", "cable-cut-given-up", "target-killed"}) {
    const std::string text = recorded(std::string(name) + "-session-P3.out");
    EXPECT_EQ(usable_luns(text, kT1), Texts{}) << name;
    EXPECT_EQ(usable_luns(text, kT1, kDeviceListing), Texts{}) << name;
  }
  EXPECT_EQ(usable_luns(recorded("cable-back-session-P3.out"), kT1).size(), 12u);
}

TEST(DetailedListing, DisksOfTheNextTargetAreNeverTaken) {
  const std::string text = block(target(kT1), controller(0)) + block(target(kT10), disk(0, "sdx"));
  EXPECT_EQ(usable_luns(text, kT1), Texts{});
  EXPECT_EQ(usable_luns(text, kT1, kDeviceListing), Texts{});
}

TEST(DetailedListing, OnlyTheLineBehindALunLineTellsOfItsDisk) {
  const std::string attached = "\t\t\tAttached scsi disk sdb\t\tState: running\n";
  EXPECT_EQ(usable_luns(block(target(kT1), controller(1) + "\n" + attached), kT1), Texts{});
  EXPECT_EQ(usable_luns(block(target(kT1), attached + controller(1)), kT1), Texts{});
}

TEST(DetailedListing, DiskThatDoesNotRunIsNotUsable) {
  const std::string blocked = controller(1) + "\t\t\tAttached scsi disk sdb\t\tState: blocked\n";
  EXPECT_EQ(usable_luns(block(target(kT1), blocked + disk(2, "sdc")), kT1), (Texts{"7:2 sdc"}));
}

TEST(DetailedListing, DeviceNameEndsAtTheTab) {
  const auto name_in = [](const std::string& rest) {
    return usable_luns(block(target(kT1), controller(1) + "\t\t\tAttached scsi disk" + rest), kT1);
  };
  EXPECT_EQ(name_in(" sdab\tState: running\n"), (Texts{"7:1 sdab"}));
  EXPECT_EQ(name_in(" sdab State: running\n"), (Texts{"7:1 sdab"}));
  EXPECT_EQ(name_in(" running\n"), (Texts{"7:1 running"}));
  EXPECT_EQ(name_in("\n"), Texts{});
  EXPECT_EQ(name_in(""), Texts{});
}

TEST(DetailedListing, LinesBeforeTheFirstTargetCountForTheDeviceReaderAlone) {
  const std::string text =
      "iSCSI Session State: LOGGED_IN\n" + disk(3, "sdq") + block(target(kT1), disk(1, "sdb"));
  EXPECT_EQ(usable_luns(text, kT1, kDeviceListing), (Texts{"0:3 sdq", "0:1 sdb"}));
  EXPECT_EQ(usable_luns(text, kT1, kLunListing), (Texts{"7:1 sdb"}));
}

TEST(DetailedListing, ReadingEndsBehindTheTargetsBlock) {
  DetailedListing listing = kLunListing;
  ListingLine what = ListingLine::kOther;
  const std::string text = block(target(kT1), disk(1, "sdb")) + target(kT10) + "\nanything\n";
  for (const std::string& line : pieces(text)) what = read_listing_line(&listing, line.c_str(), kT1);
  EXPECT_EQ(what, ListingLine::kEnd);
  EXPECT_EQ(listing.match, 1);
  EXPECT_EQ(listing.targets_seen, 2);
}

TEST(DetailedListing, HostAndLunAreReported) {
  DetailedListing listing = kLunListing;
  std::vector<ListingLine> seen;
  const Texts lines = pieces(block(target(kT1), disk(12, "sdb")));
  for (const std::string& line : lines) {
    const ListingLine what = read_listing_line(&listing, line.c_str(), kT1);
    if (what != ListingLine::kOther) seen.push_back(what);
  }
  EXPECT_EQ(seen, (std::vector<ListingLine>{ListingLine::kHost, ListingLine::kLun, ListingLine::kDisk}));
  EXPECT_EQ(listing.host, 7);
  EXPECT_EQ(listing.lun, 12);
  EXPECT_STREQ(listing.disk, "sdb\t\tState: running\n");
}

TEST(DetailedListing, CutAnywhereGivesTheFirstLunsAndNeverAnother) {
  for (const char* name : {"written-older-P3.txt", "written-controllers-P3.txt",
                           "bookworm/four-targets-session-P3.out", "trixie/four-targets-session-P3.out"}) {
    const std::string text = sample(name);
    const Texts all = usable_luns(text, kT1);
    for (size_t length = 0; length <= text.size(); length++) {
      const Texts found = usable_luns(text.substr(0, length), kT1);
      ASSERT_LE(found.size(), all.size());
      EXPECT_TRUE(std::equal(found.begin(), found.end(), all.begin())) << name << " cut at " << length;
    }
  }
}

TEST(DetailedListing, TenThousandLines) {
  std::string text;
  for (int i = 0; i < 2000; i++) {
    text += block(target(("iqn.2026-01.org.example:other-" + std::to_string(i)).c_str()), controller(0));
  }
  EXPECT_EQ(usable_luns(text + block(target(kT1), disk(1, "sdzz")), kT1), (Texts{"7:1 sdzz"}));
}

TEST(DetailedListing, NameOf255Characters) {
  const std::string name = "iqn." + std::string(251, 'n');
  EXPECT_EQ(usable_luns(block(target(name.c_str()) + " (non-flash)", disk(1, "sdb")), name.c_str()),
            (Texts{"7:1 sdb"}));
  EXPECT_EQ(usable_luns(block(target((name + "n").c_str()), disk(1, "sdb")), name.c_str()), Texts{});
}

bool shows(const std::string& text, const char* name) {
  for (const std::string& line : pieces(text)) {
    if (session_line_shows(line.c_str(), name)) return true;
  }
  return false;
}

TEST(PlainListing, NameIsFollowedByNeitherLetterNorDigit) {
  EXPECT_TRUE(session_line_shows("tcp: [1] 10.0.0.1:3260,1 iqn.x:t1\n", "iqn.x:t1"));
  EXPECT_TRUE(session_line_shows("tcp: [1] 10.0.0.1:3260,1 iqn.x:t1 (non-flash)\n", "iqn.x:t1"));
  EXPECT_TRUE(session_line_shows("tcp: [1] 10.0.0.1:3260,1 iqn.x:t1-x\n", "iqn.x:t1"));
  EXPECT_TRUE(session_line_shows("tcp: [1] 10.0.0.1:3260,1 iqn.x:t1.x\n", "iqn.x:t1"));
  EXPECT_FALSE(session_line_shows("tcp: [1] 10.0.0.1:3260,1 iqn.x:t10\n", "iqn.x:t1"));
  EXPECT_FALSE(session_line_shows("tcp: [1] 10.0.0.1:3260,1 iqn.x:t1x\n", "iqn.x:t1"));
  EXPECT_FALSE(session_line_shows("", "iqn.x:t1"));
}

// The first occurrence decides, so a name that stands twice in one line is judged by the first.
TEST(PlainListing, OnlyTheFirstOccurrenceInALineCounts) {
  EXPECT_FALSE(session_line_shows("tcp: [1] 10.0.0.1:3260,1 iqn.x:t10 iqn.x:t1\n", "iqn.x:t1"));
}

TEST(PlainListing, OlderSystem) {
  const std::string text = sample("written-older.txt");
  EXPECT_FALSE(shows(text, kT1));
  EXPECT_TRUE(shows(text, kT10));
  EXPECT_TRUE(shows(text, "iqn.2026-01.org.example:t2"));
  EXPECT_TRUE(shows(text, "iqn.2026-01.org.example:t3"));
}

TEST_P(Recorded, PlainListing) {
  const std::string text = recorded("four-targets-session.out");
  EXPECT_TRUE(shows(text, kT1));
  EXPECT_TRUE(shows(text, kT10));
  EXPECT_TRUE(shows(text, "iqn.2026-01.org.example:controller"));
  EXPECT_FALSE(shows(text, "iqn.2026-01.org.example:t"));
  EXPECT_FALSE(shows(text, "iqn.2026-01.org.example:t2"));
}

std::string discovered(const std::string& line) {
  char name[kListingLineSize] = "before";
  return read_discovered_name(line.c_str(), name) ? name : "no blank";
}

TEST(Discovery, NameStandsBehindTheFirstBlank) {
  EXPECT_EQ(discovered("10.0.0.1:3260,1 iqn.x:t1\n"), "iqn.x:t1");
  EXPECT_EQ(discovered("10.0.0.1:3260,1 iqn.x:t1"), "iqn.x:t1");
  EXPECT_EQ(discovered("10.0.0.1:3260,1 iqn.x:t1 more\n"), "iqn.x:t1 more");
  EXPECT_EQ(discovered("10.0.0.1:3260,1 \n"), "");
  EXPECT_EQ(discovered("10.0.0.1:3260,1\n"), "no blank");
}

// What printf does with a name as format and argument, where it is harmless, and nothing where it is not.
TEST(Discovery, PercentInANameDoesNotStand) {
  EXPECT_EQ(discovered("p a%%b\n"), "a%b");
  EXPECT_EQ(discovered("p <%s>\n"), "<<%s>>");
  EXPECT_EQ(discovered("p %s%s\n"), "%s%s");
  EXPECT_EQ(discovered("p a%nb\n"), "ab");
  EXPECT_EQ(discovered("p a%d%sb\n"), "ab");
  EXPECT_EQ(discovered("p a%-08.3llxb\n"), "ab");
  EXPECT_EQ(discovered("p 100%\n"), "100");
  EXPECT_EQ(discovered("p a%.*\n"), "a");
}

TEST(Discovery, LongNamesAreCut) {
  const std::string name(600, 'n');
  EXPECT_EQ(discovered("p " + name), name.substr(0, kListingLineSize - 1));
  const std::string doubled = std::string(400, 'n') + "%s";
  EXPECT_EQ(discovered("p " + doubled), (std::string(400, 'n') + doubled).substr(0, kListingLineSize - 1));
}

TEST_P(Recorded, Discovery) {
  const std::pair<const char*, const char*> kSamples[] = {
      {"discovery-iface0.out", "10.9.0.2"},
      {"discovery-ipv6-iface0.out", "[fd00:9::2]"},
      {"discovery-link-local.out", "[fe80::2]"},
  };
  for (const auto& [file, address] : kSamples) {
    Texts names;
    for (const std::string& line : pieces(recorded(file))) {
      EXPECT_TRUE(is_discovery_line_of(line.c_str(), address)) << line;
      names.push_back(discovered(line).substr(strlen("iqn.2026-01.org.example:")));
    }
    EXPECT_EQ(names, (Texts{"t1", "t10", "t1-x", "controller-only", "secret"})) << file;
  }
}

TEST(Discovery, LinesBeginWithTheAddress) {
  EXPECT_TRUE(is_discovery_line_of("10.0.0.1:3260,1 iqn.x:t1\n", "10.0.0.1"));
  EXPECT_TRUE(is_discovery_line_of("10.0.0.10:3260,1 iqn.x:t1\n", "10.0.0.1"));
  EXPECT_TRUE(is_discovery_line_of("[fd00::2]:3260,1 iqn.x:t1\n", "[fd00::2]"));
  EXPECT_FALSE(is_discovery_line_of("10.0.1.1:3260,1 iqn.x:10.0.0.1\n", "10.0.0.1"));
  EXPECT_FALSE(is_discovery_line_of("", "10.0.0.1"));
}

TEST(Discovery, OfferNeedsAddressPortAndName) {
  const char* line = "10.0.0.1:3260,1 iqn.x:t1\n";
  EXPECT_TRUE(discovery_line_offers(line, "iqn.x:t1", "10.0.0.1", 3260));
  EXPECT_TRUE(discovery_line_offers(line, "iqn.x:t", "10.0.0.1", 3260));
  EXPECT_FALSE(discovery_line_offers(line, "iqn.x:t2", "10.0.0.1", 3260));
  EXPECT_FALSE(discovery_line_offers(line, "iqn.x:t1", "10.0.0.2", 3260));
  EXPECT_FALSE(discovery_line_offers(line, "iqn.x:t1", "10.0.0.1", 326));
  EXPECT_FALSE(discovery_line_offers("10.0.0.1:32600,1 iqn.x:t1\n", "iqn.x:t1", "10.0.0.1", 3260));
}

}  // namespace
}  // namespace remvol
