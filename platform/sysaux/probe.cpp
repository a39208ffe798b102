// The module that recognises: file systems and partitions.

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>

#include "common/fd.h"
#include "sysaux/block.h"
#include "sysaux/content.h"
#include "sysaux/modules.h"
#include "sysaux/partitions.h"

using namespace sysaux;

namespace {

constexpr size_t kListSize = 1024;  // what the caller's buffer holds

// Joins names with commas; a name that does not fit any more is left out whole.
class NameList {
 public:
  explicit NameList(char* out) : out_(out) { out_[0] = '\0'; }
  void add(const char* name) {
    const size_t length = strlen(name);
    if (used_ + length + 2 > kListSize) return;
    if (used_ > 0) out_[used_++] = ',';
    memcpy(out_ + used_, name, length + 1);
    used_ += length;
  }

 private:
  char* out_;
  size_t used_ = 0;
};

// Names a partition as the kernel does: sda1, but loop0p1 and nvme0n1p1 after a digit.
void partition_name(const char* disk, int number, char* name, size_t size) {
  const size_t length = strlen(disk);
  const bool digit = length > 0 && disk[length - 1] >= '0' && disk[length - 1] <= '9';
  snprintf(name, size, "%s%s%d", disk, digit ? "p" : "", number);
}

// Lists the partitions of the table that the kernel has not read, and has the kernel make them. They count
// also when it refuses, because a disk with partitions must never pass for an empty one.
int list_unread_table(const char* device, int block_dir, NameList* names) {
  Extent extents[kMaxPartitions];
  Partition shown;
  char disk_name[32];
  char name[64];
  const platform::Fd disk(open(device, O_RDONLY | O_CLOEXEC));
  if (!disk.ok() && errno == ENOENT) return 0;  // without a node the kernel alone is asked
  if (!disk.ok() || !kernel_name(device, disk_name, sizeof disk_name)) return -1;
  const int count = read_table(disk.get(), extents, kMaxPartitions);
  for (int i = 0; i < count; i++) {
    partition_name(disk_name, extents[i].number, name, sizeof name);
    names->add(name);
    if (announce_partition(disk.get(), block_dir, extents[i], &shown)) {
      wait_for_node(block_dir, disk_name, shown.name);
    }
  }
  return count;
}

// Has the disk read in one go what the recognition then takes in some forty pieces, one round trip each.
// Where it looks is what libblkid 2.38 does (strace); a piece that is missing here is read when it is asked
// for.
void read_ahead(int device) {
  constexpr off_t kHead = 68 << 10;
  constexpr off_t kTail = 136 << 10;
  constexpr off_t kPage = 4096;
  constexpr off_t kFromStart[] = {128 << 10, 256 << 10, 512 << 10, 1 << 20, 2 << 20, 4 << 20};
  constexpr off_t kFromEnd[] = {204288, 302592, 345600, 376320, 466432, 486912, 498688, 507392, 1580544};
  const off_t end = lseek(device, 0, SEEK_END);
  posix_fadvise(device, 0, kHead, POSIX_FADV_WILLNEED);
  for (const off_t at : kFromStart) posix_fadvise(device, at, kPage, POSIX_FADV_WILLNEED);
  if (end <= kFromEnd[8]) return;
  for (const off_t at : kFromEnd) posix_fadvise(device, end - at, kPage, POSIX_FADV_WILLNEED);
  posix_fadvise(device, end - kTail, kTail, POSIX_FADV_WILLNEED);
}

}  // namespace

int sysaux_probe_fs_type(char* out, const char* node) {
  out[0] = '\0';
  const platform::Fd device(open(node, O_RDONLY | O_CLOEXEC));
  if (!device.ok()) return -1;
  read_ahead(device.get());
  const Content content = recognise(device.get(), out);
  if (content != Content::kNothing && content != Content::kUnreadable) return 0;
  if (!first_mebibyte_readable(device.get())) return -1;  // sys_check_dev does not accept it either
  if (content == Content::kNothing) return 1;
  // A read failed further on: the node must not look empty, because an empty one is formatted.
  strcpy(out, "unreadable");
  return 0;
}

int sysaux_probe_partition_list(char* out, const char* device) {
  DiskPartitions known;
  NameList names(out);
  const platform::Fd block_dir(open_block_dir(device));
  if (!block_dir.ok() || !read_partitions(block_dir.get(), &known)) return -1;
  if (known.count == 0) return list_unread_table(device, block_dir.get(), &names);
  for (int i = 0; i < known.count; i++) names.add(known.at[i].name);
  return known.count;
}
