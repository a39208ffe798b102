#include "sysaux/partitions.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/blkpg.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "common/fd.h"
#include "sysaux/block.h"

namespace sysaux {

namespace {

bool read_partition(int block_dir, const char* name, Partition* partition) {
  long long number = 0;
  Extent& extent = partition->extent;
  if (strlen(name) >= sizeof partition->name) return false;
  const platform::Fd dir(openat(block_dir, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!dir.ok() || !read_number_at(dir.get(), "partition", &number)) return false;
  if (!read_number_at(dir.get(), "start", &extent.start) ||
      !read_number_at(dir.get(), "size", &extent.size)) {
    return false;
  }
  extent.number = static_cast<int>(number);
  strcpy(partition->name, name);
  return true;
}

int by_number(const void* left, const void* right) {
  return static_cast<const Partition*>(left)->extent.number -
         static_cast<const Partition*>(right)->extent.number;
}

const Partition* find_partition(const DiskPartitions& list, int number) {
  for (int i = 0; i < list.count; i++) {
    if (list.at[i].extent.number == number) return &list.at[i];
  }
  return nullptr;
}

void tell_kernel(int disk, int operation, const Extent& extent) {
  blkpg_partition partition{};
  partition.pno = extent.number;
  partition.start = extent.start * kSectorBytes;
  partition.length = extent.size * kSectorBytes;
  blkpg_ioctl_arg argument{};
  argument.op = operation;
  argument.datalen = sizeof partition;
  argument.data = &partition;
  ioctl(disk, BLKPG, &argument);  // the answer is what sysfs shows then
}

bool same(const Extent& left, const Extent& right) {
  return left.number == right.number && left.start == right.start && left.size == right.size;
}

// The node /dev/NAME and the device whose number stands in the sysfs file `dev_file` are the same.
bool node_is_there(int block_dir, const char* dev_file, const char* name) {
  char number[32];
  char node[64];
  unsigned numbers[2];
  struct stat info;
  if (!read_line_at(block_dir, dev_file, number, sizeof number)) return false;
  if (sscanf(number, "%u:%u", &numbers[0], &numbers[1]) != 2) return false;
  snprintf(node, sizeof node, "/dev/%s", name);
  return stat(node, &info) == 0 && S_ISBLK(info.st_mode) && info.st_rdev == makedev(numbers[0], numbers[1]);
}

}  // namespace

bool read_partitions(int block_dir, DiskPartitions* list) {
  list->count = 0;
  // A directory of its own, because reading it moves its offset.
  platform::Fd own(openat(block_dir, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  DIR* entries = own.ok() ? fdopendir(own.get()) : nullptr;
  if (entries == nullptr) return false;
  own.release();
  while (const dirent* entry = readdir(entries)) {
    if (entry->d_type != DT_DIR || entry->d_name[0] == '.' || list->count == kMaxPartitions) continue;
    if (read_partition(block_dir, entry->d_name, &list->at[list->count])) list->count++;
  }
  closedir(entries);
  qsort(list->at, static_cast<size_t>(list->count), sizeof list->at[0], by_number);
  return true;
}

bool announce_partition(int disk, int block_dir, const Extent& extent, Partition* shown) {
  DiskPartitions list;
  if (!read_partitions(block_dir, &list)) return false;
  const Partition* known = find_partition(list, extent.number);
  if (known == nullptr) {
    tell_kernel(disk, BLKPG_ADD_PARTITION, extent);
  } else if (known->extent.start == extent.start && known->extent.size != extent.size) {
    tell_kernel(disk, BLKPG_RESIZE_PARTITION, extent);
  }
  if (!read_partitions(block_dir, &list)) return false;
  known = find_partition(list, extent.number);
  if (known == nullptr || !same(known->extent, extent)) return false;
  *shown = *known;
  return true;
}

bool wait_for_node(int block_dir, const char* disk, const char* partition) {
  constexpr int kTries = 500;
  constexpr timespec kPause{0, 10'000'000};
  char dev_file[64];
  snprintf(dev_file, sizeof dev_file, "%s/dev", partition);
  for (int i = 0; i < kTries; i++) {
    if (node_is_there(block_dir, dev_file, partition)) return true;
    if (!node_is_there(block_dir, "dev", disk)) return false;
    nanosleep(&kPause, nullptr);
  }
  return false;
}

}  // namespace sysaux
