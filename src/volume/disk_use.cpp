#include "volume/disk_use.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "support/files.h"
#include "support/text.h"
#include "volume/device.h"
#include "volume/mount_table.h"

namespace remvol {

namespace {

constexpr size_t kMarkedSize = 4096;
constexpr useconds_t kLookPause = 100000;  // microseconds
constexpr int kClaimLooks = 10;            // a second
constexpr int kUdevLooks = 50;             // 5 seconds
constexpr char kUdev[] = "/run/udev";
constexpr char kUdevQueue[] = "/run/udev/queue";  // there while events are pending; see udevadm(8), settle

// A descriptor that closes itself.
struct Descriptor {
  explicit Descriptor(const char* path, int flags) : fd(open(path, flags | O_CLOEXEC | O_NONBLOCK)) {}
  ~Descriptor() {
    if (fd >= 0) close(fd);
  }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;

  const int fd;
};

bool is_block_device(const char* node, struct stat* status) {
  return stat(node, status) == 0 && S_ISBLK(status->st_mode);
}

bool is_claimed_now(const char* node) {
  const Descriptor device(node, O_RDONLY | O_EXCL);  // of a block device: fails while it is in use
  return device.fd < 0 && errno == EBUSY;
}

// udev holds a shared lock on the whole disk while it looks at the disk or at a partition of it; see
// https://systemd.io/BLOCK_DEVICE_LOCKING.
bool is_udev_at(const char* disk) {
  if (access(kUdevQueue, F_OK) == 0) return true;
  struct stat status;
  if (!is_block_device(disk, &status)) return false;
  const Descriptor device(disk, O_RDONLY);
  return device.fd >= 0 && flock(device.fd, LOCK_EX | LOCK_NB) != 0 && errno == EWOULDBLOCK;
}

// Returns whether udev has nothing to do with the node, in time.
bool wait_for_udev(const char* node) {
  const PathText disk("/dev/%s", disk_of_node(node).c_str());
  int look = 0;
  while (look < kUdevLooks && access(kUdev, F_OK) == 0 && is_udev_at(disk)) {
    usleep(kLookPause);
    look++;
  }
  return look < kUdevLooks;
}

}  // namespace

DiskHeld::DiskHeld(const char* partition) {
  const PathText disk("/dev/%s", disk_of_node(partition).c_str());
  if (strcmp(disk, partition) != 0) fd_ = open(disk, O_RDONLY | O_NONBLOCK | O_CLOEXEC);
}

DiskHeld::~DiskHeld() {
  if (fd_ >= 0) close(fd_);
}

ContentMark content_mark(const char* node) {
  struct stat status;
  if (!is_block_device(node, &status)) return kNoMark;
  const Descriptor device(node, O_RDONLY);
  unsigned char content[kMarkedSize];
  if (device.fd < 0 || pread(device.fd, content, sizeof content, 0) != sizeof content) return kNoMark;
  ContentMark mark = 0xcbf29ce484222325;  // FNV-1a
  for (const unsigned char byte : content) mark = (mark ^ byte) * 0x100000001b3;
  return mark != kNoMark ? mark : 1;
}

bool is_node_mounted(const char* node) {
  struct stat status;
  MountLine mount;
  return is_block_device(node, &status) && find_mount_of(status.st_rdev, nullptr, &mount) == Mounted::kYes;
}

bool is_node_claimed(const char* node) {
  struct stat status;
  if (!is_block_device(node, &status)) return false;
  for (int look = 0; is_claimed_now(node); look++) {
    if (look == kClaimLooks) return true;
    usleep(kLookPause);
  }
  return false;
}

bool has_partition(const char* name) {
  const PathText disk("/sys/block/%s", name);
  const Directory directory(opendir(disk));
  if (!directory) return false;
  while (const dirent* entry = readdir(directory.get())) {
    if (strncmp(entry->d_name, name, strlen(name)) != 0) continue;
    if (access(PathText("%s/%s/%s", disk.c_str(), entry->d_name, "partition"), F_OK) == 0) return true;
  }
  return false;
}

NodeLeftAlone::NodeLeftAlone(const char* node) : udev_is_idle_(wait_for_udev(node)), looks_(node) {
  if (udev_is_idle_) (void)wait_for_udev(node);
}

}  // namespace remvol
