#include "volume/cover.h"

#include <sched.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "volume/mount_table.h"

namespace remvol {

namespace {

constexpr int kLiftTries = 3;               // memory may be short for a moment
constexpr char kSource[] = "remvol-cover";  // what the mount table shows for a device

enum WorkEnd : int { kDone, kNotDone };

// In the process that works: its mounts are its own from here on. Waits for the word that the cover is there.
[[noreturn]] void work_aside(int link, bool (*work)(const void*), const void* what) {
  char word = 0;
  const bool aside =
      unshare(CLONE_NEWNS) == 0 && mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
  const bool covered = aside && write(link, &word, 1) == 1 && read(link, &word, 1) == 1;
  _exit(covered && work(what) ? kDone : kNotDone);
}

bool ended_well(pid_t child) {
  int status = -1;
  while (waitpid(child, &status, 0) < 0 && errno == EINTR) continue;
  return WIFEXITED(status) && WEXITSTATUS(status) == kDone;
}

}  // namespace

bool run_covered(const char* path, bool (*work)(const void*), const void* what) {
  int link[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, link) != 0) return false;
  const pid_t child = fork();
  if (child == 0) {
    close(link[0]);
    work_aside(link[1], work, what);
  }
  close(link[1]);
  char word = 0;
  const bool covered =
      child > 0 && read(link[0], &word, 1) == 1 &&
      mount(kSource, path, "tmpfs", MS_RDONLY | MS_NODEV | MS_NOSUID | MS_NOEXEC, "size=4k") == 0;
  if (covered) send(link[0], &word, 1, MSG_NOSIGNAL);
  close(link[0]);
  const bool done = child > 0 && ended_well(child);
  if (covered && !done) lift_cover(path);
  return done;
}

void lift_cover(const char* path) {
  for (int tries = 0; tries < kLiftTries; tries++) {
    if (umount2(path, MNT_DETACH | UMOUNT_NOFOLLOW) == 0 || errno == EINVAL || errno == ENOENT) return;
  }
}

void lift_left_cover(const char* path) {
  struct stat top;
  MountLine mount;
  if (stat(path, &top) != 0 || find_mount_of(top.st_dev, path, &mount) != Mounted::kYes) return;
  if (strcmp(mount.source, kSource) == 0) lift_cover(path);
}

}  // namespace remvol
