// A disk with any bytes at one place: what is recognised has a name that fits, and what looks empty has
// no partition in any table.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>

#include "require.h"
#include "sysaux/content.h"

using namespace sysaux;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  constexpr off_t kSize = 40 << 20;
  constexpr int kMax = 256;
  static const int disk = memfd_create("disk", MFD_CLOEXEC);
  if (size < 1 || size > 65536) return 0;
  const off_t length = static_cast<off_t>(size) - 1;
  const off_t places[] = {0,       512,        1024,     4096,      65536,          1 << 20,
                          2 << 20, 8193 << 10, 32 << 20, kSize / 4, kSize - length, kSize - 65536};
  const off_t at = places[data[0] % (sizeof places / sizeof places[0])];
  require(ftruncate(disk, 0) == 0 && ftruncate(disk, kSize) == 0);
  require(pwrite(disk, data + 1, static_cast<size_t>(length), at) == length);
  require(ftruncate(disk, kSize) == 0);
  char name[16];
  static Extent extents[kMax];
  const Content content = recognise(disk, name);
  require_ended(name);
  require((name[0] == '\0') == (content == Content::kNothing || content == Content::kUnreadable));
  const int count = read_table(disk, extents, kMax);
  require(count >= -1 && count <= kMax);
  if (content == Content::kNothing || content == Content::kEmptyTable) require(count <= 0);
  return 0;
}
