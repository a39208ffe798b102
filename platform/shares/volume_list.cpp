#include "volume_list.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>

#include "ktreec.h"

namespace shares {
namespace {

constexpr char kSocket[] = "/var/run/ktree_sock_vv";
constexpr char kMountRoot[] = "/mnt/VV/";
constexpr int kTargets = 8, kLuns = 8;
constexpr time_t kPatience = 2;  // seconds; a daemon that is slower is hung

// Reads the tree; the first read that shows a hung daemon is the last one.
class Reader {
 public:
  // The value at the path that printf(format, ...) would print; empty when there is none.
  std::string value(const char* format, ...) __attribute__((format(printf, 2, 3)));

  bool hung() const { return hung_; }

 private:
  bool hung_ = false;
};

time_t now() {
  timespec time{};
  clock_gettime(CLOCK_MONOTONIC, &time);
  return time.tv_sec;
}

std::string Reader::value(const char* format, ...) {
  char path[128], text[256];
  va_list arguments;
  va_start(arguments, format);
  vsnprintf(path, sizeof path, format, arguments);
  va_end(arguments);
  if (hung_) return {};
  const time_t start = now();
  const bool found = ktreec_get_wb(kSocket, 0, path, text, sizeof text) > 0;
  hung_ = now() - start > kPatience;
  return found ? text : std::string();
}

// The client library does not tell a missing value from a missing daemon.
bool tree_listens() {
  sockaddr_un address{AF_UNIX, {}};
  snprintf(address.sun_path, sizeof address.sun_path, "%s", kSocket);
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) return false;
  const bool listens = connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  close(fd);
  return listens;
}

bool keeps_user_attributes(const std::string& file_system) {
  return file_system != "vfat";
}

void read_volume(Reader& tree, int target, int lun, std::vector<Volume>& volumes) {
  const std::string name = tree.value("/iscsi/initiator/id:%d/lun/id:%d/share", target, lun);
  const std::string path = kMountRoot + name;
  if (name.empty() || !is_mounted(path)) return;
  const std::string right = tree.value("/iscsi/initiator/id:%d/lun/id:%d/vol_access_right", target, lun);
  const std::string type = tree.value("/iscsi/initiator/id:%d/lun/id:%d/fs_type", target, lun);
  volumes.push_back({name, path, !right.empty() && atoi(right.c_str()) == 0, keeps_user_attributes(type)});
}

}  // namespace

bool is_mounted(const std::string& path) {
  struct statx entry {};
  return statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, STATX_TYPE, &entry) == 0 &&
         (entry.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

bool read_mounted_volumes(std::vector<Volume>& volumes) {
  if (!tree_listens()) return false;
  Reader tree;
  for (int target = 1; target <= kTargets; ++target) {
    if (tree.value("/iscsi/initiator/id:%d/target", target).empty()) break;
    for (int lun = 1; lun <= kLuns; ++lun) {
      if (tree.value("/iscsi/initiator/id:%d/lun/id:%d/lun", target, lun).empty()) break;
      read_volume(tree, target, lun, volumes);
    }
  }
  // A daemon that ended on the way looks like a tree with fewer volumes.
  return !tree.hung() && tree_listens();
}

}  // namespace shares
