// State numbers and their writers.
#include "tree/state.h"

#include "fakes.h"
#include "frontend/log.h"
#include "tree/entry.h"

using namespace remvol;

namespace {

constexpr char kTarget[] = "/iscsi/initiator/id:2";
constexpr char kLun[] = "/iscsi/initiator/id:2/lun/id:3";

std::string key_of(const char* base, const char* name) {
  return std::string(base) + "/" + name;
}

TargetEntry lun_entry() {
  TargetEntry entry = {};
  entry.db_idx = 2;
  entry.lun_db_idx = 3;
  return entry;
}

class State : public fakes::Test {
 protected:
  ~State() override { debug_level = 0; }
};

}  // namespace

TEST_F(State, ConnectStateIsWrittenInOneTry) {
  fakes::on("ktreec_set", key_of(kTarget, "conn_state")).returns(-1).times(1);
  std::string log;
  log = fakes::output_of([] { EXPECT_EQ(ktree_set_connect_state(2, 3), -103); });
  EXPECT_TRUE(has(log, "ktreec_set(/iscsi/initiator/id:2/conn_state) failed"));
  EXPECT_EQ(fakes::writes().size(), 1u);
  EXPECT_EQ(ktree_set_connect_state(2, 3), 0);
  EXPECT_EQ(fakes::tree_get(key_of(kTarget, "conn_state")), "3");
}

TEST_F(State, AccessRightOtherThanZeroOrOneIsRefused) {
  const std::string log = fakes::output_of([] {
    EXPECT_EQ(ktree_update_lun_vol_access_right(2, 2, 3), -1);
    EXPECT_EQ(ktree_update_lun_vol_access_right(-1, 2, 3), -1);
  });
  EXPECT_TRUE(has(log, "volume access right should be VOL_AC_RW or VOL_AC_RO, but you given 2"));
  EXPECT_TRUE(fakes::writes().empty());
}

TEST_F(State, AccessRightNeedsBothSlots) {
  int right = 7;
  const std::string log = fakes::output_of([&right] {
    EXPECT_EQ(ktree_update_lun_vol_access_right(1, 0, 3), -1);
    EXPECT_EQ(ktree_update_lun_vol_access_right(1, 2, 0), -1);
    EXPECT_EQ(ktree_get_lun_vol_access_right(&right, 2, 0), -1);
    EXPECT_EQ(ktree_get_lun_vol_access_right(&right, 0, 3), -1);
  });
  EXPECT_TRUE(has(log, "db index must > 0"));
  const std::string null_log =
      fakes::output_of([] { EXPECT_EQ(ktree_get_lun_vol_access_right(nullptr, 2, 3), -1); });
  EXPECT_TRUE(has(null_log, "vol_ac is null"));
}

TEST_F(State, OnlyAStoredZeroIsReadOnly) {
  int right = 7;
  EXPECT_EQ(ktree_get_lun_vol_access_right(&right, 2, 3), 0);
  EXPECT_EQ(right, VOL_AC_RW);
  for (const auto& [stored, expected] : fakes::Values{{"0", "0"}, {"1", "1"}, {"5", "1"}, {"", "1"}}) {
    fakes::tree_set({{key_of(kLun, "vol_access_right"), stored}});
    EXPECT_EQ(ktree_get_lun_vol_access_right(&right, 2, 3), 0);
    EXPECT_EQ(std::to_string(right), expected) << stored;
  }
}

TEST_F(State, AnAccessRightOfTooManyDigitsIsCut) {
  int right = 7;
  fakes::tree_set({{key_of(kLun, "vol_access_right"), std::string(127, '0') + "1"}});
  EXPECT_EQ(ktree_get_lun_vol_access_right(&right, 2, 3), 0);
  EXPECT_EQ(right, VOL_AC_RO);
}

TEST_F(State, SingleValuesAreTriedThreeTimes) {
  const TargetEntry entry = lun_entry();
  fakes::on("ktreec_set", key_of(kLun, "format_state")).returns(-1).times(2);
  fakes::on("ktreec_set", key_of(kLun, "volume_state")).returns(-1);
  std::string log = fakes::output_of([&entry] { EXPECT_EQ(ktree_update_formatting_state(&entry, 4), 0); });
  EXPECT_EQ(fakes::tree_get(key_of(kLun, "format_state")), "4");
  EXPECT_EQ(fakes::writes().size(), 3u);
  log = fakes::output_of([&entry] { EXPECT_EQ(ktree_update_volume_state(&entry, 5), -103); });
  EXPECT_EQ(fakes::writes().size(), 6u);
  EXPECT_NE(log.find("(src.cpp:ktree_update_volume_state:"), std::string::npos);
}

TEST_F(State, FormatStateIsWrittenEvenWithoutSlots) {
  TargetEntry entry = lun_entry();
  entry.lun_db_idx = 0;
  const std::string log = fakes::output_of([&entry] { (void)ktree_update_formatting_state(&entry, 1); });
  EXPECT_TRUE(has(log, "target or lun db index not given"));
  EXPECT_EQ(fakes::writes().at(0), "set /iscsi/initiator/id:2/lun/id:0/format_state=1");
}

// The tree refuses a slot below 1, and the failure is logged as any other.
TEST_F(State, ATargetWithoutASlotIsWrittenAsItIs) {
  TargetEntry entry = lun_entry();
  for (const int slot : {0, -1}) {
    entry.db_idx = slot;
    const std::string target = "/iscsi/initiator/id:" + std::to_string(slot);
    const std::string log = fakes::output_of([&] {
      EXPECT_EQ(ktree_update_formatting_state(&entry, 1), -103);
      EXPECT_EQ(ktree_update_volume_state(&entry, 1), -103);
      EXPECT_EQ(ktree_set_connect_state(slot, 1), -103);
      EXPECT_EQ(ktree_record_connect_set(&entry), -103);
    });
    for (const char* name : {"lun/id:3/format_state", "lun/id:3/volume_state", "conn_state"}) {
      EXPECT_TRUE(has(log, "ktreec_set(" + target + "/" + name + ") failed"));
    }
    EXPECT_TRUE(has(log, "ktreec_set() failed"));
  }
  EXPECT_EQ(fakes::writes().size(), 16u) << "three tries twice, one try twice, for two numbers";
}

TEST_F(State, FormatProgressNeedsSlots) {
  const std::string log = fakes::output_of([] { EXPECT_EQ(ktree_update_format_progress(0, 3, 10), -1); });
  EXPECT_TRUE(has(log, "target or lun db index not given"));
  EXPECT_TRUE(fakes::writes().empty());
  debug_level = 2;
  const std::string detail = fakes::output_of([] { EXPECT_EQ(ktree_update_format_progress(2, 3, 52), 0); });
  EXPECT_TRUE(has(detail, "set /iscsi/initiator/id:2/lun/id:3/format_progress = 52"));
  EXPECT_EQ(fakes::tree_get(key_of(kLun, "format_progress")), "52");
}

TEST_F(State, VolumeStateOfEveryLunUpToAGap) {
  fakes::tree_set({{"/iscsi/initiator/id:1/target", "t"},
                   {"/iscsi/initiator/id:1/lun/id:1/lun", "0"},
                   {"/iscsi/initiator/id:1/lun/id:2/lun", "4"},
                   {"/iscsi/initiator/id:1/lun/id:4/lun", "5"}});
  TargetEntry entry = {};
  strcpy(entry.target_name, "t");
  EXPECT_EQ(ktree_update_all_volume_state(&entry, 4), 0);
  EXPECT_EQ(fakes::writes(), (std::vector<std::string>{"set /iscsi/initiator/id:1/lun/id:1/volume_state=4",
                                                       "set /iscsi/initiator/id:1/lun/id:2/volume_state=4"}));
}

TEST_F(State, VolumeStateOfEveryLunStopsAtAFailure) {
  fakes::tree_set({{"/iscsi/initiator/id:1/target", "t"},
                   {"/iscsi/initiator/id:1/lun/id:1/lun", "0"},
                   {"/iscsi/initiator/id:1/lun/id:2/lun", "4"}});
  fakes::on("ktreec_set", "/iscsi/initiator/id:1/lun/id:1/volume_state").returns(-1);
  TargetEntry entry = {};
  entry.db_idx = 1;
  fakes::output_of([&entry] { EXPECT_EQ(ktree_update_all_volume_state(&entry, 3), -103); });
  EXPECT_EQ(fakes::writes().size(), 3u);
  EXPECT_EQ(ktree_update_all_volume_state(nullptr, 3), -1);
  TargetEntry unknown = {};
  strcpy(unknown.target_name, "nobody");
  EXPECT_EQ(ktree_update_all_volume_state(&unknown, 3), -1);
}

TEST_F(State, MountInfoIgnoresRefusedWrites) {
  TargetEntry entry = lun_entry();
  fakes::on("ktreec_set", key_of(kLun, "mnt_dev")).returns(-1);
  EXPECT_EQ(ktree_update_mount_info(&entry, "/dev/sdb1", "/mnt/VV/a", "ext4"), 0);
  EXPECT_STREQ(entry.mnt_dev, "/dev/sdb1");
  EXPECT_STREQ(entry.mnt, "/mnt/VV/a");
  EXPECT_EQ(fakes::writes(), (std::vector<std::string>{"set " + key_of(kLun, "mnt_dev") + "=/dev/sdb1",
                                                       "set " + key_of(kLun, "mnt") + "=/mnt/VV/a",
                                                       "set " + key_of(kLun, "fs_type") + "=ext4"}));
}

TEST_F(State, ConnectionWishIsWrittenInOneTry) {
  TargetEntry entry = lun_entry();
  entry.conn_set = 1;
  fakes::on("ktreec_set", key_of(kTarget, "conn_set")).returns(-1).times(1);
  const std::string log = fakes::output_of([&entry] { EXPECT_EQ(ktree_record_connect_set(&entry), -103); });
  EXPECT_TRUE(has(log, "ktreec_set() failed"));
  EXPECT_EQ(ktree_record_connect_set(&entry), 0);
  EXPECT_EQ(fakes::tree_get(key_of(kTarget, "conn_set")), "1");
}

TEST_F(State, InitiatorName) {
  fakes::on("ktreec_set", "/iscsi/initiator/iqn").returns(-1).times(2);
  fakes::output_of([] { EXPECT_EQ(ktree_update_initiator_iqn("iqn.x"), 0); });
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/iqn"), "iqn.x");
}
