#define LOG_SOURCE "remvol_ver_upgrade.cpp"
#include "upgrade/remvol_ver_upgrade.h"

#include <algorithm>
#include <climits>
#include <cstdlib>

#include "frontend/log.h"
#include "support/result.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree/settings_file.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr int kLunSlot = 1;  // a version-0 target has one LUN, number 0

// A state number that moved from the target to its LUN.
struct MovedState {
  const char* from;
  const char* to;
};

constexpr MovedState kMovedStates[] = {
    {key::kOldFormatState, key::kLunFormatState},
    {key::kOldFormatProgress, key::kLunFormatProgress},
    {key::kOldVolumeState, key::kLunVolumeState},
};

// Not tree_write_once(), which tells of a failure in the name of another file: those who read the log know
// the messages of an upgrade by the name of this one.
int set_failed() {
  LOG(0, "ktreec_set() failed");
  return kFailed;
}

// Whatever comes of the upgrade it is not tried again, so a write is.
int write_surely(const char* key, const char* value) {
  return tree_write(key, value) == kOk ? kOk : tree_write(key, value);
}

int set_value(const char* key, const char* value) {
  return write_surely(key, value) == kOk ? kOk : set_failed();
}

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"  // the formats are those of the table above
void move_state(int n, const MovedState& state) {
  TreeValue value;
  if (!tree_read(KeyText(state.from, n), value)) return;
  const KeyText key(state.to, n, kLunSlot);
  const NumberText number("%d", atoi(value));
  if (write_surely(key, number) != kOk) LOG(0, "ktreec_set %s= %s failed", key.c_str(), number.c_str());
}
#pragma GCC diagnostic pop

// The target's share becomes its LUN's. A share that is missing is logged as a failed write: that is how
// those who read the log know it.
int move_share(int n) {
  TreeValue share;
  if (!tree_read(KeyText(key::kOldShare, n), share)) return set_failed();
  return set_value(KeyText(key::kLunShare, n, kLunSlot), share);
}

// A conversion would make the first LUN of such a target its number 0 and forget the others. One that was
// interrupted left number 0 and no share: it goes on.
bool is_in_todays_form(int n) {
  TreeValue number;
  return (tree_read(KeyText(key::kLunNumber, n, kLunSlot), number) && atoi(number) != 0) ||
         tree_present(KeyText(key::kLunShare, n, kLunSlot));
}

int upgrade_target(int n) {
  const KeyText name(key::kTargetName, n);
  if (!tree_present(name)) {
    LOG(2, "get %s fail", name.c_str());
    return kFailed;
  }
  if (is_in_todays_form(n)) {
    LOG(1, "%s is in today's form", name.c_str());
    return kOk;
  }
  if (set_value(KeyText(key::kTargetLunCount, n), "1") != kOk ||
      set_value(KeyText(key::kLunNumber, n, kLunSlot), "0") != kOk ||
      set_value(KeyText(key::kLunEnable, n, kLunSlot), "1") != kOk ||
      set_value(KeyText(key::kLunAccessRight, n, kLunSlot), NumberText("%d", VOL_AC_RW)) != kOk ||
      move_share(n) != kOk) {
    return kFailed;
  }
  for (const MovedState& state : kMovedStates) move_state(n, state);
  return kOk;
}

int upgrade_targets() {
  TreeValue text;
  if (!tree_read(key::kTargetCount, text)) {
    LOG(1, "%s is NULL or disappear, exit func", key::kTargetCount);
    return kOk;
  }
  const int count = atoi(text);
  if (count <= 0) {
    LOG(1, "%s = 0, exit func", key::kTargetCount);
    return kOk;
  }
  for (int n = 1; n <= count; n++) {
    if (upgrade_target(n) != kOk) return kFailed;
  }
  return kOk;
}

int upgrade_from(int stored, int current) {
  if (stored > current) {
    print_open(0, "remvol: Do not support settings downgrade to version %d", current);
    return kFailed;
  }
  if (current == stored) {
    LOG(2, "the same version, EXIT");
    return kOk;
  }
  if (stored != 0) {
    LOG(1, "Not supported versions, EXIT");
    return kOk;
  }
  const int result = version_upgrade_v0_to_v1();
  // With a version a tree that was never loaded would be dumped over the settings.
  if (result == kOk && unloaded_settings() == nullptr) (void)set_remvol_ver_to_db(current);
  return result;
}

}  // namespace

int get_remvol_ver_from_db(int* version) {
  if (version == nullptr) return kFailed;
  *version = tree_read_number(key::kVersion, 0);
  return kOk;
}

int compare_remvol_ver(int* stored, int* current) {
  if (stored == nullptr || current == nullptr || get_remvol_ver_from_db(stored) != kOk) return kFailed;
  *current = kSettingsVersion;
  const long long difference = llabs(static_cast<long long>(*current) - *stored);
  return static_cast<int>(std::min<long long>(difference, INT_MAX));
}

int is_remvol_ver_changed() {
  int stored = 0;
  int current = 0;
  return compare_remvol_ver(&stored, &current) != 0 ? 1 : 0;
}

int set_remvol_ver_to_db(int version) {
  const LogScope scope;
  const NumberText value("%d", version);
  if (tree_write(key::kVersion, value) == kOk) return kOk;
  LOG(0, "ktreec_set %s = %s failed", key::kVersion, value.c_str());
  return kFailed;
}

void delete_fw_flag() {
  const LogScope scope;
  if (tree_delete(key::kFirmwareUpgrade) != kOk) LOG(2, "ktreec_del %s failed", key::kFirmwareUpgrade);
}

int version_upgrade_v0_to_v1() {
  const LogScope scope;
  LOG(1, "v0 to v1 start");
  const SlotsHeld held(SlotsHeld::kChange);  // a LUN that is half converted looks like garbage to other runs
  slots_move();
  const int result = upgrade_targets();
  LOG(1, "v0 to v1 end, ret = %d", result);
  return result;
}

int version_upgrade() {
  const LogScope scope;
  LOG(1, "Start remvol settings upgrade");
  int stored = 0;
  int current = 0;
  int result = compare_remvol_ver(&stored, &current) < 0 ? kFailed : kOk;
  LOG(2, "preious version = %d, now version = %d", stored, current);
  if (result == kOk) result = upgrade_from(stored, current);
  delete_fw_flag();
  LOG(1, "Finish remvol settings upgrade");
  return result;
}

}  // namespace remvol
