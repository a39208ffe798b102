// The reading of a mount table, on any text: the answer is one of those promised, for a disk as for its
// partition.
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>

#include "frontend/log.h"
#include "volume/degrade.h"

using namespace remvol;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const int table = memfd_create("table", 0);
  char path[64];
  debug_level = -1;
  snprintf(path, sizeof path, "/proc/self/fd/%d", table);
  if (ftruncate(table, 0) != 0 || pwrite(table, data, size, 0) != static_cast<ssize_t>(size)) return 0;
  const char* const devices[] = {"/dev/sdb", "/dev/sdb1", "b"};
  for (const char* device : devices) {
    const int right = get_mnt_ac_right_from_mnt_file(device, path);
    if (right < kNotMounted || right > kMountedUnclear) abort();
  }
  return 0;
}
