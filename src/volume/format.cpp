#include "volume/format.h"

#include <poll.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "support/coreutils.h"
#include "support/format_semaphore.h"
#include "support/fuser.h"
#include "support/session_hold.h"
#include "support/text.h"
#include "sysaux.h"
#include "tree/state.h"
#include "volume/disk_identity.h"
#include "volume/e2fsprogs.h"
#include "volume/file_systems.h"
#include "volume/format_progress.h"
#include "volume/lun_status.h"
#include "volume/process_check.h"

namespace remvol {

namespace {

constexpr int kStartTries = 3;
constexpr int kFirstWordMs = 5000;  // of mke2fs, at most
using FsName = char[16];

constexpr FormatResult kGoOn = kFormatted;  // of a step

bool check_format_arguments(const TargetEntry* entry, const char* partition) {
  if (entry->dev[0] == '\0') {
    LOG(0, "dev node name is empty");
    return false;
  }
  if (entry->db_idx <= 0 || entry->lun_db_idx <= 0) {
    LOG(0, "target or lun db index is not given");
    return false;
  }
  if (partition == nullptr) {
    LOG(0, "no formatting dev to do");
    return false;
  }
  return true;
}

// A state that could not be stored is logged and forgotten: the format goes on.
void log_failed_update(int result) {
  if (result != 0) LOG(0, "Update ktree FAILED");
}

// A partition that carried ext2 or ext3 keeps its kind.
void choose_fs(FsName& fs_type, const char* partition) {
  char found[64] = "";
  if (sys_get_fs_type(found, partition) != 0 || found[0] == '\0') {
    LOG(2, "set strFS to default fs: %s", kDefaultFileSystem);
    copy_text(fs_type, kDefaultFileSystem);
    return;
  }
  copy_text(fs_type, found);
}

CommandText make_format_command(FsName& fs_type, const char* partition) {
  const FileSystem* file_system = find_file_system(fs_type);
  if (file_system == nullptr || file_system->make == nullptr) {
    LOG(1, "%s is not supported by this program, set file system type to %s", fs_type, kDefaultFileSystem);
    copy_text(fs_type, kDefaultFileSystem);
    file_system = find_file_system(fs_type);
  }
  return file_system->make(partition);
}

// Returns the running mke2fs, or null when it could not be started three times.
FILE* start_mke2fs(FsName& fs_type, const char* partition) {
  CommandText command;
  for (int tries = 0; tries < kStartTries; tries++) {
    command = make_format_command(fs_type, partition);
    LOG(2, "popen(%s)", command.c_str());
    FILE* output = popen(command, "r");
    if (output != nullptr) return output;
    LOG(0, "popen(%s , ...) failed", command.c_str());
  }
  LOG(0, "system() of cmd '%s' failed", command.c_str());
  return nullptr;
}

// Publishes the progress until the output ends. How mke2fs ended is not asked: mounting notices a missing
// file system.
void follow_mke2fs(FILE* output, const TargetEntry* entry, const char* partition) {
  FormatProgress progress{};
  char text[kFormatReadSize];
  while (fgets(text, sizeof text, output) != nullptr) {
    if (!update_format_progress(&progress, text)) continue;
    LOG(2, "%s : Percent=%d", partition, progress.percent);
    log_failed_update(ktree_update_format_progress(entry->db_idx, entry->lun_db_idx, progress.percent));
  }
  pclose(output);
  log_failed_update(ktree_update_format_progress(entry->db_idx, entry->lun_db_idx, 100));
}

// Whether the partition, chosen a while ago, may still be formatted. Returns kGoOn, kFormatRefused or
// kFormatLeftAlone.
FormatResult look_again(const TargetEntry* entry, const char* partition, const SeenContent* seen) {
  if (is_foreign_disk(entry, partition)) return kFormatRefused;
  if (is_node_mounted(partition)) {
    LOG(0, "%s is mounted by now, it is not formatted", partition);
    return kFormatLeftAlone;
  }
  if (seen == nullptr) return kGoOn;
  char found[64] = "";
  if (sys_get_fs_type(found, partition) != 0 || found[0] == '\0') return kGoOn;
  if (strcmp(found, seen->fs_type) == 0 && content_mark(partition) == seen->mark) return kGoOn;
  LOG(0, "%s carries %s by now, it is not formatted", partition, found);
  return kFormatLeftAlone;
}

// Whether nothing but the entry's own disk would be overwritten, in this moment, and nobody uses it.
bool may_overwrite(const TargetEntry* entry, const char* partition) {
  if (is_foreign_disk(entry, partition)) return false;
  if (!is_node_claimed(partition)) return true;
  LOG(0, "%s is in use, it is not formatted", partition);
  return false;
}

// Ends everybody else on the partition. Returns kGoOn or kFormatRefused.
FormatResult end_users(const TargetEntry* entry, const char* partition) {
  const SessionKept kept(entry->target_name);
  const NodeLeftAlone alone(partition);
  if (is_foreign_disk(entry, partition)) return kFormatRefused;
  System("%s", end_users_command(partition).c_str());
  return kGoOn;
}

// Returns kGoOn, kFormatRefused or kFormatNotWritable.
FormatResult wipe_beginning(const TargetEntry* entry, const char* partition) {
  const SessionKept kept(entry->target_name);
  if (!may_overwrite(entry, partition)) return kFormatRefused;
  if (System("%s", wipe_beginning_command(partition).c_str()) == 0) return kGoOn;
  LOG(1, "dd %s failed, this device is not able to write.", partition);
  return kFormatNotWritable;
}

// Starts mke2fs and waits until it has opened the disk: before that it says nothing. From then on the disk's
// name can go to no other. Returns kGoOn, kFormatRefused or kFormatNotStarted.
FormatResult begin_making(const TargetEntry* entry, FsName& fs_type, const char* partition, FILE** output) {
  const SessionKept kept(entry->target_name);
  if (!may_overwrite(entry, partition)) return kFormatRefused;
  *output = start_mke2fs(fs_type, partition);
  if (*output == nullptr) return kFormatNotStarted;
  pollfd said = {fileno(*output), POLLIN, 0};
  if (said.fd >= 0) poll(&said, 1, kFirstWordMs);
  return kGoOn;
}

// Makes the file system, everybody else on the partition ended and its beginning wiped before. Returns
// kGoOn, kFormatRefused, kFormatNotWritable, or kFormatNotStarted.
FormatResult make_file_system(TargetEntry* entry, const char* partition) {
  log_failed_update(ktree_update_formatting_state(entry, kFormatting));
  log_failed_update(ktree_update_format_progress(entry->db_idx, entry->lun_db_idx, 0));
  log_failed_update(ktree_update_lun_status(entry, 1));
  LOG(2, "format partition %s", partition);
  const DiskHeld disk(partition);
  FormatResult result = end_users(entry, partition);
  if (result != kGoOn) return result;
  FsName fs_type;
  choose_fs(fs_type, partition);
  result = wipe_beginning(entry, partition);
  if (result != kGoOn) return result;
  sleep(1);
  FILE* output = nullptr;
  result = begin_making(entry, fs_type, partition, &output);
  if (result != kGoOn) return result;
  follow_mke2fs(output, entry, partition);
  return kGoOn;
}

}  // namespace

FormatResult Target_format(TargetEntry* entry, const char* partition, const SeenContent* seen) {
  const LogScope scope;
  if (!check_format_arguments(entry, partition)) return kFormatRefused;
  int sem_id = -1;
  log_failed_update(ktree_update_formatting_state(entry, kFormatWaiting));
  if (format_sem_P(&sem_id, 1) != 0) {
    log_failed_update(ktree_update_formatting_state(entry, kFormatFailed));
    LOG(0, "wait fmt_sem failed, exit");
    return kFormatRefused;
  }
  FormatResult result = look_again(entry, partition, seen);
  if (result == kGoOn) result = make_file_system(entry, partition);
  // The semaphore stays taken and the format state stays "formatting" until this run ends; the kernel then
  // undoes the semaphore's change.
  if (result == kFormatNotWritable) return result;
  const FormatState state = result == kGoOn || result == kFormatLeftAlone ? kFormatIdle : kFormatFailed;
  log_failed_update(ktree_update_formatting_state(entry, state));
  const int left = format_sem_V(&sem_id);
  if (left != 0) LOG(0, "release fmt_sem failed, exit");
  return result == kFormatRefused || result == kFormatLeftAlone ? result : static_cast<FormatResult>(left);
}

ProcessState check_mkfs_process_existing() {
  const LogScope scope;
  return is_command_running_on(kMke2fs, "/dev/sd") ? kRunning : kNotRunning;
}

ProcessState check_resizing_fs(const char* device) {
  const LogScope scope;
  LOG(2, "checking if device %s is resizing...", device);
  return is_command_running_on(kResize2fs, device) ? kRunning : kNotRunning;
}

}  // namespace remvol
