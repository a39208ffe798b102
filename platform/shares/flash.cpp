#include "shares/flash.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <ctime>

#include "common/lock_file.h"

namespace flash {
namespace {

constexpr char kDoor[] = "flash.door";
constexpr char kUsers[] = "flash.users";
constexpr int kBusyTries = 100;
constexpr long kBusyWait = 20'000'000;  // nanoseconds

// What statvfs(3) reports of a mount and what mount(2) is told so that it stays: a remount sets all of them.
constexpr struct {
  unsigned long reported, told;
} kMountFlags[] = {
    {ST_NOSUID, MS_NOSUID},           {ST_NODEV, MS_NODEV},     {ST_NOEXEC, MS_NOEXEC},
    {ST_SYNCHRONOUS, MS_SYNCHRONOUS}, {ST_NOATIME, MS_NOATIME}, {ST_NODIRATIME, MS_NODIRATIME},
    {ST_RELATIME, MS_RELATIME},
};

bool is_read_only(const char* folder, unsigned long& flags) {
  struct statvfs system {};
  if (statvfs(folder, &system) != 0) return false;
  flags = 0;
  for (const auto& flag : kMountFlags) {
    if ((system.f_flag & flag.reported) != 0) flags |= flag.told;
  }
  return (system.f_flag & ST_RDONLY) != 0;
}

bool remount(const char* folder, unsigned long flags) {
  // The kernel takes no notice of the type; memcheck knows no call without one.
  return mount(nullptr, folder, "", MS_REMOUNT | flags, nullptr) == 0;
}

void write_out(const char* folder) {
  const int fd = open(folder, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return;
  syncfs(fd);
  close(fd);
}

}  // namespace

bool is_mount(const char* folder) {
  struct statx entry {};
  return statx(AT_FDCWD, folder, 0, STATX_TYPE, &entry) == 0 &&
         (entry.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

bool make_writable(const char* folder, Opened& opened) {
  unsigned long flags = 0;
  opened = Opened::kNot;
  if (!is_read_only(folder, flags)) return true;
  // The mount first: a file system that is writable elsewhere is not touched.
  if (remount(folder, flags | MS_BIND)) opened = Opened::kMount;
  if (!is_read_only(folder, flags)) return true;
  if (!remount(folder, flags)) return false;
  opened = Opened::kFileSystem;
  return true;
}

bool make_read_only(const char* folder, Opened opened) {
  if (opened == Opened::kNot) return true;
  write_out(folder);
  unsigned long flags = 0;
  is_read_only(folder, flags);
  return remount(folder, flags | MS_RDONLY | (opened == Opened::kMount ? MS_BIND : 0));
}

UserLock::~UserLock() {
  if (users_ >= 0) close(users_);
  if (door_ >= 0) close(door_);
}

bool UserLock::open_files() {
  door_ = platform::open_lock_file(kDoor);
  users_ = platform::open_lock_file(kUsers);
  return door_ >= 0 && users_ >= 0;
}

bool UserLock::recall(Opened& opened) const {
  char how = 0;
  if (pread(users_, &how, 1, 0) != 1) return false;
  opened = static_cast<Opened>(how);
  return true;
}

void UserLock::record(Opened opened) const {
  const char how = static_cast<char>(opened);
  if (opened == Opened::kNot) {
    (void)!ftruncate(users_, 0);
  } else {
    (void)!pwrite(users_, &how, 1, 0);
  }
}

bool UserLock::enter(const char* folder) {
  if (!open_files() || !platform::take_lock(door_, LOCK_EX)) return false;
  const bool entered = platform::take_lock(users_, LOCK_SH);
  Opened opened = Opened::kNot;
  const bool writable = make_writable(folder, opened);
  const int error = errno;
  // A record that is there already says how it was opened by somebody who is still inside, or who died.
  if (opened != Opened::kNot) record(opened);
  platform::take_lock(door_, LOCK_UN);
  errno = error;
  return entered && writable;
}

bool UserLock::leave(const char* folder) {
  if (users_ < 0 || !platform::take_lock(door_, LOCK_EX)) return false;
  bool closed = true;
  Opened opened = Opened::kNot;
  if (platform::take_lock(users_, LOCK_EX | LOCK_NB) && recall(opened)) {
    const timespec wait{0, kBusyWait};
    for (int tries = 0; !(closed = make_read_only(folder, opened)) && errno == EBUSY && tries < kBusyTries;
         tries++) {
      nanosleep(&wait, nullptr);
    }
    if (closed) record(Opened::kNot);
  }
  const int error = errno;
  platform::take_lock(users_, LOCK_UN);  // for the forked copies as well
  close(users_);
  users_ = -1;
  platform::take_lock(door_, LOCK_UN);
  errno = error;
  return closed;
}

}  // namespace flash
