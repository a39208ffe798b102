#include "tree/entry.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/lun_slots.h"
#include "tree/slots.h"
#include "tree_layout.h"

namespace remvol {

namespace {

// Copies the text at `key` into `field`, which stays as it is when the key is not present.
template <size_t N>
void read_field(const char* key, char (&field)[N]) {
  TreeValue value;
  if (tree_read(key, value)) copy_text(field, value);
}

void read_target_fields(TargetEntry* entry, int dbidx) {
  entry->chap = tree_read_number(KeyText(key::kTargetChap, dbidx), 0);
  read_field(KeyText(key::kTargetChapName, dbidx), entry->chap_name);
  read_field(KeyText(key::kTargetChapPwd, dbidx), entry->chap_pwd);
  read_field(KeyText(key::kTargetIp, dbidx), entry->ip);
  entry->port = tree_read_number(KeyText(key::kTargetPort, dbidx), 0);
  entry->conn_set = tree_read_number(KeyText(key::kTargetConnSet, dbidx), 0);
}

// Reads what the LUN slot `m` of the target in `slot` holds, which this run knows by the number `dbidx`, into
// the LUN's fields. Returns whether both are stored.
bool read_lun_at(TargetEntry* entry, int dbidx, const HeldSlot& slot, int m) {
  const int n = slot.target();
  if (!slot || !read_target_name(n, entry->target_name)) {
    LOG(0, "Can not get entry from %d", dbidx);
    return false;
  }
  remember_target(dbidx, entry->target_name);
  entry->db_idx = dbidx;
  if (!read_lun_number(n, m, &entry->lun)) {
    LOG(2, "Can not get lun from %d", m);
    return false;
  }
  entry->lun_db_idx = m;
  remember_lun(dbidx, m, entry->lun);
  read_field(KeyText(key::kLunShare, n, m), entry->share);
  read_field(KeyText(key::kLunDev, n, m), entry->dev);
  read_field(KeyText(key::kLunMntDev, n, m), entry->mnt_dev);
  read_field(KeyText(key::kLunMnt, n, m), entry->mnt);
  return true;
}

// Counts the LUNs of the slot `n` as it is now, up to the first that is free by the looser rule.
int count_luns_at(int n) {
  int count = 0;
  for (const int m : taken_luns_at(n)) count = m;
  return count;
}

// Counts the LUNs of the slot `n` as it is now, also those behind an empty one.
int count_all_luns_at(int n) {
  int count = 0;
  for (int m = 1; m <= kMaxLunsPerTarget; m++) {
    count += tree_present(KeyText(key::kLunNumber, n, m)) ? 1 : 0;
  }
  return count;
}

enum class SecondLook { kTaken, kEmpty, kUnreadable };

// Looks once more at a slot, by the value that defines it. An empty one ends a search as it did the first;
// one that could not be read then, and so seemed to be empty, does not.
SecondLook look_again(const char* key, TreeValue& value) {
  const int length = tree_get(key, value, sizeof value);
  if (length < 0 && errno != ENODATA) return SecondLook::kUnreadable;
  return value[0] == '\0' ? SecondLook::kEmpty : SecondLook::kTaken;
}

// Returns where a target is to be stored, by a second look: its own slot, else `free`, which seems to be
// free; kFailed when another target is there.
int slot_to_take(int free, const char* target_name) {
  bool taken = false;
  for (int n = 1; n <= kMaxTargets; n++) {
    TreeValue name;
    const SecondLook look = look_again(KeyText(key::kTargetName, n), name);
    if (look == SecondLook::kEmpty) break;
    if (look == SecondLook::kUnreadable) continue;
    if (strcmp(name, target_name) == 0) return n;
    taken = taken || n == free;
  }
  return taken ? kFailed : free;
}

// Returns whether a LUN may be stored at `m`, by a second look: nothing is there, and it is nowhere else.
bool may_take_lun_slot(int n, int m, int lun) {
  for (int slot = 1; slot <= kMaxLunsPerTarget; slot++) {
    TreeValue number;
    const SecondLook look = look_again(KeyText(key::kLunNumber, n, slot), number);
    if (look == SecondLook::kEmpty) break;
    if (look == SecondLook::kTaken && (slot == m || atoi(number) == lun)) return false;
  }
  return true;
}

// Writes one value of a new entry. Returns whether the tree took it.
bool set_value(const char* key, const char* value) {
  return tree_write_once(key, value) == kOk;
}

bool set_value(const char* key, int value) {
  return set_value(key, NumberText("%d", value));
}

}  // namespace

int ktree_get_dbidx_by_targetname(const char* target_name) {
  const LogScope scope;
  if (target_name == nullptr) return kFailed;
  const SlotsHeld held;
  int dbidx = kFailed;
  for (int n = 1; n <= kMaxTargets && dbidx == kFailed; n++) {
    TreeValue name;
    if (!read_target_name(n, name)) {
      LOG(1, "ktreec_get(%s) failed", KeyText(key::kTargetName, n).c_str());
      break;
    }
    if (strcmp(name, target_name) == 0) dbidx = n;
  }
  if (dbidx >= 1) remember_target(dbidx, target_name);
  LOG(1, "get %s db_idx=%d", target_name, dbidx);
  return dbidx;
}

int ktree_get_free_dbidx() {
  const LogScope scope;
  for (int n = 1; n <= kMaxTargets; n++) {
    if (!is_target_slot_free(n)) continue;
    LOG(3, "free ent id: %d", n);
    return n;
  }
  return kTreeFailed;
}

int ktree_get_entry_by_targetname(const char* target_name, TargetEntry* entry) {
  const LogScope scope;
  if (entry == nullptr) {
    LOG(0, "Entry is NULL");
    return kFailed;
  }
  *entry = TargetEntry();
  const SlotsHeld held;
  const int dbidx = ktree_get_dbidx_by_targetname(target_name);
  if (dbidx < 1) {
    LOG(0, "Can not get entry from %s", target_name != nullptr ? target_name : "");
    return kFailed;
  }
  entry->db_idx = dbidx;
  copy_text(entry->target_name, target_name);
  read_target_fields(entry, dbidx);
  LOG(1, "get %s db_idx=%d", target_name, dbidx);
  return kOk;
}

int ktree_get_entry_by_dbidx(int dbidx, TargetEntry* entry) {
  const LogScope scope;
  *entry = TargetEntry();
  const HeldSlot slot(dbidx);
  if (!slot || !read_target_name(slot.target(), entry->target_name)) return kFailed;
  remember_target(dbidx, entry->target_name);
  entry->db_idx = dbidx;
  read_target_fields(entry, slot.target());
  return kOk;
}

int ktree_get_lun_entry_by_dbidx(TargetEntry* entry, int dbidx, int lun_dbidx) {
  const LogScope scope;
  if (entry == nullptr || dbidx < 1 || lun_dbidx < 1) return kFailed;
  *entry = TargetEntry();
  const HeldSlot slot(dbidx);
  if (!read_lun_at(entry, dbidx, slot, lun_dbidx)) return kFailed;
  read_target_fields(entry, slot.target());
  return kOk;
}

int ktree_get_lun_of_target(TargetEntry* entry, int lun_dbidx) {
  const LogScope scope("ktree_get_lun_entry_by_dbidx");
  copy_text(entry->share, "");
  copy_text(entry->dev, "");
  copy_text(entry->mnt_dev, "");
  copy_text(entry->mnt, "");
  entry->lun = 0;
  entry->lun_db_idx = 0;
  const HeldSlot slot(entry->db_idx);
  return read_lun_at(entry, entry->db_idx, slot, lun_dbidx) ? kOk : kFailed;
}

int ktree_get_found_lun_entry(TargetEntry* entry, int dbidx, int lun_dbidx, int lun) {
  const LogScope scope;
  const SlotsHeld held;
  if (ktree_get_lun_entry_by_dbidx(entry, dbidx, lun_dbidx) == kOk && entry->lun == lun) return kOk;
  remember_lun(dbidx, lun_dbidx, lun);
  const HeldSlot slot(dbidx, lun_dbidx);
  if (!slot || slot.lun() == lun_dbidx) return kFailed;  // it was deleted, or could not be read where it is
  return ktree_get_lun_entry_by_dbidx(entry, dbidx, slot.lun());
}

int ktree_update_current_targetcnt() {
  const LogScope scope;
  const SlotsHeld held;
  int count = 0;
  for (int n = 1; n <= kMaxTargets; n++) count += tree_present(KeyText(key::kTargetName, n)) ? 1 : 0;
  return tree_write_with_tries(key::kTargetCount, NumberText("%d", count));
}

int ktree_get_total_luncnt() {
  const SlotsHeld held;
  int total = 0;
  for (int n = 1; n <= kMaxTargets && !is_target_slot_free(n); n++) {
    total += count_luns_at(n);
  }
  return total;
}

int ktree_count_target_luns(int dbidx) {
  const LogScope scope;
  if (dbidx < 1) return kFailed;
  const HeldSlot slot(dbidx);
  return slot ? count_luns_at(slot.target()) : 0;
}

bool has_no_further_lun(int dbidx, int most) {
  const LogScope scope;
  const HeldSlot slot(dbidx);
  return !slot || tree_is_missing(KeyText(key::kLunNumber, slot.target(), most + 1),
                                  KeyText(key::kTargetName, slot.target()));
}

int ktree_refresh_total_luncnt() {
  const LogScope scope;
  const SlotsHeld held;
  return tree_write_with_tries(key::kTotalLunCount, NumberText("%d", ktree_get_total_luncnt()));
}

int ktree_update_current_luncnt(int dbidx) {
  const LogScope scope;
  const HeldSlot slot(dbidx);
  if (!slot) return kTreeFailed;
  const int n = slot.target();
  const int result =
      tree_write_with_tries(KeyText(key::kTargetLunCount, n), NumberText("%d", count_all_luns_at(n)));
  const int total_result = ktree_refresh_total_luncnt();
  return result != kOk ? result : total_result;
}

void ktree_complete_lun_entry(const TargetEntry* entry, int lun_dbidx) {
  const LogScope scope;
  const SlotsHeld held(SlotsHeld::kChange);
  const int n = entry->db_idx;
  TreeValue share;
  if (!tree_read(KeyText(key::kLunShare, n, lun_dbidx), share) || strcmp(share, entry->share) != 0) return;
  const KeyText number(key::kLunNumber, n, lun_dbidx);
  const KeyText enable(key::kLunEnable, n, lun_dbidx);
  const KeyText right(key::kLunAccessRight, n, lun_dbidx);
  if (tree_is_missing(enable, number)) set_value(enable, 1);
  if (tree_is_missing(right, number)) set_value(right, VOL_AC_RW);
  if (tree_read_number(KeyText(key::kTargetLunCount, n), 0) != count_all_luns_at(n)) {
    (void)ktree_update_current_luncnt(n);
  }
}

int ktree_get_lun_enable(int* enable, int dbidx, int lun_dbidx) {
  const LogScope scope;
  if (enable == nullptr || dbidx < 1 || lun_dbidx < 1) return kFailed;
  *enable = 0;
  const HeldSlot slot(dbidx, lun_dbidx);
  if (!slot) return kTreeFailed;
  StateValue value;
  const int length = tree_get(KeyText(key::kLunEnable, slot.target(), slot.lun()), value, sizeof value);
  if (length > 0 && value[0] != '\0') {
    *enable = atoi(value) != 0 ? 1 : 0;
    return kOk;
  }
  return length < 0 && value[0] != '\0' ? kFailed : kTreeFailed;
}

int ktree_get_free_lun_dbidx(int dbidx) {
  const LogScope scope;
  if (ktree_get_total_luncnt() >= kMaxLuns) {
    LOG(2, "max number of lun = %d reached", kMaxLuns);
    return kFailed;
  }
  const int m = count_luns_at(dbidx) + 1;
  if (m > kMaxLunsPerTarget) {
    // The number printed is the one past the last slot, not the target's.
    LOG(3, "fail to get free lun dbidx at target idx : %d", m);
    return kTreeFailed;
  }
  LOG(3, "free ent id: %d", m);
  return m;
}

int ktree_get_dbidx_by_lun(int dbidx, int lun) {
  const LogScope scope;
  if (lun < 0) return kFailed;
  const HeldSlot slot(dbidx);
  if (!slot) return kFailed;
  int lun_dbidx = kFailed;
  // Not stored_luns_at(): the slot that ends the search is logged, and one read gives what it is compared
  // with.
  for (int m = 1; m <= kMaxLunsPerTarget && lun_dbidx == kFailed; m++) {
    int stored = 0;
    if (!read_lun_number(slot.target(), m, &stored)) {
      LOG(1, "ktreec_get(%s) failed", KeyText(key::kLunNumber, slot.target(), m).c_str());
      break;
    }
    if (stored == lun) lun_dbidx = m;
  }
  if (lun_dbidx >= 1) remember_lun(dbidx, lun_dbidx, lun);
  LOG(1, "get lun: %d at db_idx=%d", lun, lun_dbidx);
  return lun_dbidx;
}

int ktree_add_lun_entry(TargetEntry* entry) {
  const LogScope scope;
  if (entry == nullptr) return kFailed;
  const SlotsHeld held(SlotsHeld::kChange);
  const int n = entry->db_idx >= 1 ? entry->db_idx : ktree_get_dbidx_by_targetname(entry->target_name);
  if (n < 1 || ktree_get_dbidx_by_lun(n, entry->lun) >= 1) return kFailed;
  const int m = ktree_get_free_lun_dbidx(n);
  if (m <= 0 || !may_take_lun_slot(n, m, entry->lun)) return kFailed;
  entry->lun_db_idx = m;
  slots_move();
  remember_lun(n, m, entry->lun);
  const bool stored = set_value(KeyText(key::kLunNumber, n, m), entry->lun) &&
                      set_value(KeyText(key::kLunShare, n, m), entry->share) &&
                      set_value(KeyText(key::kLunEnable, n, m), 1) &&
                      set_value(KeyText(key::kLunAccessRight, n, m), VOL_AC_RW);
  if (!stored) return kTreeFailed;
  (void)ktree_update_current_luncnt(n);
  return m;
}

int ktree_add_entry(TargetEntry* entry) {
  const LogScope scope;
  if (entry == nullptr || entry->target_name[0] == '\0' || entry->ip[0] == '\0' || entry->port < 0) {
    return kFailed;
  }
  if (entry->chap != 0 && (entry->chap_name[0] == '\0' || entry->chap_pwd[0] == '\0')) return kFailed;
  const SlotsHeld held(SlotsHeld::kChange);
  int n = ktree_get_dbidx_by_targetname(entry->target_name);
  const bool known = n >= 1;
  if (!known) n = ktree_get_free_dbidx();
  if (n < 1) {
    LOG(0, "ktree_get_free_dbidx() failed");
    return kFailed;
  }
  if (!known) n = slot_to_take(n, entry->target_name);
  if (n < 1) return kFailed;
  slots_move();
  entry->db_idx = n;
  remember_target(n, entry->target_name);
  bool stored = set_value(KeyText(key::kTargetName, n), entry->target_name);
  stored &= set_value(KeyText(key::kTargetChap, n), entry->chap);
  stored &= set_value(KeyText(key::kTargetChapName, n), entry->chap_name);
  stored &= set_value(KeyText(key::kTargetChapPwd, n), entry->chap_pwd);
  stored &= set_value(KeyText(key::kTargetIp, n), entry->ip);
  stored &= set_value(KeyText(key::kTargetPort, n), entry->port);
  return stored ? n : kFailed;
}

}  // namespace remvol
