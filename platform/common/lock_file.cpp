#include "common/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "run_files.h"

namespace platform {
namespace {

constexpr mode_t kOthersWrite = 022;
constexpr mode_t kOthersOpen = 077;
constexpr int kTries = 2;  // the second one after what was there was put away

bool is_ours(int fd, mode_t type, mode_t forbidden) {
  struct stat info = {};
  return fstat(fd, &info) == 0 && (info.st_mode & S_IFMT) == type && info.st_uid == geteuid() &&
         (info.st_mode & forbidden) == 0;
}

// Another user's folder cannot be removed while there is something in it, so it is put aside.
void put_folder_aside() {
  char aside[64];
  snprintf(aside, sizeof aside, "%s.%ld.foreign", remvol::kRunDir, static_cast<long>(getpid()));
  rename(remvol::kRunDir, aside);
}

int open_folder() {
  for (int i = 0; i < kTries; i++) {
    mkdir(remvol::kRunDir, 0700);
    const int folder = open(remvol::kRunDir, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (folder >= 0 && is_ours(folder, S_IFDIR, kOthersWrite)) return folder;
    if (folder >= 0) close(folder);
    put_folder_aside();
  }
  errno = EACCES;
  return -1;
}

}  // namespace

int open_lock_file(const char* name) {
  const int folder = open_folder();
  if (folder < 0) return -1;
  int fd = -1;
  for (int i = 0; i < kTries && fd < 0; i++) {
    fd = openat(folder, name, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0600);
    if (fd >= 0 && is_ours(fd, S_IFREG, kOthersOpen)) break;
    const int error = fd < 0 ? errno : EACCES;
    if (fd >= 0) close(fd);
    fd = -1;
    unlinkat(folder, name, 0);
    errno = error;
  }
  const int error = errno;
  close(folder);
  errno = error;
  return fd;
}

bool take_lock(int fd, int how) {
  int done;
  while ((done = flock(fd, how)) != 0 && errno == EINTR) {
  }
  return done == 0;
}

}  // namespace platform
