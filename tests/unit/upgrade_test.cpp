// The upgrade of stored settings from layout version 0 to 1.
#include "upgrade/remvol_ver_upgrade.h"

#include <string>
#include <vector>

#include "fakes.h"
#include "log_lines.h"

namespace {

using namespace remvol;
using fakes::logged;
using Texts = std::vector<std::string>;

constexpr char kVersionKey[] = "/iscsi/initiator/ver";
constexpr char kFlagKey[] = "/iscsi/initiator/fwupgrade";
const std::string kFile = "remvol_ver_upgrade.cpp:";

std::string at(int n, const std::string& name) {
  return "/iscsi/initiator/id:" + std::to_string(n) + "/" + name;
}

// Version-0 targets with slots 1 to `count`.
void put_old_targets(int count) {
  fakes::tree_set({{"/iscsi/initiator/count", std::to_string(count)}, {kFlagKey, "1"}});
  for (int n = 1; n <= count; n++) {
    fakes::tree_set({{at(n, "target"), "iqn.t" + std::to_string(n)},
                     {at(n, "share"), "share" + std::to_string(n)},
                     {at(n, "format_state"), "3"},
                     {at(n, "format_progress"), "100"},
                     {at(n, "volume_state"), "2"}});
  }
}

void expect_converted(int n) {
  EXPECT_EQ(fakes::tree_get(at(n, "lun/count")), "1");
  EXPECT_EQ(fakes::tree_get(at(n, "lun/id:1/lun")), "0");
  EXPECT_EQ(fakes::tree_get(at(n, "lun/id:1/enable")), "1");
  EXPECT_EQ(fakes::tree_get(at(n, "lun/id:1/vol_access_right")), "1");
  EXPECT_EQ(fakes::tree_get(at(n, "lun/id:1/share")), "share" + std::to_string(n));
}

class Version : public fakes::Test {};

TEST_F(Version, IsZeroWhenMissingEmptyOrNoNumber) {
  int version = 99;
  EXPECT_EQ(get_remvol_ver_from_db(&version), 0);
  EXPECT_EQ(version, 0);
  for (const char* text : {"", "x"}) {
    version = 99;
    fakes::tree_set({{kVersionKey, text}});
    EXPECT_EQ(get_remvol_ver_from_db(&version), 0);
    EXPECT_EQ(version, 0);
  }
  EXPECT_EQ(get_remvol_ver_from_db(nullptr), -1);
}

TEST_F(Version, ComparisonGivesBothAndTheirDistance) {
  int stored = 99;
  int current = 99;
  for (const auto& [text, distance] :
       std::vector<std::pair<const char*, int>>{{"0", 1}, {"1", 0}, {"2", 1}, {"5", 4}, {"-3", 4}}) {
    fakes::tree_set({{kVersionKey, text}});
    EXPECT_EQ(compare_remvol_ver(&stored, &current), distance) << text;
    EXPECT_EQ(stored, atoi(text));
    EXPECT_EQ(current, 1);
    EXPECT_EQ(is_remvol_ver_changed(), distance != 0 ? 1 : 0) << text;
  }
  EXPECT_EQ(compare_remvol_ver(nullptr, &current), -1);
  EXPECT_EQ(compare_remvol_ver(&stored, nullptr), -1);
}

TEST_F(Version, IsChangedWithoutAKey) {
  EXPECT_EQ(is_remvol_ver_changed(), 1);
}

TEST_F(Version, IsStoredInOneTry) {
  EXPECT_EQ(set_remvol_ver_to_db(1), 0);
  EXPECT_EQ(fakes::tree_get(kVersionKey), "1");
  fakes::on("ktreec_set").returns(-1);
  EXPECT_EQ(logged(0, [] { EXPECT_EQ(set_remvol_ver_to_db(1), -1); }),
            Texts{kFile + "set_remvol_ver_to_db: ktreec_set /iscsi/initiator/ver = 1 failed"});
}

class FirmwareFlag : public fakes::Test {};

TEST_F(FirmwareFlag, IsDeleted) {
  fakes::tree_set({{kFlagKey, "1"}});
  EXPECT_EQ(logged(2, [] { delete_fw_flag(); }), Texts{});
  EXPECT_EQ(fakes::tree_get(kFlagKey), std::nullopt);
}

TEST_F(FirmwareFlag, AFailedDeleteIsLoggedAtLevel2) {
  EXPECT_EQ(logged(2, [] { delete_fw_flag(); }),
            Texts{kFile + "delete_fw_flag: ktreec_del /iscsi/initiator/fwupgrade failed"});
  EXPECT_EQ(logged(1, [] { delete_fw_flag(); }), Texts{});
}

class Conversion : public fakes::Test {};

TEST_F(Conversion, GivesEveryTargetOneLun) {
  put_old_targets(2);
  EXPECT_EQ(version_upgrade_v0_to_v1(), 0);
  for (int n = 1; n <= 2; n++) {
    expect_converted(n);
    EXPECT_EQ(fakes::tree_get(at(n, "lun/id:1/format_state")), "3");
    EXPECT_EQ(fakes::tree_get(at(n, "lun/id:1/format_progress")), "100");
    EXPECT_EQ(fakes::tree_get(at(n, "lun/id:1/volume_state")), "2");
  }
}

TEST_F(Conversion, WritesInOrder) {
  put_old_targets(1);
  version_upgrade_v0_to_v1();
  EXPECT_EQ(fakes::writes(),
            (Texts{"set /iscsi/initiator/id:1/lun/count=1", "set /iscsi/initiator/id:1/lun/id:1/lun=0",
                   "set /iscsi/initiator/id:1/lun/id:1/enable=1",
                   "set /iscsi/initiator/id:1/lun/id:1/vol_access_right=1",
                   "set /iscsi/initiator/id:1/lun/id:1/share=share1",
                   "set /iscsi/initiator/id:1/lun/id:1/format_state=3",
                   "set /iscsi/initiator/id:1/lun/id:1/format_progress=100",
                   "set /iscsi/initiator/id:1/lun/id:1/volume_state=2"}));
}

TEST_F(Conversion, KeepsTheOldKeys) {
  put_old_targets(1);
  version_upgrade_v0_to_v1();
  for (const char* name : {"share", "format_state", "format_progress", "volume_state"}) {
    EXPECT_NE(fakes::tree_get(at(1, name)), std::nullopt) << name;
  }
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/total_lun_count"), std::nullopt);
}

TEST_F(Conversion, StatesAreNormalisedToDecimalAndMayBeMissing) {
  put_old_targets(1);
  fakes::tree_set({{at(1, "format_state"), " 04x"}, {at(1, "format_progress"), ""}});
  fakes::tree_delete(at(1, "volume_state"));
  EXPECT_EQ(version_upgrade_v0_to_v1(), 0);
  EXPECT_EQ(fakes::tree_get(at(1, "lun/id:1/format_state")), "4");
  EXPECT_EQ(fakes::tree_get(at(1, "lun/id:1/format_progress")), std::nullopt);
  EXPECT_EQ(fakes::tree_get(at(1, "lun/id:1/volume_state")), std::nullopt);
}

TEST_F(Conversion, ARefusedStateIsLoggedAndPassedOver) {
  put_old_targets(1);
  fakes::on("ktreec_set", at(1, "lun/id:1/format_state")).returns(-1);
  EXPECT_EQ(
      logged(0, [] { EXPECT_EQ(version_upgrade_v0_to_v1(), 0); }),
      Texts{kFile + "version_upgrade_v0_to_v1: ktreec_set /iscsi/initiator/id:1/lun/id:1/format_state= 3 "
                    "failed"});
  EXPECT_EQ(fakes::tree_get(at(1, "lun/id:1/volume_state")), "2");
}

TEST_F(Conversion, WithoutACountThereIsNothingToDo) {
  const Texts frame = {kFile + "version_upgrade_v0_to_v1: v0 to v1 start",
                       kFile + "version_upgrade_v0_to_v1: v0 to v1 end, ret = 0"};
  const auto run = [] { return logged(1, [] { EXPECT_EQ(version_upgrade_v0_to_v1(), 0); }); };
  const std::string missing =
      kFile + "version_upgrade_v0_to_v1: /iscsi/initiator/count is NULL or disappear, exit func";
  const std::string zero = kFile + "version_upgrade_v0_to_v1: /iscsi/initiator/count = 0, exit func";
  EXPECT_EQ(run(), (Texts{frame[0], missing, frame[1]}));
  fakes::tree_set({{"/iscsi/initiator/count", ""}});
  EXPECT_EQ(run(), (Texts{frame[0], missing, frame[1]}));
  for (const char* count : {"0", "-2", "x"}) {
    fakes::tree_set({{"/iscsi/initiator/count", count}});
    EXPECT_EQ(run(), (Texts{frame[0], zero, frame[1]})) << count;
  }
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(Conversion, ATargetThatIsMissingStopsIt) {
  put_old_targets(1);
  fakes::tree_set({{"/iscsi/initiator/count", "2"}});
  EXPECT_EQ(logged(2, [] { EXPECT_EQ(version_upgrade_v0_to_v1(), -1); }),
            (Texts{kFile + "version_upgrade_v0_to_v1: v0 to v1 start",
                   kFile + "version_upgrade_v0_to_v1: get /iscsi/initiator/id:2/target fail",
                   kFile + "version_upgrade_v0_to_v1: v0 to v1 end, ret = -1"}));
  expect_converted(1);
}

TEST_F(Conversion, AMissingShareStopsItWithTheTextOfAFailedWrite) {
  put_old_targets(3);
  fakes::tree_set({{at(2, "share"), ""}});
  EXPECT_EQ(logged(0, [] { EXPECT_EQ(version_upgrade_v0_to_v1(), -1); }),
            Texts{kFile + "version_upgrade_v0_to_v1: ktreec_set() failed"});
  expect_converted(1);
  EXPECT_EQ(fakes::tree_get(at(2, "lun/id:1/vol_access_right")), "1");
  EXPECT_EQ(fakes::tree_get(at(3, "lun/count")), std::nullopt);
}

TEST_F(Conversion, LunsInTodaysFormAreLeftAlone) {
  put_old_targets(3);
  fakes::tree_set(
      {{at(1, "lun/id:1/lun"), "5"}, {at(2, "lun/id:1/lun"), "0"}, {at(2, "lun/id:1/share"), "renamed"}});
  const auto before = fakes::tree_dump();
  EXPECT_EQ(version_upgrade_v0_to_v1(), 0);
  for (const auto& [key, value] : before) EXPECT_EQ(fakes::tree_get(key), value) << key;
  EXPECT_EQ(fakes::tree_get(at(2, "lun/count")), std::nullopt);
  expect_converted(3);
}

TEST_F(Conversion, OneThatWasInterruptedBeforeTheShareGoesOn) {
  put_old_targets(1);
  fakes::tree_set({{at(1, "lun/id:1/lun"), "0"}});
  EXPECT_EQ(version_upgrade_v0_to_v1(), 0);
  expect_converted(1);
}

// Whatever comes of it, --init stores the new version, and it is not tried again.
TEST_F(Conversion, AReadThatFailsOnceChangesNothing) {
  put_old_targets(3);
  fakes::on("ktreec_get_wb", at(1, "target")).returns(-1).times(1);
  fakes::on("ktreec_get_wb", at(2, "share")).returns(-1).times(1);
  fakes::on("ktreec_get_wb", at(3, "volume_state")).returns(-1).times(1);
  EXPECT_EQ(version_upgrade_v0_to_v1(), 0);
  for (int n = 1; n <= 3; n++) expect_converted(n);
  EXPECT_EQ(fakes::tree_get(at(3, "lun/id:1/volume_state")), "2");
}

TEST_F(Conversion, AReadThatFailsOnceMakesNoOldFormOfTodays) {
  put_old_targets(2);
  fakes::tree_set(
      {{at(1, "lun/id:1/lun"), "5"}, {at(2, "lun/id:1/lun"), "0"}, {at(2, "lun/id:1/share"), "renamed"}});
  fakes::on("ktreec_get_wb", at(1, "lun/id:1/lun")).returns(-1).times(1);
  fakes::on("ktreec_get_wb", at(2, "lun/id:1/share")).returns(-1).times(1);
  EXPECT_EQ(version_upgrade_v0_to_v1(), 0);
  EXPECT_EQ(fakes::tree_get(at(1, "lun/id:1/lun")), "5");
  EXPECT_EQ(fakes::tree_get(at(2, "lun/id:1/share")), "renamed");
}

class RefusedWrite : public fakes::Test, public testing::WithParamInterface<const char*> {};

TEST_P(RefusedWrite, StopsTheConversion) {
  put_old_targets(1);
  fakes::on("ktreec_set", at(1, GetParam())).returns(-1);
  EXPECT_EQ(logged(0, [] { EXPECT_EQ(version_upgrade_v0_to_v1(), -1); }),
            Texts{kFile + "version_upgrade_v0_to_v1: ktreec_set() failed"});
  EXPECT_EQ(fakes::writes().back().find("set " + at(1, GetParam()) + "="), 0U);
}

INSTANTIATE_TEST_SUITE_P(Keys, RefusedWrite,
                         testing::Values("lun/count", "lun/id:1/lun", "lun/id:1/enable",
                                         "lun/id:1/vol_access_right", "lun/id:1/share"));

class Upgrade : public fakes::Test {};

TEST_F(Upgrade, ConvertsVersion0AndStoresVersion1) {
  put_old_targets(2);
  EXPECT_EQ(version_upgrade(), 0);
  expect_converted(1);
  expect_converted(2);
  EXPECT_EQ(fakes::tree_get(kVersionKey), "1");
  EXPECT_EQ(fakes::tree_get(kFlagKey), std::nullopt);
}

TEST_F(Upgrade, AFailedConversionKeepsTheVersionAndCanRunAgain) {
  put_old_targets(2);
  fakes::tree_delete(at(2, "share"));
  EXPECT_EQ(version_upgrade(), -1);
  EXPECT_EQ(fakes::tree_get(kVersionKey), std::nullopt);
  EXPECT_EQ(fakes::tree_get(kFlagKey), std::nullopt);
  fakes::tree_set({{at(2, "share"), "share2"}});
  EXPECT_EQ(version_upgrade(), 0);
  expect_converted(1);
  expect_converted(2);
  EXPECT_EQ(fakes::tree_get(kVersionKey), "1");
}

TEST_F(Upgrade, AVersionThatIsRefusedDoesNotMatter) {
  put_old_targets(1);
  fakes::on("ktreec_set", kVersionKey).returns(-1);
  EXPECT_EQ(version_upgrade(), 0);
}

TEST_F(Upgrade, TheSameVersionIsLeftAlone) {
  put_old_targets(1);
  fakes::tree_set({{kVersionKey, "1"}});
  EXPECT_EQ(logged(2, [] { EXPECT_EQ(version_upgrade(), 0); }),
            (Texts{kFile + "version_upgrade: Start remvol settings upgrade",
                   kFile + "version_upgrade: preious version = 1, now version = 1",
                   kFile + "version_upgrade: the same version, EXIT",
                   kFile + "version_upgrade: Finish remvol settings upgrade"}));
  EXPECT_EQ(fakes::writes(), Texts{std::string("del ") + kFlagKey});
}

TEST_F(Upgrade, ANewerVersionIsRefusedWhateverTheLevel) {
  put_old_targets(1);
  fakes::tree_set({{kVersionKey, "2"}});
  EXPECT_EQ(logged(-1, [] { EXPECT_EQ(version_upgrade(), -1); }),
            Texts{"remvol: Do not support settings downgrade to version 1"});
  EXPECT_EQ(fakes::tree_get(kVersionKey), "2");
  EXPECT_EQ(fakes::tree_get(kFlagKey), std::nullopt);
}

TEST_F(Upgrade, AnUnknownOldVersionIsNotConverted) {
  put_old_targets(1);
  fakes::tree_set({{kVersionKey, "-1"}});
  EXPECT_EQ(logged(1, [] { EXPECT_EQ(version_upgrade(), 0); }),
            (Texts{kFile + "version_upgrade: Start remvol settings upgrade",
                   kFile + "version_upgrade: Not supported versions, EXIT",
                   kFile + "version_upgrade: Finish remvol settings upgrade"}));
  EXPECT_EQ(fakes::tree_get(kVersionKey), "-1");
  EXPECT_EQ(fakes::tree_get(at(1, "lun/count")), std::nullopt);
}

}  // namespace
