// A disk with any bytes at its start, end or both, as far as the writing of a table looks at it: what
// libfdisk finds partitions in is left alone to the last byte, on anything else the new table is read back as
// one partition.
#include <sys/mman.h>

#include <cstdint>
#include <cstdio>
#include <cstring>

#include "require.h"
#include "sysaux/disk_table.cpp"  // NOLINT(bugprone-suspicious-include): its own parts are called

namespace {

constexpr size_t kSize = 4 << 20;
constexpr size_t kPart = 32 << 10;  // what the input and a new table can reach at either end

// The disk, and the same bytes as memory: most of an execution's time goes into system calls.
struct Disk {
  Disk() : fd(memfd_create("disk", MFD_CLOEXEC)) {
    require(ftruncate(fd, kSize) == 0);
    void* map = mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    require(map != MAP_FAILED);
    bytes = static_cast<uint8_t*>(map);
    snprintf(path, sizeof path, "/proc/self/fd/%d", fd);
  }
  uint8_t* end() const { return bytes + kSize - kPart; }

  int fd;
  uint8_t* bytes;
  char path[32];
};

// Puts the input to the start, to the end or to both, as its first byte says.
void fill(const Disk& disk, const uint8_t* data, size_t size) {
  memset(disk.bytes, 0, kPart);
  memset(disk.end(), 0, kPart);
  if ((data[0] & 1) != 0) memcpy(disk.bytes, data + 1, size - 1);
  if ((data[0] & 2) != 0) memcpy(disk.bytes + kSize - (size - 1), data + 1, size - 1);
}

}  // namespace

// libfdisk 2.38 loses 512 bytes for each of several extended partitions whose tables cannot be read; fdisk(8)
// shows the same. What is ours to free is looked after where the library's calls are tested on real disks.
extern "C" const char* __lsan_default_suppressions() {
  return "leak:libfdisk.so";
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const Disk disk;
  static uint8_t start_before[kPart];
  static uint8_t end_before[kPart];
  if (size < 1 || size > kPart) return 0;
  fill(disk, data, size);
  memcpy(start_before, disk.bytes, kPart);
  memcpy(end_before, disk.end(), kPart);
  char name[16];
  const Content content = recognise(disk.fd, name);
  Extent extent{};
  if (!write_new_table(disk.path, &extent)) {
    require(memcmp(start_before, disk.bytes, kPart) == 0 && memcmp(end_before, disk.end(), kPart) == 0);
  } else if (content == Content::kNothing || content == Content::kEmptyTable) {
    Extent found[4];
    require(read_table(disk.fd, found, 4) == 1);
    require(found[0].start == extent.start && found[0].size == extent.size && found[0].number == 1);
    require(extent.start > 0 && extent.start + extent.size <= static_cast<long long>(kSize) / kSectorBytes);
  }
  return 0;
}
