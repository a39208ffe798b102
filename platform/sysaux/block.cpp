#include "sysaux/block.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/uio.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "common/fd.h"

namespace sysaux {

namespace {

// The sysfs path of the device that a node missing in /dev would be: /dev may be static, and the node be made
// once the disk is known. sysfs has an exclamation mark for a slash.
bool named_block_dir_path(const char* node, char* path, size_t size) {
  constexpr char kDev[] = "/dev/";
  constexpr char kClass[] = "/sys/class/block/";
  if (strncmp(node, kDev, strlen(kDev)) != 0 || node[strlen(kDev)] == '.') return false;
  const int length = snprintf(path, size, "%s%s", kClass, node + strlen(kDev));
  if (length < 0 || static_cast<size_t>(length) >= size) return false;
  for (char* slash = path + strlen(kClass); (slash = strchr(slash, '/')) != nullptr;) *slash = '!';
  return true;
}

// The sysfs path of the block device `node`; a link to the device's directory.
bool block_dir_path(const char* node, char* path, size_t size) {
  struct stat info;
  if (node == nullptr) return false;
  if (stat(node, &info) != 0) return errno == ENOENT && named_block_dir_path(node, path, size);
  if (!S_ISBLK(info.st_mode)) return false;
  snprintf(path, size, "/sys/dev/block/%u:%u", major(info.st_rdev), minor(info.st_rdev));
  return true;
}

}  // namespace

int open_block_dir(const char* node) {
  char path[64];
  if (!block_dir_path(node, path, sizeof path)) return -1;
  return open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

bool kernel_name(const char* node, char* name, size_t size) {
  char path[64];
  char target[PATH_MAX];
  if (!block_dir_path(node, path, sizeof path)) return false;
  const ssize_t length = readlink(path, target, sizeof target - 1);
  if (length <= 0) return false;
  target[length] = '\0';
  const char* slash = strrchr(target, '/');
  const char* last = slash != nullptr ? slash + 1 : target;
  if (strlen(last) >= size) return false;
  strcpy(name, last);
  return true;
}

bool read_line_at(int dir, const char* name, char* text, size_t size) {
  const platform::Fd file(openat(dir, name, O_RDONLY | O_CLOEXEC));
  if (!file.ok()) return false;
  const ssize_t length = read(file.get(), text, size - 1);
  if (length <= 0) return false;
  text[length] = '\0';
  text[strcspn(text, "\n")] = '\0';
  return true;
}

bool read_number_at(int dir, const char* name, long long* value) {
  char text[32];
  if (!read_line_at(dir, name, text, sizeof text)) return false;
  char* end = text;
  errno = 0;
  *value = strtoll(text, &end, 10);
  return errno == 0 && end != text && *end == '\0';
}

// One request to the disk, past the page cache; what comes is of no interest, so it all goes to one place.
bool first_mebibyte_readable(int fd) {
  constexpr size_t kPieces = 16;
  alignas(4096) char piece[kFirstMebibyte / kPieces];
  iovec pieces[kPieces];
  for (iovec& each : pieces) each = {piece, sizeof piece};
  const int flags = fcntl(fd, F_GETFL);
  if (flags < 0 || fcntl(fd, F_SETFL, flags | O_DIRECT) != 0) return false;
  const ssize_t got = preadv(fd, pieces, kPieces, 0);
  return fcntl(fd, F_SETFL, flags) == 0 && got == ssize_t{kFirstMebibyte};
}

}  // namespace sysaux
