// Calls one operation of the volume modules or the locks, as a run of the tool would, and prints its result
// behind the log: "result = N". For tests that need one operation alone, and for those of several runs at
// once.
#include <sched.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "frontend/log.h"
#include "frontend/remvol_debug.h"
#include "support/format_semaphore.h"
#include "support/locks.h"
#include "tree/entry.h"
#include "volume/degrade.h"
#include "volume/device.h"
#include "volume/format.h"
#include "volume/mount.h"
#include "volume/unmount.h"

using namespace remvol;

namespace {

TargetEntry entry;

int number(const char* text) {
  return atoi(text);
}

bool load(char** arguments) {
  return ktree_get_lun_entry_by_dbidx(&entry, number(arguments[0]), number(arguments[1])) == 0;
}

// Tells the test that this run got here and waits for a line, or for the end of the input.
void wait_for_test(const char* word) {
  char line[16];
  printf("%s\n", word);
  fflush(stdout);
  if (fgets(line, sizeof line, stdin) == nullptr) return;
}

long long microseconds() {
  timespec now{};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return now.tv_sec * 1000000 + now.tv_nsec / 1000;
}

int do_mount(char** arguments) {
  if (!load(arguments)) return -999;
  const long long began = microseconds();
  const int result = Target_mount(&entry, number(arguments[2]), number(arguments[3]));
  printf("took = %lld microseconds\n", microseconds() - began);
  return result;
}
int do_mount_all(char** arguments) {
  TargetEntry target{};
  target.db_idx = number(arguments[0]);
  return Target_mount_all_lun(&target, 0, 0);
}
int do_format(char** arguments) {
  return load(arguments) ? Target_format(&entry, arguments[2]) : -999;
}
int do_unmount(char** arguments) {
  return load(arguments) ? Target_LUN_umount(&entry) : -999;
}
int do_unmount_all(char**) {
  Target_umount_all();
  return 0;
}
int do_ftp_path(char** arguments) {
  char path[512] = "";
  const int result = load(arguments) ? get_ftp_share_path(&entry, path) : -999;
  printf("path = %s\n", path);
  return result;
}
int do_unmount_ftp(char** arguments) {
  return Target_umount_ftp(&entry, arguments[0]);
}
int do_degraded(char** arguments) {
  return check_mnt_dev_degrade_to_ro(arguments[0], arguments[1]);
}
int do_node(char** arguments) {
  return _create_device_node(arguments[0]);
}
int do_formatting(char**) {
  return check_mkfs_process_existing();
}
int do_resizing(char** arguments) {
  return check_resizing_fs(arguments[0]);
}

// Holds the recover lock until the test says so.
int do_recover_lock(char**) {
  if (make_lock_dir() != 0) return -108;
  const int fd = get_recover_cri_flock();
  if (fd < 0) return fd;
  wait_for_test("locked");
  return unlock_recover_cri_flock(fd);
}

int do_queue_lock(char**) {
  if (make_lock_dir() != 0) return -108;
  const int fd = wait_flock(kRecoverQueueLock, 3, 100000);
  if (fd < 0) return fd;
  wait_for_test("locked");
  return unlock_flock(fd);
}

// Stays in the critical section until the test says so.
int do_semaphore(char**) {
  int sem_id = -1;
  const int result = format_sem_P(&sem_id, 1);
  if (result != 0) return result;
  wait_for_test("entered");
  return format_sem_V(&sem_id);
}

// Goes through the critical section; whoever finds another one in it says so.
int do_pass(char** arguments) {
  int sem_id = -1;
  const int result = format_sem_P(&sem_id, 1);
  if (result != 0) return result;
  const bool alone = symlink("here", arguments[0]) == 0;
  for (int i = 0; i < 100; i++) sched_yield();  // whoever else is in would come now
  if (alone) unlink(arguments[0]);
  puts(alone ? "alone" : "not alone");
  return format_sem_V(&sem_id);
}

const struct {
  const char* name;
  int arguments;
  int (*call)(char** arguments);
} operations[] = {
    {"mount", 4, do_mount},          // TARGET LUN FORCE-FORMAT UPDATE-SHARE
    {"mount_all", 1, do_mount_all},  // TARGET
    {"format", 3, do_format},        // TARGET LUN NODE
    {"unmount", 2, do_unmount},      // TARGET LUN
    {"unmount_all", 0, do_unmount_all},
    {"ftp_path", 2, do_ftp_path},        // TARGET LUN
    {"unmount_ftp", 1, do_unmount_ftp},  // PATH
    {"degraded", 2, do_degraded},        // DEVICE MOUNT-POINT
    {"node", 1, do_node},                // NAME
    {"formatting", 0, do_formatting},
    {"resizing", 1, do_resizing},  // DEVICE
    {"recover_lock", 0, do_recover_lock},
    {"queue_lock", 0, do_queue_lock},
    {"semaphore", 0, do_semaphore},
    {"pass", 1, do_pass},  // MARK
};

}  // namespace

int main(int argc, char** argv) {
  debug_level = dbg_get_remvol_debug_lv();
  for (const auto& operation : operations) {
    if (argc < 2 || strcmp(argv[1], operation.name) != 0 || argc != operation.arguments + 2) continue;
    printf("result = %d\n", operation.call(argv + 2));
    return 0;
  }
  fprintf(stderr, "volume_driver: no such operation, or not its arguments\n");
  return 2;
}
