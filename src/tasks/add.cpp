#include "tasks/add.h"

#include "frontend/log.h"
#include "iscsi/node.h"
#include "iscsi/session.h"
#include "iscsi/session_check.h"
#include "iscsi/target_status.h"
#include "support/result.h"
#include "support/target_hold.h"
#include "tree/entry.h"
#include "tree/half_made.h"
#include "tree/search_results.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "volume/disk_identity.h"
#include "volume/lun_status.h"
#include "volume/mount.h"
#include "volume/mount_point.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

// What a result of Target_mount means for a LUN that was just added. A result that is not listed means
// kMountBroken.
struct MountOutcome {
  MountResult mounted;
  VolumeState state;
  int result;
};

constexpr MountOutcome kMountOutcomes[] = {
    {kMounted, kVolumeNormal, kOk},
    {kMountUnsupported, kVolumeUnsupported, kMountUnsupported},
    {kMountReadOnly, kVolumeNormal, kMountReadOnly},
    {kMountTooSmall, kVolumeOffline, kOk},  // the LUN stays added: its disk may come to life later
};
constexpr MountOutcome kMountBroken = {kMountFailed, kVolumeFailed, kFailed};

const MountOutcome& mount_outcome(MountResult mounted) {
  for (const MountOutcome& outcome : kMountOutcomes) {
    if (outcome.mounted == mounted) return outcome;
  }
  return kMountBroken;
}

// Mounts the LUN in a slot of the connected target in `entry`, when it is enabled, and puts the result of the
// last step into `result`. Returns false when the mount broke: nothing more is to be done then.
bool mount_added_lun(TargetEntry* entry, int dbidx, int lun_dbidx, int* result) {
  (void)ktree_update_dev(entry);
  if (ktree_get_found_lun_entry(entry, dbidx, lun_dbidx, entry->lun) < 0) return true;
  int enable = 0;
  *result = ktree_get_lun_enable(&enable, dbidx, lun_dbidx);
  if (*result != kOk || enable != 1) return true;

  (void)ktree_update_volume_state(entry, kVolumeCreating);
  const MountOutcome& outcome = mount_outcome(Target_mount(entry, 0, 0));
  (void)ktree_update_volume_state(entry, outcome.state);
  (void)ktree_update_lun_status(entry, 0);
  unmount_if_deleted(entry);
  *result = outcome.result;
  return &outcome != &kMountBroken;
}

// Stores the target and LUN in `entry`, in one step for other runs. Returns 0 with both slots, or -1.
Result store_lun(TargetEntry* entry, int* dbidx, int* lun_dbidx) {
  mark_target(entry->target_name);
  const SlotsHeld held(SlotsHeld::kChange);
  drop_half_made_luns();
  *dbidx = ktree_add_entry(entry);
  if (*dbidx <= 0) return kFailed;
  const int stored = ktree_get_dbidx_by_lun(*dbidx, entry->lun);
  if (stored > 0) {
    ktree_complete_lun_entry(entry, stored);
    return kFailed;
  }
  if (ktree_check_duplicate_share_name(entry->share) != 0 ||
      is_foreign_mount(entry, mount_point_of(entry->share))) {
    LOG(0, "share name %s has benn used", entry->share);
    return kFailed;
  }
  *lun_dbidx = ktree_add_lun_entry(entry);
  if (*lun_dbidx <= 0) {
    LOG(0, "can not add target %s with lun %d", entry->target_name, entry->lun);
    return kFailed;
  }
  return kOk;
}

}  // namespace

int task_add(const TargetEntry& request) {
  const LogScope scope;
  LOG(2, "start");
  TargetEntry entry = request;
  int dbidx = 0;
  int lun_dbidx = 0;
  // It is stored at once, also while another run brings its target up. Where none does, it is held from the
  // beginning, so that nobody takes it for one that should be mounted by now.
  TargetHold hold(entry.target_name, entry.lun, HoldWait::kLater);
  if (store_lun(&entry, &dbidx, &lun_dbidx) != kOk) return kFailed;
  (void)ktree_update_lun_status(&entry, 0);
  (void)ktree_update_status(&entry);

  hold.await();
  if (!HeldSlot(dbidx, lun_dbidx)) return kFailed;  // deleted meanwhile
  int result = kOk;
  if (check_target_connected(entry.target_name) == kNotLoggedIn) {
    (void)Target_Config_Gen(&entry);  // no login: the volume is mounted when the target is next connected
  } else if (!mount_added_lun(&entry, dbidx, lun_dbidx, &result)) {
    return result;
  }
  (void)ktree_update_current_targetcnt();
  LOG(2, "end");
  return result;
}

int task_share(const char* share) {
  const LogScope scope;
  LOG(2, "start");
  const int used = ktree_check_duplicate_share_name(share);
  LOG(1, used != 0 ? "share name %s is not ok" : "share name %s is ok", share);
  LOG(2, "end");
  return used;
}

}  // namespace remvol
