// Target and LUN entries: filling the record, slots, lookups, counts.
#include "tree/entry.h"
#include "tree/state.h"

#include <cstring>
#include <string>
#include <vector>

#include "fakes.h"
#include "log_lines.h"

namespace {

using namespace remvol;
using fakes::logged;
using Texts = std::vector<std::string>;

std::string target_key(int n, const std::string& name) {
  return "/iscsi/initiator/id:" + std::to_string(n) + "/" + name;
}

std::string lun_key(int n, int m, const std::string& name) {
  return target_key(n, "lun/id:" + std::to_string(m) + "/" + name);
}

void put(const std::string& key, const std::string& value) {
  fakes::tree_set({{key, value}});
}

void put_target(int n) {
  put(target_key(n, "target"), "iqn.t" + std::to_string(n));
}

void put_lun(int n, int m, int number) {
  put(lun_key(n, m, "lun"), std::to_string(number));
}

// A record that is full of leftovers.
TargetEntry dirty() {
  TargetEntry entry;
  memset(static_cast<void*>(&entry), 'x', sizeof entry);
  return entry;
}

TargetEntry new_target(const char* name) {
  TargetEntry entry = {};
  strcpy(entry.target_name, name);
  strcpy(entry.ip, "10.0.0.1");
  entry.port = 3260;
  return entry;
}

TargetEntry new_lun(const char* target, int lun) {
  TargetEntry entry = {};
  strcpy(entry.target_name, target);
  strcpy(entry.share, "share");
  entry.lun = lun;
  return entry;
}

class TargetLookup : public fakes::Test {};

// Every value of an entry is read whole up to 255 characters.
TEST_F(TargetLookup, ANumberOfManyDigitsIsReadWhole) {
  const std::string zeros(250, '0');
  for (const char* key : {"chap", "port", "conn_set"}) {
    put_target(1);
    put(target_key(1, key), zeros + "7");
    TargetEntry entry = dirty();
    ASSERT_EQ(ktree_get_entry_by_targetname("iqn.t1", &entry), 0);
    EXPECT_EQ(entry.chap + entry.port + entry.conn_set, 7) << key;
    put(target_key(1, key), "0");
  }
}

TEST_F(TargetLookup, FindsTheExactName) {
  for (int n = 1; n <= 8; n++) put_target(n);
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t1"), 1);
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t8"), 8);
  EXPECT_EQ(ktree_get_dbidx_by_targetname("IQN.t8"), -1);
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t"), -1);
  EXPECT_EQ(ktree_get_dbidx_by_targetname(""), -1);
}

TEST_F(TargetLookup, StopsAtAGap) {
  put_target(1);
  put_target(3);
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t3"), -1);
}

TEST_F(TargetLookup, AnEmptyNameIsAGap) {
  put(target_key(1, "target"), "");
  put_target(2);
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t2"), -1);
}

TEST_F(TargetLookup, KnowsNoNinthSlot) {
  for (int n = 1; n <= 9; n++) put_target(n);
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t9"), -1);
}

TEST_F(TargetLookup, Logs) {
  put_target(1);
  EXPECT_EQ(logged(1, [] { (void)ktree_get_dbidx_by_targetname("iqn.t1"); }),
            Texts{"src.cpp:ktree_get_dbidx_by_targetname: get iqn.t1 db_idx=1"});
  EXPECT_EQ(logged(1, [] { (void)ktree_get_dbidx_by_targetname("iqn.x"); }),
            (Texts{"src.cpp:ktree_get_dbidx_by_targetname: ktreec_get(/iscsi/initiator/id:2/target) failed",
                   "src.cpp:ktree_get_dbidx_by_targetname: get iqn.x db_idx=-1"}));
  EXPECT_EQ(logged(0, [] { (void)ktree_get_dbidx_by_targetname("iqn.x"); }), Texts{});
}

class FreeTargetSlot : public fakes::Test {};

TEST_F(FreeTargetSlot, IsTheFirstMissingOrEmptyOne) {
  EXPECT_EQ(ktree_get_free_dbidx(), 1);
  put_target(1);
  put_target(3);
  EXPECT_EQ(ktree_get_free_dbidx(), 2);
  put_target(2);
  put(target_key(3, "target"), "");
  EXPECT_EQ(ktree_get_free_dbidx(), 3);
}

TEST_F(FreeTargetSlot, ThereIsNoneAboveEight) {
  for (int n = 1; n <= 8; n++) put_target(n);
  EXPECT_EQ(ktree_get_free_dbidx(), -103);
}

TEST_F(FreeTargetSlot, AReadThatFailsOtherwiseIsNotFree) {
  fakes::on("ktreec_get_wb", target_key(1, "target")).returns(-2).text("left");
  EXPECT_EQ(ktree_get_free_dbidx(), 2);
}

TEST_F(FreeTargetSlot, IsLoggedAtLevel3) {
  EXPECT_EQ(logged(3, [] { (void)ktree_get_free_dbidx(); }),
            Texts{"src.cpp:ktree_get_free_dbidx: free ent id: 1"});
  EXPECT_EQ(logged(2, [] { (void)ktree_get_free_dbidx(); }), Texts{});
}

class FillTarget : public fakes::Test {};

TEST_F(FillTarget, TakesEverySetting) {
  put_target(1);
  fakes::tree_set({{target_key(2, "target"), "iqn.t2"},
                   {target_key(2, "chap"), "1"},
                   {target_key(2, "chap_name"), "user"},
                   {target_key(2, "chap_pwd"), "secret"},
                   {target_key(2, "ip"), "[fe80::1]"},
                   {target_key(2, "port"), "3261"},
                   {target_key(2, "conn_set"), "1"},
                   {target_key(2, "status"), "Connected"}});
  put_lun(2, 1, 5);
  TargetEntry entry = dirty();
  ASSERT_EQ(ktree_get_entry_by_targetname("iqn.t2", &entry), 0);
  TargetEntry expected = {};
  strcpy(expected.target_name, "iqn.t2");
  expected.chap = 1;
  strcpy(expected.chap_name, "user");
  strcpy(expected.chap_pwd, "secret");
  strcpy(expected.ip, "[fe80::1]");
  expected.port = 3261;
  expected.conn_set = 1;
  expected.db_idx = 2;
  EXPECT_EQ(memcmp(&entry, &expected, sizeof entry), 0);
}

TEST_F(FillTarget, LeavesMissingAndEmptySettingsZero) {
  put_target(1);
  put(target_key(1, "ip"), "");
  put(target_key(1, "port"), "no number");
  TargetEntry entry = dirty();
  ASSERT_EQ(ktree_get_entry_by_targetname("iqn.t1", &entry), 0);
  TargetEntry expected = {};
  strcpy(expected.target_name, "iqn.t1");
  expected.db_idx = 1;
  EXPECT_EQ(memcmp(&entry, &expected, sizeof entry), 0);
}

TEST_F(FillTarget, CutsTextsToTheirFields) {
  put_target(1);
  put(target_key(1, "chap_name"), std::string(200, 'n'));
  put(target_key(1, "ip"), std::string(200, '1'));
  TargetEntry entry = dirty();
  ASSERT_EQ(ktree_get_entry_by_targetname("iqn.t1", &entry), 0);
  EXPECT_EQ(entry.chap_name, std::string(127, 'n'));
  EXPECT_EQ(entry.ip, std::string(47, '1'));
}

TEST_F(FillTarget, RefusesAnUnknownNameAndClearsTheRecord) {
  TargetEntry entry = dirty();
  const TargetEntry zero = {};
  EXPECT_EQ(ktree_get_entry_by_targetname("iqn.x", &entry), -1);
  EXPECT_EQ(memcmp(&entry, &zero, sizeof entry), 0);
  EXPECT_EQ(ktree_get_entry_by_targetname("iqn.x", nullptr), -1);
}

TEST_F(FillTarget, Logs) {
  TargetEntry entry;
  put_target(1);
  EXPECT_EQ(logged(0, [] { (void)ktree_get_entry_by_targetname("iqn.x", nullptr); }),
            Texts{"src.cpp:ktree_get_entry_by_targetname: Entry is NULL"});
  EXPECT_EQ(logged(0, [&] { (void)ktree_get_entry_by_targetname("iqn.x", &entry); }),
            Texts{"src.cpp:ktree_get_entry_by_targetname: Can not get entry from iqn.x"});
  EXPECT_EQ(logged(1, [&] { (void)ktree_get_entry_by_targetname("iqn.t1", &entry); }),
            (Texts{"src.cpp:ktree_get_dbidx_by_targetname: get iqn.t1 db_idx=1",
                   "src.cpp:ktree_get_entry_by_targetname: get iqn.t1 db_idx=1"}));
}

class FillLun : public fakes::Test {};

TEST_F(FillLun, TakesEverySetting) {
  fakes::tree_set({{target_key(2, "target"), "iqn.t2"},
                   {target_key(2, "chap"), "1"},
                   {target_key(2, "chap_name"), "user"},
                   {target_key(2, "chap_pwd"), "secret"},
                   {target_key(2, "ip"), "10.0.0.1"},
                   {target_key(2, "port"), "3261"},
                   {target_key(2, "conn_set"), "1"},
                   {lun_key(2, 3, "lun"), "7"},
                   {lun_key(2, 3, "share"), "my share"},
                   {lun_key(2, 3, "dev"), "sdb"},
                   {lun_key(2, 3, "mnt_dev"), "/dev/sdb1"},
                   {lun_key(2, 3, "mnt"), "/mnt/VV/my share"}});
  TargetEntry entry = dirty();
  ASSERT_EQ(ktree_get_lun_entry_by_dbidx(&entry, 2, 3), 0);
  TargetEntry expected = {};
  strcpy(expected.target_name, "iqn.t2");
  expected.chap = 1;
  strcpy(expected.chap_name, "user");
  strcpy(expected.chap_pwd, "secret");
  strcpy(expected.share, "my share");
  strcpy(expected.dev, "sdb");
  expected.lun = 7;
  strcpy(expected.ip, "10.0.0.1");
  expected.port = 3261;
  expected.conn_set = 1;
  expected.db_idx = 2;
  expected.lun_db_idx = 3;
  strcpy(expected.mnt_dev, "/dev/sdb1");
  strcpy(expected.mnt, "/mnt/VV/my share");
  EXPECT_EQ(memcmp(&entry, &expected, sizeof entry), 0);
}

TEST_F(FillLun, ALunThatIsNotAttachedHasAnEmptyDevice) {
  put_target(1);
  put_lun(1, 1, 0);
  TargetEntry entry = dirty();
  ASSERT_EQ(ktree_get_lun_entry_by_dbidx(&entry, 1, 1), 0);
  EXPECT_STREQ(entry.dev, "");
  EXPECT_EQ(entry.lun, 0);
}

TEST_F(FillLun, RefusesBadArguments) {
  put_target(1);
  put_lun(1, 1, 0);
  TargetEntry entry;
  EXPECT_EQ(ktree_get_lun_entry_by_dbidx(nullptr, 1, 1), -1);
  EXPECT_EQ(ktree_get_lun_entry_by_dbidx(&entry, 0, 1), -1);
  EXPECT_EQ(ktree_get_lun_entry_by_dbidx(&entry, 1, 0), -1);
  EXPECT_EQ(ktree_get_lun_entry_by_dbidx(&entry, -1, -1), -1);
}

TEST_F(FillLun, RefusesEmptySlotsAndSaysWhich) {
  TargetEntry entry = dirty();
  EXPECT_EQ(ktree_get_lun_entry_by_dbidx(&entry, 4, 2), -1);
  EXPECT_EQ(logged(0, [&] { (void)ktree_get_lun_entry_by_dbidx(&entry, 4, 2); }),
            Texts{"src.cpp:ktree_get_lun_entry_by_dbidx: Can not get entry from 4"});
  put_target(1);
  EXPECT_EQ(ktree_get_lun_entry_by_dbidx(&entry, 1, 2), -1);
  EXPECT_EQ(logged(2, [&] { (void)ktree_get_lun_entry_by_dbidx(&entry, 1, 2); }),
            Texts{"src.cpp:ktree_get_lun_entry_by_dbidx: Can not get lun from 2"});
  EXPECT_EQ(logged(1, [&] { (void)ktree_get_lun_entry_by_dbidx(&entry, 1, 2); }), Texts{});
}

class Counts : public fakes::Test {};

TEST_F(Counts, TargetsAreCountedBehindGapsToo) {
  put_target(1);
  put_target(3);
  put_target(8);
  put(target_key(4, "target"), "");
  EXPECT_EQ(ktree_update_current_targetcnt(), 0);
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/count"), "3");
}

TEST_F(Counts, NoTargetIsZero) {
  EXPECT_EQ(ktree_update_current_targetcnt(), 0);
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/count"), "0");
}

TEST_F(Counts, LunsOfATargetEndAtItsFirstGap) {
  put_lun(2, 1, 4);
  put_lun(2, 2, 5);
  put_lun(2, 4, 6);
  EXPECT_EQ(ktree_count_target_luns(2), 2);
  EXPECT_EQ(ktree_count_target_luns(1), 0);
  EXPECT_EQ(ktree_count_target_luns(0), -1);
  EXPECT_EQ(ktree_count_target_luns(-3), -1);
}

TEST_F(Counts, TheTotalEndsAtTheFirstMissingTarget) {
  put_target(1);
  put_target(2);
  put_target(4);
  put_lun(1, 1, 0);
  put_lun(2, 1, 0);
  put_lun(2, 2, 1);
  put_lun(4, 1, 0);
  EXPECT_EQ(ktree_get_total_luncnt(), 3);
  EXPECT_EQ(ktree_refresh_total_luncnt(), 0);
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/total_lun_count"), "3");
}

TEST_F(Counts, TheLunCountCountsBehindGapsAndRefreshesTheTotal) {
  put_target(1);
  put_lun(1, 1, 0);
  put_lun(1, 3, 1);
  put_lun(1, 8, 2);
  EXPECT_EQ(ktree_update_current_luncnt(1), 0);
  EXPECT_EQ(fakes::writes(),
            (Texts{"set /iscsi/initiator/id:1/lun/count=3", "set /iscsi/initiator/total_lun_count=1"}));
}

// A count is a single value: three tries, then -103.
TEST_F(Counts, ARefusedWriteIsTriedThreeTimes) {
  fakes::on("ktreec_set", "/iscsi/initiator/count").returns(-1).times(2);
  EXPECT_EQ(ktree_update_current_targetcnt(), 0);
  EXPECT_EQ(fakes::writes().size(), 3U);
  fakes::on("ktreec_set", "/iscsi/initiator/count").returns(-1);
  Texts texts = logged(0, [] { EXPECT_EQ(ktree_update_current_targetcnt(), -103); });
  EXPECT_EQ(texts, Texts(3,
                         "src.cpp:ktree_update_current_targetcnt: "
                         "ktreec_set(/iscsi/initiator/count) failed"));
}

TEST_F(Counts, ARefusedTotalOrLunCountIsReported) {
  put_target(1);
  fakes::on("ktreec_set", "/iscsi/initiator/total_lun_count").returns(-1);
  EXPECT_EQ(ktree_refresh_total_luncnt(), -103);
  EXPECT_EQ(ktree_update_current_luncnt(1), -103);
}

class States : public fakes::Test {};

TEST_F(States, AreReadAsNumbers) {
  int value = 99;
  fakes::tree_set({{lun_key(1, 2, "format_state"), "3"},
                   {lun_key(1, 2, "format_progress"), "45"},
                   {lun_key(1, 2, "volume_state"), "x"},
                   {target_key(1, "conn_state"), "-2"}});
  EXPECT_EQ(ktree_get_lun_format_state(1, 2, &value), 0);
  EXPECT_EQ(value, 3);
  EXPECT_EQ(ktree_get_lun_format_progress(1, 2, &value), 0);
  EXPECT_EQ(value, 45);
  EXPECT_EQ(ktree_get_lun_volume_state(1, 2, &value), 0);
  EXPECT_EQ(value, 0);
  EXPECT_EQ(ktree_get_connect_state(1, &value), 0);
  EXPECT_EQ(value, -2);
}

TEST_F(States, HaveADefaultWhenMissingOrEmpty) {
  for (int empty = 0; empty < 2; empty++) {
    int value = 99;
    EXPECT_EQ(ktree_get_lun_format_state(1, 2, &value), -103);
    EXPECT_EQ(value, -1);
    EXPECT_EQ(ktree_get_lun_format_progress(1, 2, &value), -103);
    EXPECT_EQ(value, 0);
    EXPECT_EQ(ktree_get_lun_volume_state(1, 2, &value), -103);
    EXPECT_EQ(value, -1);
    EXPECT_EQ(ktree_get_connect_state(1, &value), -103);
    EXPECT_EQ(value, -1);
    fakes::tree_set({{lun_key(1, 2, "format_state"), ""},
                     {lun_key(1, 2, "format_progress"), ""},
                     {lun_key(1, 2, "volume_state"), ""},
                     {target_key(1, "conn_state"), ""}});
  }
}

class Enabled : public fakes::Test {};

TEST_F(Enabled, IsOneForAnyNumberButZero) {
  for (const auto& [text, expected] :
       std::vector<std::pair<const char*, int>>{{"1", 1}, {"0", 0}, {"7", 1}, {"-1", 1}, {"x", 0}}) {
    int enable = 99;
    put(lun_key(1, 1, "enable"), text);
    EXPECT_EQ(ktree_get_lun_enable(&enable, 1, 1), 0) << text;
    EXPECT_EQ(enable, expected) << text;
  }
}

TEST_F(Enabled, IsZeroWhenMissingOrEmpty) {
  int enable = 99;
  EXPECT_EQ(ktree_get_lun_enable(&enable, 1, 1), -103);
  EXPECT_EQ(enable, 0);
  put(lun_key(1, 1, "enable"), "");
  EXPECT_EQ(ktree_get_lun_enable(&enable, 1, 1), -103);
  EXPECT_EQ(enable, 0);
}

TEST_F(Enabled, AReadThatFailedYetLeftTextIsAnError) {
  int enable = 99;
  fakes::on("ktreec_get_wb", lun_key(1, 1, "enable")).returns(-1).text("1");
  EXPECT_EQ(ktree_get_lun_enable(&enable, 1, 1), -1);
}

TEST_F(Enabled, RefusesBadArguments) {
  int enable = 99;
  EXPECT_EQ(ktree_get_lun_enable(nullptr, 1, 1), -1);
  EXPECT_EQ(ktree_get_lun_enable(&enable, 0, 1), -1);
  EXPECT_EQ(ktree_get_lun_enable(&enable, 1, 0), -1);
}

class FreeLunSlot : public fakes::Test {};

TEST_F(FreeLunSlot, IsTheFirstMissingOrEmptyOne) {
  put_target(1);
  EXPECT_EQ(ktree_get_free_lun_dbidx(1), 1);
  put_lun(1, 1, 0);
  put_lun(1, 3, 1);
  EXPECT_EQ(logged(3, [] { EXPECT_EQ(ktree_get_free_lun_dbidx(1), 2); }),
            Texts{"src.cpp:ktree_get_free_lun_dbidx: free ent id: 2"});
  put(lun_key(1, 1, "lun"), "");
  EXPECT_EQ(ktree_get_free_lun_dbidx(1), 1);
}

TEST_F(FreeLunSlot, ThereIsNoneWhenTheSystemHoldsEight) {
  for (int n = 1; n <= 4; n++) {
    put_target(n);
    put_lun(n, 1, 0);
    put_lun(n, 2, 1);
  }
  EXPECT_EQ(logged(2, [] { EXPECT_EQ(ktree_get_free_lun_dbidx(1), -1); }),
            Texts{"src.cpp:ktree_get_free_lun_dbidx: max number of lun = 8 reached"});
}

// Only a target that the total does not see (behind a gap) can fill its slots while the system has room.
TEST_F(FreeLunSlot, ThereIsNoneWhenTheTargetsSlotsAreUsed) {
  put_target(3);
  for (int m = 1; m <= 8; m++) put_lun(3, m, m);
  EXPECT_EQ(logged(3, [] { EXPECT_EQ(ktree_get_free_lun_dbidx(3), -103); }),
            Texts{"src.cpp:ktree_get_free_lun_dbidx: fail to get free lun dbidx at target idx : 9"});
}

class LunLookup : public fakes::Test {};

TEST_F(LunLookup, FindsTheNumber) {
  put_lun(2, 1, 5);
  put_lun(2, 2, 0);
  EXPECT_EQ(ktree_get_dbidx_by_lun(2, 5), 1);
  EXPECT_EQ(logged(1, [] { EXPECT_EQ(ktree_get_dbidx_by_lun(2, 0), 2); }),
            Texts{"src.cpp:ktree_get_dbidx_by_lun: get lun: 0 at db_idx=2"});
  EXPECT_EQ(ktree_get_dbidx_by_lun(2, -1), -1);
}

TEST_F(LunLookup, StopsAtAGap) {
  put_lun(2, 1, 5);
  put_lun(2, 3, 6);
  EXPECT_EQ(logged(1, [] { EXPECT_EQ(ktree_get_dbidx_by_lun(2, 6), -1); }),
            (Texts{"src.cpp:ktree_get_dbidx_by_lun: ktreec_get(/iscsi/initiator/id:2/lun/id:2/lun) failed",
                   "src.cpp:ktree_get_dbidx_by_lun: get lun: 6 at db_idx=-1"}));
}

class AddLun : public fakes::Test {};

TEST_F(AddLun, WritesItsKeysInOrderThenTheCounts) {
  put_target(1);
  put_target(2);
  TargetEntry entry = new_lun("iqn.t2", 4);
  EXPECT_EQ(ktree_add_lun_entry(&entry), 1);
  EXPECT_EQ(entry.lun_db_idx, 1);
  EXPECT_EQ(
      fakes::writes(),
      (Texts{"set /iscsi/initiator/id:2/lun/id:1/lun=4", "set /iscsi/initiator/id:2/lun/id:1/share=share",
             "set /iscsi/initiator/id:2/lun/id:1/enable=1",
             "set /iscsi/initiator/id:2/lun/id:1/vol_access_right=1", "set /iscsi/initiator/id:2/lun/count=1",
             "set /iscsi/initiator/total_lun_count=1"}));
}

TEST_F(AddLun, TheSlotInTheRecordGoesBeforeTheName) {
  put_target(1);
  put_target(2);
  TargetEntry entry = new_lun("iqn.t1", 4);
  entry.db_idx = 2;
  EXPECT_EQ(ktree_add_lun_entry(&entry), 1);
  EXPECT_EQ(fakes::tree_get(lun_key(2, 1, "lun")), "4");
}

TEST_F(AddLun, RefusesAnUnknownTarget) {
  TargetEntry entry = new_lun("iqn.x", 4);
  EXPECT_EQ(ktree_add_lun_entry(&entry), -1);
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(AddLun, RefusesANumberThatHasASlot) {
  put_target(1);
  put_lun(1, 1, 4);
  TargetEntry entry = new_lun("iqn.t1", 4);
  EXPECT_EQ(ktree_add_lun_entry(&entry), -1);
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(AddLun, ANumberBehindAGapHasNoSlot) {
  put_target(1);
  put_lun(1, 1, 4);
  put_lun(1, 3, 6);
  TargetEntry entry = new_lun("iqn.t1", 6);
  EXPECT_EQ(ktree_add_lun_entry(&entry), 2);
  EXPECT_EQ(fakes::tree_get(lun_key(1, 2, "lun")), "6");
}

TEST_F(AddLun, RefusesANumberBehindASlotThatCouldNotBeRead) {
  put_target(1);
  for (int m = 1; m <= 3; m++) put_lun(1, m, m);
  fakes::on("ktreec_get_wb", lun_key(1, 2, "lun")).returns(-1);
  TargetEntry entry = new_lun("iqn.t1", 3);
  EXPECT_EQ(ktree_add_lun_entry(&entry), -1);
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(AddLun, RefusesTheNinthLunOfTheSystem) {
  for (int n = 1; n <= 2; n++) {
    put_target(n);
    for (int m = 1; m <= 4; m++) put_lun(n, m, m);
  }
  TargetEntry entry = new_lun("iqn.t2", 9);
  EXPECT_EQ(ktree_add_lun_entry(&entry), -1);
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(AddLun, TheEighthIsTaken) {
  put_target(1);
  for (int m = 1; m <= 7; m++) put_lun(1, m, m);
  TargetEntry entry = new_lun("iqn.t1", 8);
  EXPECT_EQ(ktree_add_lun_entry(&entry), 8);
}

TEST_F(AddLun, TheFirstRefusedWriteEndsItAndTheEarlierOnesStay) {
  put_target(1);
  fakes::on("ktreec_set", lun_key(1, 1, "enable")).returns(-1);
  TargetEntry entry = new_lun("iqn.t1", 4);
  EXPECT_EQ(logged(0, [&] { EXPECT_EQ(ktree_add_lun_entry(&entry), -103); }),
            Texts{"src.cpp:ktree_add_lun_entry: ktreec_set() failed"});
  EXPECT_EQ(fakes::tree_get(lun_key(1, 1, "share")), "share");
  EXPECT_EQ(fakes::tree_get(lun_key(1, 1, "vol_access_right")), std::nullopt);
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/total_lun_count"), std::nullopt);
  EXPECT_EQ(fakes::writes().size(), 3U);
}

TEST_F(AddLun, RefusedCountsDoNotMatter) {
  put_target(1);
  fakes::on("ktreec_set", target_key(1, "lun/count")).returns(-1);
  TargetEntry entry = new_lun("iqn.t1", 4);
  EXPECT_EQ(ktree_add_lun_entry(&entry), 1);
}

class AddTarget : public fakes::Test {};

TEST_F(AddTarget, WritesItsKeysInOrder) {
  put_target(1);
  TargetEntry entry = new_target("iqn.new");
  entry.chap = 1;
  strcpy(entry.chap_name, "user");
  strcpy(entry.chap_pwd, "secret");
  EXPECT_EQ(ktree_add_entry(&entry), 2);
  EXPECT_EQ(entry.db_idx, 2);
  EXPECT_EQ(fakes::writes(),
            (Texts{"set /iscsi/initiator/id:2/target=iqn.new", "set /iscsi/initiator/id:2/chap=1",
                   "set /iscsi/initiator/id:2/chap_name=user", "set /iscsi/initiator/id:2/chap_pwd=secret",
                   "set /iscsi/initiator/id:2/ip=10.0.0.1", "set /iscsi/initiator/id:2/port=3260"}));
}

TEST_F(AddTarget, AKnownNameKeepsItsSlot) {
  put_target(1);
  put_target(2);
  put(target_key(1, "chap_name"), "old");
  TargetEntry entry = new_target("iqn.t1");
  EXPECT_EQ(ktree_add_entry(&entry), 1);
  EXPECT_EQ(fakes::tree_get(target_key(1, "chap_name")), "");
  EXPECT_EQ(fakes::tree_get(target_key(1, "ip")), "10.0.0.1");
}

TEST_F(AddTarget, FillsAGap) {
  put_target(1);
  put_target(3);
  TargetEntry entry = new_target("iqn.new");
  EXPECT_EQ(ktree_add_entry(&entry), 2);
}

TEST_F(AddTarget, ANameBehindAGapIsNew) {
  put_target(1);
  put_target(3);
  TargetEntry entry = new_target("iqn.t3");
  EXPECT_EQ(ktree_add_entry(&entry), 2);
  EXPECT_EQ(entry.db_idx, 2);
  put(target_key(2, "target"), "");
  EXPECT_EQ(ktree_add_entry(&entry), 2) << "an empty name is a gap too";
}

TEST_F(AddTarget, ANameBehindASlotThatCouldNotBeReadKeepsItsOwn) {
  for (int n = 1; n <= 3; n++) put_target(n);
  fakes::on("ktreec_get_wb", target_key(2, "target")).returns(-1);
  TargetEntry entry = new_target("iqn.t3");
  EXPECT_EQ(ktree_add_entry(&entry), 3);
  EXPECT_EQ(fakes::tree_get(target_key(2, "target")), "iqn.t2");
}

TEST_F(AddTarget, RefusesWhatIsIncomplete) {
  std::vector<TargetEntry> bad(6, new_target("iqn.new"));
  bad[0].target_name[0] = '\0';
  bad[1].ip[0] = '\0';
  bad[2].port = -1;
  bad[3].chap = 1;
  bad[4].chap = 1;
  strcpy(bad[4].chap_name, "user");
  bad[5].chap = 2;
  strcpy(bad[5].chap_pwd, "secret");
  for (TargetEntry& entry : bad) EXPECT_EQ(ktree_add_entry(&entry), -1);
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(AddTarget, APortOfZeroIsTaken) {
  TargetEntry entry = new_target("iqn.new");
  entry.port = 0;
  EXPECT_EQ(ktree_add_entry(&entry), 1);
}

TEST_F(AddTarget, RefusesTheNinth) {
  for (int n = 1; n <= 8; n++) put_target(n);
  TargetEntry entry = new_target("iqn.new");
  EXPECT_EQ(logged(0, [&] { EXPECT_EQ(ktree_add_entry(&entry), -1); }),
            Texts{"src.cpp:ktree_add_entry: ktree_get_free_dbidx() failed"});
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(AddTarget, ARefusedWriteDoesNotStopTheOthers) {
  fakes::on("ktreec_set", target_key(1, "chap")).returns(-1);
  TargetEntry entry = new_target("iqn.new");
  EXPECT_EQ(logged(0, [&] { EXPECT_EQ(ktree_add_entry(&entry), -1); }),
            Texts{"src.cpp:ktree_add_entry: ktreec_set() failed"});
  EXPECT_EQ(fakes::writes().size(), 6U);
  EXPECT_EQ(fakes::tree_get(target_key(1, "port")), "3260");
}

}  // namespace
