#include "tasks/recover.h"

#include <unistd.h>

#include "frontend/log.h"
#include "iscsi/target_status.h"
#include "support/command.h"
#include "support/locks.h"
#include "support/program.h"
#include "support/result.h"
#include "support/shell_text.h"
#include "support/target_hold.h"
#include "support/text.h"
#include "tasks/connect.h"
#include "tasks/ftp_share.h"
#include "tasks/whole_target.h"
#include "tree/access.h"
#include "tree/entry.h"
#include "tree/lun_walk.h"
#include "tree/recover_queue.h"
#include "tree/slots.h"
#include "tree/state.h"
#include "volume/degrade.h"
#include "volume/format.h"
#include "volume/unmount.h"

namespace remvol {

namespace {

constexpr int kQueueLockRetries = 3;
constexpr int kQueueLockWaitUs = 100000;
constexpr int kBusyRetrySeconds = 10;

struct TargetHealth {
  bool degraded = false;  // a LUN was found read-only or could not be checked
  bool busy = false;      // a LUN is being formatted, waits for that, or is being resized
};

// Asks twice, a second apart: between two steps of the work looked for the process list is empty for a
// moment.
template <typename Probe>
bool is_running(Probe probe) {
  if (probe() == kRunning) return true;
  sleep(1);
  return probe() == kRunning;
}

bool is_formatting(const TargetEntry* lun) {
  int state = kFormatIdle;
  const int read = ktree_get_lun_format_state(lun->db_idx, lun->lun_db_idx, &state);
  if (read != kOk || (state != kFormatting && state != kFormatWaiting)) return false;
  return is_running(check_mkfs_process_existing);
}

void log_busy(const TargetEntry* lun, const char* work) {
  LOG(1, "One of target:%s 's LUN is %s", lun->target_name, work);
  LOG(1, "Skip it now, and kick it back to recover queue");
}

void check_lun(const TargetEntry* lun, TargetHealth* health) {
  const char* device = lun->dev[0] != '\0' ? lun->dev : lun->mnt_dev;
  const Degradation degraded = check_mnt_dev_degrade_to_ro(device, lun->mnt);
  if (degraded == kDegraded || degraded == kDegradeUnlisted) {
    LOG(1, "dev %s access right is degraded to ro", device);
    health->degraded = true;
  }
  if (is_formatting(lun)) {
    log_busy(lun, "formatting or waitting for format");
    health->busy = true;
  }
  if (is_running([device] { return check_resizing_fs(device); })) {
    log_busy(lun, "resizing");
    health->busy = true;
  }
}

TargetHealth check_luns(int dbidx) {
  TargetHealth health;
  TargetEntry lun;
  LunWalk luns(dbidx, LunWalk::kAtUnreadable);
  while (luns.next(&lun)) check_lun(&lun, &health);
  return health;
}

// Returns whether the target is to be connected and was lost, by what is stored now.
bool is_lost(int dbidx) {
  const SlotsHeld held;
  TargetEntry target;
  int state = kDisconnected;
  if (ktree_get_entry_by_dbidx(dbidx, &target) != kOk) return false;
  (void)ktree_get_connect_state(dbidx, &state);
  return target.conn_set != 0 && state == kRecovering;
}

int leave_target(const TargetEntry* entry) {
  LOG(1, "This target %s has not been set to connect", entry->target_name);
  return kOk;
}

// Returns whether the target was still lost.
bool store_recovered(TargetEntry* entry) {
  const SlotsHeld held(SlotsHeld::kChange);
  if (!is_lost(entry->db_idx)) return false;
  entry->conn_set = 1;
  (void)ktree_record_connect_set(entry);
  (void)ktree_set_connect_state(entry->db_idx, kConnected);
  return true;
}

int keep_volumes(TargetEntry* entry) {
  if (!store_recovered(entry)) return leave_target(entry);
  (void)ktree_update_status(entry);
  return kOk;
}

// The tool itself, in the background: it comes back for the target after a while.
CommandText later_recovery_command(const char* target_name) {
  return shell_command("%s -w %d --oiscsi_evt_recover -n %s &", program_path, kBusyRetrySeconds, target_name);
}

void postpone(const TargetEntry* entry) {
  (void)run_command(later_recovery_command(entry->target_name));
}

// Takes every volume of the target at `dbidx` away. A slot that cannot be read is passed over, an empty one
// ends the walk.
void unmount_luns(int dbidx) {
  TargetEntry lun;
  LunWalk luns(dbidx, LunWalk::kAtEmpty);
  while (luns.next(&lun)) {
    FtpPath ftp_path;
    (void)take_ftp_share_down(&lun, ftp_path);
    (void)Target_LUN_umount(&lun);
  }
}

// Unmounts everything, logs out and connects the target again. Returns the result of the connection. A target
// that another run is at for long is put off: to wait for its format would hold up the recovery of all
// others.
int rebuild(TargetEntry* entry) {
  const BriefTargetHold hold(entry->target_name, is_no_lun_formatting);
  if (hold.given_up()) {
    LOG(1, "another run is at target %s, its recovery is put off", entry->target_name);
    postpone(entry);
    return kOk;
  }
  if (!is_lost(entry->db_idx)) return leave_target(entry);
  unmount_luns(entry->db_idx);
  (void)Target_Logout(entry);
  entry->conn_set = 1;
  (void)ktree_set_connect_state(entry->db_idx, kConnecting);
  const int result = task_connect(*entry);
  int state = kDisconnected;
  if (result == kTreeFailed && ktree_get_connect_state(entry->db_idx, &state) == kOk && state != kConnected) {
    (void)ktree_set_connect_state(entry->db_idx, kDisconnected);
  }
  return result;
}

// Recovers the target called `name`. Returns its result.
int recover_target(const char* name) {
  LOG(1, "==> Processing - %s", name);
  TargetEntry entry;
  if (ktree_get_entry_by_targetname(name, &entry) != kOk) {
    LOG(1, "Can not find: %s", name);
    return kNotStored;
  }
  if (!is_lost(entry.db_idx)) return leave_target(&entry);
  // The looks take seconds: what is done then is for a target that nobody has taken away or brought up since.
  const TargetHealth health = check_luns(entry.db_idx);
  if (!health.degraded) return keep_volumes(&entry);
  if (!health.busy) return rebuild(&entry);
  postpone(&entry);
  return kOk;
}

// Recovers whatever is queued; `result` becomes that of the last target. Returns whether the queue is worked
// off.
bool drain_queue(int* result) {
  TreeValue name;
  int popped;
  while ((popped = ktree_pop_recover_queue(name)) == kOk) *result = recover_target(name);
  return popped == kFailed;
}

// Leaves the target to the run that is recovering. Returns 0, -1 or -103.
int queue_target(const char* name) {
  LOG(1, "==> insert queue - %s", name);
  const int lock = wait_flock(kRecoverQueueLock, kQueueLockRetries, kQueueLockWaitUs);
  if (lock < 0) {
    LOG(0, "lock failed for %s, skip and exit", name);
    return kFailed;
  }
  const int result = ktree_insert_recover_queue(name);
  (void)unlock_flock(lock);
  return result;
}

// Marks the target as being recovered. Returns 0 or kNotStored.
Result mark_as_lost(const char* name) {
  TargetEntry entry;
  if (ktree_get_entry_by_targetname(name, &entry) != kOk) {
    LOG(1, "Can not find: %s", name);
    return kNotStored;
  }
  if (entry.conn_set != 0) {
    (void)ktree_set_connect_state(entry.db_idx, kRecovering);
  } else {
    LOG(1, "This target %s has not been set to connect", name);
  }
  return kOk;
}

// Recovers the target and all that are queued, or queues it where another run does.
int recover_or_queue(const char* name, int wait_seconds) {
  if (wait_seconds > 0) {
    LOG(1, "Sleep %d seconds before add %s to recover queue...", wait_seconds, name);
    sleep(static_cast<unsigned>(wait_seconds));
  }
  if (make_lock_dir() != kOk) {
    LOG(0, "create lock directory failed");
    return kFailed;
  }
  int lock = get_recover_cri_flock();
  if (lock < 0) return queue_target(name);
  int result = recover_target(name);
  bool drained;
  do {
    drained = drain_queue(&result);
    (void)unlock_recover_cri_flock(lock);
    // Whoever found the lock held may have queued its target behind the last look at the queue.
  } while (drained && !recover_queue_is_empty() && (lock = get_recover_cri_flock()) >= 0);
  return result;
}

}  // namespace

int task_oiscsi_evt_reopen(const char* target_name) {
  const LogScope scope;
  LOG(2, "start");
  const int result = mark_as_lost(target_name);
  LOG(2, "end");
  return result;
}

int task_oiscsi_evt_recover(const char* target_name, int wait_seconds) {
  const LogScope scope;
  LOG(2, "start");
  const int result = recover_or_queue(target_name, wait_seconds);
  LOG(2, "end");
  return result;
}

}  // namespace remvol
