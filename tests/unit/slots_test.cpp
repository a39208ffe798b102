// What slot numbers stand for while other runs add and delete slots.
#include "tree/slots.h"

#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "fakes.h"
#include "ktreec.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "tasks/repair.h"
#include "tree/entry.h"
#include "tree/half_made.h"
#include "tree/lun_slots.h"
#include "tree/state.h"
#include "volume_fixture.h"

namespace {

using namespace remvol;

std::string key(int n, const std::string& name) {
  return "/iscsi/initiator/id:" + std::to_string(n) + "/" + name;
}

std::string lun_key(int n, int m, const std::string& name) {
  return key(n, "lun/id:" + std::to_string(m) + "/" + name);
}

// Two targets, each with a LUN 10.
class HeldSlots : public VolumeTest {
 protected:
  HeldSlots() {
    cover("/run");
    fakes::tree_set({{"/iscsi/initiator/ver", "1"},
                     {"/iscsi/initiator/id:1/target", "iqn.t1"},
                     {"/iscsi/initiator/id:1/lun/id:1/lun", "10"},
                     {"/iscsi/initiator/id:2/target", "iqn.t2"},
                     {"/iscsi/initiator/id:2/lun/id:1/lun", "10"}});
    remember_target(2, "iqn.t2");
    remember_lun(2, 1, 10);
  }

  ~HeldSlots() override { uncover("/run"); }

  // What another run does.
  static void delete_first_target() { fakes::tree_delete("/iscsi/initiator/id:1"); }

  // What a person does, who asks for no lock.
  static void delete_by_hand() { ktreec_del("/var/run/ktree_sock_vv", 0, "/iscsi/initiator/id:1"); }

  static void store_by_hand(const char* path, const char* value) {
    ktreec_set("/var/run/ktree_sock_vv", 0, path, value);
  }

  static int target_in_a_new_hold() {
    const SlotsHeld held;
    return HeldSlot(2, 1).target();
  }
};

// The first test: a run opens its lock on the slots once.
TEST_F(HeldSlots, AreReadAnewEachTimeWhenThereIsNoLock) {
  std::filesystem::create_directory("/run/remvol");
  std::filesystem::create_symlink("/run/victim", "/run/remvol/slots.lock");
  const SlotsHeld held;
  EXPECT_EQ(HeldSlot(2, 1).target(), 2);
  delete_first_target();
  EXPECT_EQ(HeldSlot(2, 1).target(), 1);
}

TEST_F(HeldSlots, AreReadOnce) {
  const SlotsHeld held;
  EXPECT_TRUE(HeldSlot(2, 1));
  fakes::on("ktreec_get_wb", fakes::Expression{"/target$"}).returns(-1);
  fakes::on("ktreec_get_wb", fakes::Expression{"/lun$"}).returns(-1);
  EXPECT_TRUE(HeldSlot(2, 1));
  EXPECT_TRUE(is_target_stored(2));
  EXPECT_TRUE(is_lun_stored(2, 1));
  EXPECT_EQ(ktree_count_target_luns(2), 1);
}

TEST_F(HeldSlots, AreReadAnewAfterADeletionBetweenTwoHolds) {
  {
    const SlotsHeld held;
    EXPECT_EQ(HeldSlot(2, 1).target(), 2);
  }
  delete_first_target();
  EXPECT_EQ(HeldSlot(2, 1).target(), 1);
}

TEST_F(HeldSlots, AreReadAnewAfterADeletionWhileTheyWereLetGo) {
  SlotsHeld held;
  EXPECT_EQ(HeldSlot(2, 1).target(), 2);
  held.let_go();
  delete_first_target();
  held.take();
  EXPECT_EQ(HeldSlot(2, 1).target(), 1);
}

TEST_F(HeldSlots, AreReadAnewAfterADeletionOfOurOwn) {
  const SlotsHeld held(SlotsHeld::kChange);
  EXPECT_EQ(HeldSlot(2, 1).target(), 2);
  EXPECT_EQ(delete_slot("/iscsi/initiator/id:1"), 0);
  EXPECT_EQ(HeldSlot(2, 1).target(), 1);
  EXPECT_EQ(delete_slot("/iscsi/initiator/id:1/lun/id:1"), 0);
  EXPECT_FALSE(HeldSlot(2, 1));
}

TEST_F(HeldSlots, ShowEndedWorkWhereTheTargetIsNow) {
  { const TargetHold hold("iqn.t2"); }
  remember_target(1, "iqn.t1");
  fakes::tree_set({{"/iscsi/initiator/id:2/lun/id:1/status", "Creating Volume"}});
  delete_first_target();
  TargetEntry target = {};
  copy_text(target.target_name, "iqn.t2");
  target.db_idx = 2;
  EXPECT_TRUE(shows_ended_work(&target));
}

// A run ends between the look at its state and that at its lock: what it has stored last holds.
TEST_F(HeldSlots, KeepWhatARunStoresAsItEnds) {
  { const TargetHold hold("iqn.t2"); }
  { const TargetHold hold("iqn.t2", 10); }
  int reads = 0;
  fakes::tree_set({{key(2, "conn_state"), "2"}});
  fakes::on("ktreec_get_wb", fakes::Expression{"id:2/conn_state$"}).then_real().does([&reads] {
    if (++reads == 2) ktreec_set("/var/run/ktree_sock_vv", 0, key(2, "conn_state").c_str(), "4");
  });
  TargetEntry target = {};
  copy_text(target.target_name, "iqn.t2");
  target.db_idx = 2;
  EXPECT_EQ(repair_target_state(&target), 4);

  fakes::tree_set({{lun_key(2, 1, "volume_state"), "3"}, {lun_key(2, 1, "format_state"), "3"}});
  target.lun_db_idx = 1;
  target.lun = 10;
  LunState state = {kFormatting, kVolumeCreating};
  repair_lun_state(&target, &state);
  EXPECT_EQ(state.format, kFormatFailed);
  EXPECT_EQ(state.volume, kVolumeFailed);
  EXPECT_EQ(read_lun_state(2, 1).volume, kVolumeFailed);
}

TEST_F(HeldSlots, AreBelievedFromHoldToHold) {
  EXPECT_EQ(target_in_a_new_hold(), 2);
  fakes::on("ktreec_get_wb", fakes::Expression{"/(target|lun)$"}).returns(-1);
  EXPECT_EQ(target_in_a_new_hold(), 2);
}

TEST_F(HeldSlots, AreBelievedForASecondOnly) {
  EXPECT_EQ(target_in_a_new_hold(), 2);
  delete_by_hand();
  std::this_thread::sleep_for(std::chrono::milliseconds(1010));
  EXPECT_EQ(target_in_a_new_hold(), 1);
}

TEST_F(HeldSlots, AreReadAnewBehindACommand) {
  EXPECT_EQ(target_in_a_new_hold(), 2);
  delete_by_hand();
  const pid_t command = fork();
  if (command == 0) _exit(0);
  ASSERT_EQ(waitpid(command, nullptr, 0), command);
  EXPECT_EQ(target_in_a_new_hold(), 1);
}

TEST_F(HeldSlots, AreReadAnewFromAnotherDaemon) {
  std::ofstream("/run/ktree_sock_vv").flush();
  EXPECT_EQ(target_in_a_new_hold(), 2);
  delete_by_hand();
  std::ofstream("/run/ktree_sock_vv.new").flush();
  std::filesystem::rename("/run/ktree_sock_vv.new", "/run/ktree_sock_vv");
  EXPECT_EQ(target_in_a_new_hold(), 1);
}

TEST_F(HeldSlots, AnEmptyOneIsReadOnce) {
  const SlotsHeld held;
  EXPECT_TRUE(is_target_slot_free(3));
  EXPECT_TRUE(is_lun_slot_free(1, 2));
  store_by_hand("/iscsi/initiator/id:3/target", "iqn.t3");
  store_by_hand("/iscsi/initiator/id:1/lun/id:2/lun", "1");
  EXPECT_TRUE(is_target_slot_free(3));
  EXPECT_TRUE(is_lun_slot_free(1, 2));
}

TEST_F(HeldSlots, AreReadAnewByWhoDoesNotHoldThem) {
  {
    const SlotsHeld held;
    EXPECT_TRUE(is_target_slot_free(3));
  }
  store_by_hand("/iscsi/initiator/id:3/target", "iqn.t3");
  EXPECT_FALSE(is_target_slot_free(3));
}

TEST_F(HeldSlots, OneThatOnlySeemsEmptySinceAReadFailedIsReadAgain) {
  fakes::on("ktreec_get_wb", "/iscsi/initiator/id:1/target").times(2).returns(-1);
  const SlotsHeld held;
  EXPECT_TRUE(is_target_slot_free(1));
  EXPECT_FALSE(is_target_slot_free(1));
}

TEST_F(HeldSlots, AreReadAnewByAllWhenOneIsStored) {
  EXPECT_TRUE(is_target_slot_free(3));
  {
    const SlotsHeld held(SlotsHeld::kChange);
    const auto before = std::filesystem::file_size("/run/remvol/slots.lock");
    slots_move();
    EXPECT_EQ(std::filesystem::file_size("/run/remvol/slots.lock"), before + 1);
  }
  fakes::tree_set({{"/iscsi/initiator/id:3/target", "iqn.t3"}});
  const SlotsHeld held;
  EXPECT_FALSE(is_target_slot_free(3));
}

TEST_F(HeldSlots, AreReadAnewWhenTheyWereEmpty) {
  const SlotsHeld held(SlotsHeld::kChange);
  slots_move();
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t3"), -1);
  fakes::tree_set({{"/iscsi/initiator/id:3/target", "iqn.t3"}});
  EXPECT_EQ(ktree_get_dbidx_by_targetname("iqn.t3"), 3);
}

// Three targets, each with LUN 10, 20 and 30.
class Slots : public fakes::Test {
 protected:
  Slots() {
    fakes::tree_set({{"/iscsi/initiator/ver", "1"}, {"/iscsi/initiator/count", "3"}});
    for (int n = 1; n <= 3; n++) {
      fakes::tree_set({{key(n, "target"), "iqn.t" + std::to_string(n)}, {key(n, "ip"), "10.0.0.1"}});
      for (int m = 1; m <= 3; m++) {
        fakes::tree_set({{lun_key(n, m, "lun"), std::to_string(10 * m)},
                         {lun_key(n, m, "share"), "s" + std::to_string(n) + std::to_string(m)}});
      }
    }
  }

  // What another run does.
  static void delete_target(int n) { fakes::tree_delete("/iscsi/initiator/id:" + std::to_string(n)); }
  static void delete_lun(int n, int m) { fakes::tree_delete(key(n, "lun/id:" + std::to_string(m))); }
};

TEST_F(Slots, AStateIsWrittenToItsTargetWhereverThatIs) {
  ASSERT_EQ(ktree_get_dbidx_by_targetname("iqn.t2"), 2);
  delete_target(1);
  EXPECT_EQ(ktree_set_connect_state(2, kConnecting), 0);
  EXPECT_EQ(fakes::tree_get(key(1, "conn_state")), "2");
  EXPECT_EQ(fakes::tree_get(key(2, "conn_state")), std::nullopt);
}

TEST_F(Slots, AStateIsWrittenToItsLunWhereverThatIs) {
  TargetEntry lun;
  ASSERT_EQ(ktree_get_lun_entry_by_dbidx(&lun, 3, 2), 0);
  delete_target(2);
  delete_lun(2, 1);
  EXPECT_EQ(ktree_update_volume_state(&lun, kVolumeFailed), 0);
  EXPECT_EQ(fakes::tree_get(lun_key(2, 1, "volume_state")), "3");
  EXPECT_EQ(fakes::tree_get(lun_key(2, 2, "volume_state")), std::nullopt);
}

TEST_F(Slots, NothingIsWrittenForATargetThatWasDeleted) {
  TargetEntry lun;
  ASSERT_EQ(ktree_get_lun_entry_by_dbidx(&lun, 3, 1), 0);
  delete_target(3);
  const auto before = fakes::tree_dump();
  EXPECT_EQ(ktree_set_connect_state(3, kConnected), -103);
  EXPECT_EQ(ktree_update_volume_state(&lun, kVolumeNormal), -103);
  EXPECT_EQ(ktree_update_formatting_state(&lun, kFormatting), -103);
  EXPECT_EQ(ktree_update_format_progress(3, 1, 50), -103);
  EXPECT_EQ(ktree_update_lun_vol_access_right(VOL_AC_RO, 3, 1), -103);
  EXPECT_EQ(ktree_record_connect_set(&lun), -103);
  EXPECT_EQ(ktree_update_current_luncnt(3), -103);
  (void)ktree_update_mount_info(&lun, "/dev/sdb1", "/mnt/VV/s31", "ext4");
  EXPECT_EQ(fakes::tree_dump(), before);
}

TEST_F(Slots, NothingIsWrittenForALunThatWasDeleted) {
  TargetEntry lun;
  ASSERT_EQ(ktree_get_lun_entry_by_dbidx(&lun, 1, 2), 0);
  delete_lun(1, 2);
  EXPECT_EQ(ktree_update_volume_state(&lun, kVolumeNormal), -103);
  EXPECT_EQ(fakes::tree_get(lun_key(1, 2, "volume_state")), std::nullopt);
}

TEST_F(Slots, ATreeThatDoesNotAnswerLeavesTheNumbersAsTheyAre) {
  ASSERT_EQ(ktree_get_dbidx_by_targetname("iqn.t2"), 2);
  fakes::on("ktreec_get_wb").returns(-1);
  EXPECT_EQ(ktree_set_connect_state(2, kConnecting), 0);
  EXPECT_EQ(fakes::tree_get(key(2, "conn_state")), "2");
}

TEST_F(Slots, ATreeThatWasSilentForAMomentHasDeletedNothing) {
  ASSERT_EQ(ktree_get_dbidx_by_targetname("iqn.t2"), 2);
  fakes::on("ktreec_get_wb", fakes::Expression{"/target$"})
      .returns(-1)
      .times(18);  // the first look for the name, each read twice
  EXPECT_EQ(ktree_set_connect_state(2, kConnecting), 0);
  EXPECT_EQ(fakes::tree_get(key(2, "conn_state")), "2");
}

TEST_F(Slots, ANumberThatNothingWasReadFromIsTakenAsItIs) {
  EXPECT_EQ(ktree_set_connect_state(7, kConnecting), 0);
  EXPECT_EQ(fakes::tree_get(key(7, "conn_state")), "2");
}

TEST_F(Slots, ANumberThatIsNoSlotIsTakenAsItIs) {
  for (const int number : {0, -1, 9}) {
    EXPECT_TRUE(HeldSlot(number)) << number;
    EXPECT_TRUE(HeldSlot(number, 1)) << number;
    EXPECT_EQ(HeldSlot(number, number).target(), number);
    EXPECT_EQ(HeldSlot(number, number).lun(), number);
  }
}

TEST_F(Slots, AnEntryIsReadFromItsTargetWhereverThatIs) {
  TargetEntry entry;
  ASSERT_EQ(ktree_get_entry_by_targetname("iqn.t3", &entry), 0);
  delete_target(1);
  TargetEntry lun;
  ASSERT_EQ(ktree_get_lun_entry_by_dbidx(&lun, entry.db_idx, 2), 0);
  EXPECT_STREQ(lun.target_name, "iqn.t3");
  EXPECT_STREQ(lun.share, "s32");
  delete_target(2);
  EXPECT_EQ(ktree_get_lun_entry_by_dbidx(&lun, entry.db_idx, 2), -1);
}

TEST_F(Slots, ALunThatWasFoundIsReadWhereverItIs) {
  ASSERT_EQ(ktree_get_dbidx_by_targetname("iqn.t3"), 3);
  ASSERT_EQ(ktree_get_dbidx_by_lun(3, 20), 2);
  delete_lun(3, 1);
  delete_target(1);
  TargetEntry lun;
  ASSERT_EQ(ktree_get_found_lun_entry(&lun, 3, 2, 20), 0);
  EXPECT_EQ(lun.lun, 20);
  EXPECT_STREQ(lun.share, "s32");
  EXPECT_EQ(ktree_update_volume_state(&lun, kVolumeFailed), 0);
  EXPECT_EQ(fakes::tree_get(lun_key(2, 1, "volume_state")), "3");
}

TEST_F(Slots, WhatHasTakenThePlaceOfADeletedLunIsNotReadForIt) {
  ASSERT_EQ(ktree_get_dbidx_by_targetname("iqn.t1"), 1);
  ASSERT_EQ(ktree_get_dbidx_by_lun(1, 20), 2);
  delete_lun(1, 2);
  TargetEntry lun;
  EXPECT_EQ(ktree_get_found_lun_entry(&lun, 1, 2, 20), -1);
}

TEST_F(Slots, TheLunsThatAreCountedAreThoseOfTheTarget) {
  ASSERT_EQ(ktree_get_dbidx_by_targetname("iqn.t2"), 2);
  delete_lun(3, 3);
  delete_lun(3, 2);
  delete_target(1);  // in the second slot there is now a target with one LUN
  EXPECT_EQ(ktree_count_target_luns(2), 3);
  EXPECT_EQ(ktree_get_total_luncnt(), 4);
}

TEST_F(Slots, AWalkOverTheTargetsMeetsEveryOneOnce) {
  remember_all_targets();
  std::string met;
  for (int n = 1; n <= 3; n++) {
    TargetEntry entry;
    if (ktree_get_entry_by_dbidx(n, &entry) == 0) met += std::string(entry.target_name) + " ";
    if (n == 1) delete_target(1);
  }
  EXPECT_EQ(met, "iqn.t1 iqn.t2 iqn.t3 ");
}

TEST_F(Slots, AWalkByTheSlotThatComesNextMeetsEveryTargetOnce) {
  for (const int deleted : {1, 2}) {
    std::string met;
    for (int n = 1; n <= 8; n = target_slot_after(n)) {
      const auto name = fakes::tree_get(key(n, "target"));
      if (!name) break;
      remember_target(n, name->c_str());
      met += *name + " ";
      if (*name == "iqn.t2") delete_target(deleted);
    }
    EXPECT_EQ(met, "iqn.t1 iqn.t2 iqn.t3 ") << deleted;
    delete_target(1);
    delete_target(1);
    for (int n = 1; n <= 3; n++) fakes::tree_set({{key(n, "target"), "iqn.t" + std::to_string(n)}});
  }
}

TEST_F(Slots, AWalkOverTheLunsMeetsEveryOneOnce) {
  for (const int deleted : {1, 2, 3}) {
    fakes::tree_set({{key(1, "target"), "iqn.t1"}});
    std::string met;
    for (int m = 1; m <= 8; m = lun_slot_after(1, m)) {
      TargetEntry lun;
      if (ktree_get_lun_entry_by_dbidx(&lun, 1, m) != 0) break;
      met += std::to_string(lun.lun) + " ";
      if (lun.lun == 20) delete_lun(1, deleted);
    }
    EXPECT_EQ(met, deleted == 3 ? "10 20 " : "10 20 30 ") << deleted;
    delete_target(1);
    for (int m = 1; m <= 3; m++) fakes::tree_set({{lun_key(1, m, "lun"), std::to_string(10 * m)}});
  }
}

TEST_F(Slots, TheLastLunOfATargetLeavesTheNextTargetAsItIs) {
  remember_target(1, "iqn.t1");
  remember_target(2, "iqn.t2");
  for (int m = 1; m <= kMaxLunsPerTarget + 1; m++) remember_lun(1, m, 10 * m);  // there is no slot 9
  delete_target(1);
  EXPECT_EQ(HeldSlot(2).target(), 1);
}

TEST_F(Slots, ATargetThatWasJustAddedIsFoundWhereverItIs) {
  TargetEntry entry = {};
  copy_text(entry.target_name, "iqn.t4");
  copy_text(entry.ip, "10.0.0.4");
  ASSERT_EQ(ktree_add_entry(&entry), 4);
  delete_target(1);
  EXPECT_EQ(HeldSlot(4).target(), 3);
}

std::vector<int> met(const LunSlots& luns) {
  std::vector<int> slots;
  for (const int m : luns) slots.push_back(m);
  return slots;
}

TEST_F(Slots, AWalkEndsAtTheFirstSlotWithoutALun) {
  fakes::tree_set({{lun_key(1, 5, "lun"), "50"}});
  EXPECT_EQ(met(stored_luns(1)), (std::vector{1, 2, 3}));
  EXPECT_EQ(met(stored_luns_at(1)), (std::vector{1, 2, 3}));
  EXPECT_EQ(met(taken_luns_at(1)), (std::vector{1, 2, 3}));
  EXPECT_EQ(met(stored_luns_at(4)), std::vector<int>());
}

TEST_F(Slots, AWalkEndsBehindTheLastSlot) {
  for (int m = 4; m <= kMaxLunsPerTarget + 1; m++) fakes::tree_set({{lun_key(1, m, "lun"), "70"}});
  EXPECT_EQ(met(stored_luns(1)).size(), size_t{kMaxLunsPerTarget});
  EXPECT_EQ(met(taken_luns_at(1)).back(), kMaxLunsPerTarget);
}

TEST_F(Slots, ASlotWhoseReadFailsWithATextEndsAWalkButIsNotFree) {
  fakes::on("ktreec_get_wb", lun_key(1, 2, "lun")).returns(-2).text("20");
  EXPECT_EQ(met(stored_luns(1)), std::vector{1});
  EXPECT_EQ(met(stored_luns_at(1)), std::vector{1});
  EXPECT_EQ(met(taken_luns_at(1)), (std::vector{1, 2, 3}));
}

TEST_F(Slots, AWalkByTheKnownNumberRemembersWhatItMeets) {
  ASSERT_EQ(ktree_get_dbidx_by_targetname("iqn.t3"), 3);
  delete_target(1);
  EXPECT_EQ(met(stored_luns(3)), (std::vector{1, 2, 3}));
  delete_lun(2, 1);
  EXPECT_EQ(HeldSlot(3, 2).target(), 2);
  EXPECT_EQ(HeldSlot(3, 2).lun(), 1);
}

TEST_F(Slots, AWalkOverTheSlotsAsTheyAreLeavesWhatWasKnown) {
  TargetEntry lun;
  ASSERT_EQ(ktree_get_lun_entry_by_dbidx(&lun, 1, 2), 0);
  delete_lun(1, 1);
  EXPECT_EQ(met(stored_luns_at(1)), (std::vector{1, 2}));
  EXPECT_EQ(met(taken_luns_at(1)), (std::vector{1, 2}));
  EXPECT_EQ(HeldSlot(1, 2).lun(), 1);
}

TEST_F(Slots, ALunThatIsNotStoredIsNotFormatting) {
  fakes::tree_set({{lun_key(3, 4, "format_state"), "1"}});
  EXPECT_TRUE(is_no_lun_formatting("iqn.t3"));
}

TEST_F(Slots, HalfMadeSlotsAreDropped) {
  fakes::tree_set({{lun_key(1, 2, "share"), ""}, {key(4, "target"), "iqn.t4"}});
  drop_half_made_slots();
  EXPECT_EQ(fakes::tree_get(lun_key(1, 2, "lun")), "30");
  EXPECT_EQ(fakes::tree_get(key(4, "target")), std::nullopt);
  EXPECT_EQ(fakes::tree_get(key(3, "target")), "iqn.t3");
}

TEST_F(Slots, AddingDropsHalfMadeLunsAndNoTarget) {
  fakes::tree_set({{lun_key(2, 1, "share"), ""}, {key(4, "target"), "iqn.t4"}});
  drop_half_made_luns();
  EXPECT_EQ(fakes::tree_get(lun_key(2, 1, "lun")), "20");
  EXPECT_EQ(fakes::tree_get(key(4, "target")), "iqn.t4");
}

}  // namespace
