// A disk with any bytes at its start, end or both, as far as the writing of a table looks at it: what
// libfdisk finds partitions in is left alone to the last byte, on anything else the new table is read back as
// one partition.
#include <sys/mman.h>

#include <cstdint>
#include <cstdio>
#include <vector>

#include "../../platform/sysaux/disk_table.cpp"  // NOLINT(bugprone-suspicious-include): its own parts are called
#include "require.h"

namespace {

constexpr off_t kSize = 4 << 20;

// The parts that the input can reach.
std::vector<char> ends_of(int disk) {
  constexpr ssize_t kPart = 64 << 10;
  std::vector<char> ends(2 * kPart);
  require(pread(disk, ends.data(), kPart, 0) == kPart);
  require(pread(disk, ends.data() + kPart, kPart, kSize - kPart) == kPart);
  return ends;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const int disk = memfd_create("disk", MFD_CLOEXEC);
  if (size < 1 || size > 65536) return 0;
  char path[64];
  snprintf(path, sizeof path, "/proc/self/fd/%d", disk);
  const auto length = static_cast<off_t>(size - 1);
  require(ftruncate(disk, 0) == 0 && ftruncate(disk, kSize) == 0);
  if ((data[0] & 1) != 0) require(pwrite(disk, data + 1, size - 1, 0) == length);
  if ((data[0] & 2) != 0) require(pwrite(disk, data + 1, size - 1, kSize - length) == length);
  const std::vector<char> before = ends_of(disk);
  char name[16];
  const Content content = recognise(disk, name);
  Extent extent{};
  const bool written = write_new_table(path, &extent);
  if (!written) {
    require(ends_of(disk) == before);
    return 0;
  }
  if (content == Content::nothing || content == Content::empty_table) {
    Extent found[4];
    require(read_table(disk, found, 4) == 1);
    require(found[0].start == extent.start && found[0].size == extent.size && found[0].number == 1);
    require(extent.start > 0 && (extent.start + extent.size) * kSectorBytes <= kSize);
  }
  return 0;
}
