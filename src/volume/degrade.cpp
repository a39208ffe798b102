#include "volume/degrade.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/files.h"
#include "support/text.h"
#include "sysaux.h"
#include "volume/mount_table.h"
#include "volume/remount.h"

namespace remvol {

namespace {

constexpr char kMtab[] = "/etc/mtab";
constexpr char kSeparators[] = " \t";
constexpr int kMountLine = 999;       // longest read of a mount table
constexpr int kMountInfoLine = 8191;  // the lines of layered mounts are long
constexpr int kRemountWait = 5;       // seconds, for a read-only file system to show after the remount

// Returns whether the first "rw" or "ro" of `field`, at `found`, stands as an option of its own.
bool is_bounded(const char* field, const char* found, size_t length) {
  const auto ends = [](char c) { return c == ',' || isspace(static_cast<unsigned char>(c)) != 0; };
  const char after = found[length];
  return (found == field || ends(found[-1])) && (after == '\0' || ends(after));
}

// Returns whether one of the options in `field` is `option`, wherever it stands.
bool has_option(const char* field, const char* option) {
  const size_t length = strlen(option);
  for (const char* found = strstr(field, option); found != nullptr; found = strstr(found + 1, option)) {
    if (is_bounded(field, found, length)) return true;
  }
  return false;
}

// Returns what one field of a table line says of the access right. Only the first occurrence of each text
// counts, and an "rw" inside a word hides an "ro" that follows in the same field.
MountRight field_right(const char* field) {
  // Kernels from 6.14 on keep "rw" on a file system that refuses every write and add one of these.
  if (has_option(field, "emergency_ro") || has_option(field, "shutdown")) return kMountedRo;
  const char* found = strstr(field, "rw");
  if (found != nullptr) return is_bounded(field, found, 2) ? kMountedRw : kMountedUnclear;
  found = strstr(field, "ro");
  return found != nullptr && is_bounded(field, found, 2) ? kMountedRo : kMountedUnclear;
}

// Returns whether the table line of `source` is one of `device`: the device itself or a partition of it.
bool is_source_of(const char* source, const char* device) {
  const char* match = strstr(source, device);
  if (match == nullptr) return false;
  LOG(2, "get a possible entry dev = |%s|", match);
  const char next = match[strlen(device)];
  if (next == '\0' || isdigit(static_cast<unsigned char>(next)) != 0) return true;
  LOG(2, "%s is not under %s, skip", match, device);
  return false;
}

// Return the right that one line of a table gives `device`; kNotMounted when it is of another one. They cut
// the line up.
using LineReader = MountRight (*)(char* line, const char* device);

MountRight read_mount_line(char* line, const char* device) {
  char* rest = nullptr;
  const char* source = strtok_r(line, kSeparators, &rest);
  if (source == nullptr || !is_source_of(source, device)) return kNotMounted;
  while (const char* field = strtok_r(nullptr, kSeparators, &rest)) {
    if (field[0] == '/') continue;
    const MountRight right = field_right(field);
    if (right != kMountedUnclear) return right;
  }
  return kMountedUnclear;
}

// A line of /proc/self/mountinfo, see proc_pid_mountinfo(5): the mount's own options are its sixth field, the
// source is the second one after the separator.
MountRight read_mountinfo_line(char* line, const char* device) {
  char* separator = strstr(line, " - ");
  if (separator == nullptr) return kNotMounted;
  *separator = '\0';
  char* rest = nullptr;
  strtok_r(separator + 3, kSeparators, &rest);
  const char* source = strtok_r(nullptr, kSeparators, &rest);
  if (source == nullptr || !is_source_of(source, device)) return kNotMounted;
  const char* options = strtok_r(line, kSeparators, &rest);
  for (int field = 1; field < 6 && options != nullptr; field++) {
    options = strtok_r(nullptr, kSeparators, &rest);
  }
  return options != nullptr ? field_right(options) : kMountedUnclear;
}

// Reads a table up to the first line that decides, in reads of at most `limit` characters.
MountRight read_table(const char* device, const char* table, LineReader read_line, int limit) {
  const File file(fopen(table, "re"));
  if (!file) {
    LOG(0, "failed to open mtab file at %s", table);
    return kTableUnreadable;
  }
  MountRight right = kNotMounted;
  char line[kMountInfoLine + 1];
  while (right != kMountedRw && right != kMountedRo && fgets(line, limit + 1, file.get()) != nullptr) {
    const MountRight found = read_line(line, device);
    if (found != kNotMounted) right = found;
  }
  LOG(2, "get mnt file access right = %d for dev %s", right, device);
  return right;
}

bool is_valid(const char* device) {
  return device != nullptr && device[0] != '\0';
}

// Where /etc/mtab is a link into /proc (util-linux 2.23 and later leave it so), it says what the kernel says
// now. What the volume was mounted with are the mount's own options then; they stay "rw" when the file system
// itself turns read-only.
bool is_mtab_live() {
  char target[PATH_MAX];
  return realpath(kMtab, target) != nullptr && strncmp(target, "/proc/", 6) == 0;
}

// Returns whether what is mounted on `path` has lost its disk: its session was closed, and no other brings
// the disk back. A virtual file system's device has the major number 0, and sysfs does not know it; where
// sysfs does not tell there is none lost.
bool has_lost_disk(const char* path) {
  struct stat mounted;
  if (stat(path, &mounted) != 0 || major(mounted.st_dev) == 0) return false;
  const Text<64> disk("/sys/dev/block/%u:%u", major(mounted.st_dev), minor(mounted.st_dev));
  return access("/sys/dev/block", F_OK) == 0 && access(disk, F_OK) != 0;
}

}  // namespace

MountRight get_mnt_ac_right_from_mnt_file(const char* device, const char* table) {
  const LogScope scope;
  if (!is_valid(device)) return kTableUnreadable;
  return read_table(device, table, read_mount_line, kMountLine);
}

MountRight get_mtab_access_right(const char* device) {
  const LogScope scope;
  if (!is_valid(device)) {
    LOG(0, "dev is not valid value");
    return kTableUnreadable;
  }
  const MountRight right = is_mtab_live()
                               ? read_table(device, kMountInfo, read_mountinfo_line, kMountInfoLine)
                               : get_mnt_ac_right_from_mnt_file(device, kMtab);
  LOG(2, "get mtab access right = %d for dev %s", right, device);
  return right;
}

MountRight get_proc_mount_access_right(const char* device) {
  const LogScope scope;
  if (!is_valid(device)) {
    LOG(0, "dev is not valid value");
    return kTableUnreadable;
  }
  const MountRight right = get_mnt_ac_right_from_mnt_file(device, kProcMounts);
  LOG(2, "get proc mounts access right = %d for dev %s", right, device);
  return right;
}

Degradation check_mnt_dev_degrade_to_ro(const char* device, const char* mount_path) {
  const LogScope scope;
  if (!is_valid(device)) {
    LOG(0, "dev is not valid!");
    return kDegradeUnknown;
  }
  const MountRight mounted = get_mtab_access_right(device);
  if (mounted == kNotMounted) {
    LOG(0, "can not find %s in mtab", device);
    return kDegradeUnlisted;
  }
  if (mounted < 0) {
    LOG(0, "failed to get mtab access right");
    return kDegradeUnknown;
  }
  if (mounted == kMountedRo) {
    LOG(1, "%s has been mounted as ro, skip to check degrade", device);
    return kNotDegraded;
  }
  const bool has_path = mount_path != nullptr && mount_path[0] != '\0';
  if (has_path) (void)remount_mnt_path(mount_path, kRemountWait);
  const MountRight now = get_proc_mount_access_right(device);
  if (now == kNotMounted) {
    LOG(1, "can not find %s in /proc/mounts", device);
    return kDegradeUnlisted;
  }
  if (now < 0) {
    LOG(0, "failed to get proc mounts access right for %s", device);
    return kDegradeUnknown;
  }
  if (now == kMountedRo || (has_path && sys_mount_point(mount_path) != 0 &&
                            (has_lost_disk(mount_path) || refuses_writes(mount_path)))) {
    LOG(2, "the access right is degrade to ro for dev %s", device);
    return kDegraded;
  }
  LOG(2, "access right in mtab and proc are both rw for dev %s", device);
  return kNotDegraded;
}

// Kernels 6.1.192, 6.12 and 6.13 show nothing of an ext4 that refuses every write: only a write tells. The
// file has no name, so it leaves nothing behind. Errors other than a refusal decide nothing: not every file
// system can make such a file.
bool refuses_writes(const char* mount_path) {
  const int fd = open(mount_path, O_TMPFILE | O_WRONLY | O_CLOEXEC, 0600);
  const bool written = fd >= 0 && write(fd, "", 1) == 1 && fsync(fd) == 0;
  const int error = written ? 0 : errno;
  if (fd >= 0) close(fd);
  return error == EROFS || error == EIO;
}

}  // namespace remvol
