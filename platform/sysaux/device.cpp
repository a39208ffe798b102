// Sizes of disks and partitions, and whether a node can be used at all.

#include <fcntl.h>
#include <sys/stat.h>

#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "common/fd.h"
#include "sysaux.h"
#include "sysaux/block.h"

namespace {

// cmake/options.cmake sees to it on 32-bit processors: disks are large, and the year 2038 is near.
static_assert(sizeof(off_t) == 8 && sizeof(time_t) == 8);

long long size_of(int block_dir) {
  long long sectors = 0;
  if (block_dir < 0 || !sysaux::read_number_at(block_dir, "size", &sectors)) return -1;
  return sectors * sysaux::kSectorBytes;
}

}  // namespace

extern "C" {

long long sys_get_disk_space(const char* format, ...) {
  char node[PATH_MAX];
  va_list arguments;
  va_start(arguments, format);
  const int length = vsnprintf(node, sizeof node, format, arguments);
  va_end(arguments);
  if (length < 0 || static_cast<size_t>(length) >= sizeof node) return -1;
  const platform::Fd block_dir(sysaux::open_block_dir(node));
  return size_of(block_dir.get());
}

long long sys_get_partition_size(const char* name) {
  char path[PATH_MAX];
  if (name == nullptr || name[0] == '\0' || name[0] == '.' || strchr(name, '/') != nullptr) return -1;
  const int length = snprintf(path, sizeof path, "/sys/class/block/%s", name);
  if (length < 0 || static_cast<size_t>(length) >= sizeof path) return -1;
  const platform::Fd block_dir(open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return size_of(block_dir.get());
}

int sys_check_dev(const char* node) {
  struct stat info;
  if (node == nullptr || stat(node, &info) != 0 || !S_ISBLK(info.st_mode)) return -1;
  const platform::Fd device(open(node, O_RDONLY | O_CLOEXEC));
  return device.ok() && sysaux::first_mebibyte_readable(device.get()) ? 0 : -1;
}

}  // extern "C"
