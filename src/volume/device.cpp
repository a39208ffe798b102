#include "volume/device.h"

#include <dirent.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frontend/log.h"
#include "support/files.h"
#include "support/text.h"

namespace remvol {

namespace {

constexpr const char* kBlockDir = "/sys/block";
constexpr char kNodeDir[] = "/dev";
constexpr mode_t kNodeMode = S_IFBLK | 0666;

// Returns where sysfs describes the device: a partition below its disk. Logs the disk of a partition.
PathText sysfs_dir(const char* name) {
  char parent[256];
  if (!get_parent_disk(parent, name)) return PathText("%s/%s", kBlockDir, name);
  LOG(2, "get parent dev = %s", parent);
  return PathText("%s/%s/%s", kBlockDir, parent, name);
}

bool parse_number(const char* text, unsigned* number) {
  errno = 0;
  *number = static_cast<unsigned>(strtoll(text, nullptr, 10));  // a long may be too short
  if (errno == 0) return true;
  const int error = errno;
  LOG(0, "strtol failed, error = %d (%s)", error, strerror(error));
  return false;
}

// Makes the node unless it is a block device already, whatever its numbers.
void make_node(const char* name, const DeviceId& id) {
  const PathText node("%s/%s", kNodeDir, name);
  struct stat status;
  if (stat(node, &status) == 0) {
    if (S_ISBLK(status.st_mode)) return;
    (void)_remove_file(node);
  }
  errno = 0;
  if (mknod(node, kNodeMode, makedev(id.major, id.minor)) == 0 && errno == 0) return;
  const int error = errno;
  LOG(0, "mknod failed with errno = %d (%s)", error, strerror(error));
}

// Makes the nodes of the disk's partitions. Whether an entry is a directory is asked by its bare name, which
// the working directory seldom has, and an answer that fails leaves the one before in force: in the usual
// case the partitions' nodes are left to the kernel.
void make_partition_nodes(const char* disk, const char* directory_path) {
  const Directory directory(opendir(directory_path));
  if (!directory) {
    LOG(0, "can not open directory : %s", directory_path);
    return;
  }
  struct stat status {};
  while (const dirent* entry = readdir(directory.get())) {
    const char* name = entry->d_name;
    if (strncmp(name, disk, strlen(disk)) != 0 || strcmp(name, disk) == 0) continue;
    lstat(name, &status);
    if (!S_ISDIR(status.st_mode)) continue;
    LOG(2, "create sub node : %s", name);
    if (_create_device_node(name) != kOk) LOG(2, "fail to make device node : %s", name);
  }
}

}  // namespace

bool get_parent_disk(char (&parent)[256], const char* name) {
  parent[0] = '\0';
  if (strlen(name) < 2) return false;
  const char* digit = strpbrk(name + 2, "0123456789");
  if (digit == nullptr) return false;
  snprintf(parent, sizeof parent, "%.*s", static_cast<int>(digit - name), name);
  return true;
}

Text<256> disk_of_node(const char* node) {
  const char* slash = strrchr(node, '/');
  const char* name = slash != nullptr ? slash + 1 : node;
  char parent[256];
  return Text<256>("%s", get_parent_disk(parent, name) ? parent : name);
}

Result _get_dev_id(DeviceId* id, const char* name) {
  const LogScope scope;
  if (name == nullptr || name[0] == '\0') return kFailed;
  const PathText path("%s/dev", sysfs_dir(name).c_str());
  if (check_path_exist(path) != 0) return kFailed;
  const File file(fopen(path, "re"));
  char line[128];
  if (!file || fgets(line, sizeof line, file.get()) == nullptr) return kFailed;
  char* colon = strchr(line, ':');
  if (colon == nullptr) return kFailed;
  *colon = '\0';
  if (!parse_number(line, &id->major) || !parse_number(colon + 1, &id->minor)) return kFailed;
  copy_text(id->name, name);
  return kOk;
}

Result _create_device_node(const char* name) {
  const LogScope scope;
  if (name == nullptr) {
    LOG(0, "dev_ostel_n is null");
    return kFailed;
  }
  if (name[0] == '\0') {
    LOG(0, "dev_ostel_n is empty");
    return kFailed;
  }
  LOG(2, "creating dev node : %s", name);
  const PathText directory = sysfs_dir(name);
  if (check_path_exist(directory) != 0) {
    LOG(0, "path %s is not existing", directory.c_str());
    return kFailed;
  }
  DeviceId id{};
  if (_get_dev_id(&id, name) != kOk) {
    LOG(0, "fail to get device id for %s", name);
    return kFailed;
  }
  make_node(name, id);
  char parent[256];
  if (!get_parent_disk(parent, name)) make_partition_nodes(name, directory);
  return kOk;
}

}  // namespace remvol
