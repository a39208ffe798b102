// The reading of mke2fs's progress, on any text.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "volume/format_progress.h"

using namespace remvol;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FormatProgress progress{};
  if (size == 0) return 0;
  FILE* file = fmemopen(const_cast<uint8_t*>(data), size, "r");
  char line[kFormatReadSize];
  while (fgets(line, sizeof line, file) != nullptr) {
    const FormatProgress before = progress;
    // On the heap in its own size, so that the sanitizer sees a read beyond it.
    const std::string exact(line);
    const bool counted = update_format_progress(&progress, exact.c_str());
    if (!counted && progress.percent != before.percent) abort();
    if (before.groups_seen && !progress.groups_seen) abort();
    if (before.inodes_seen && !progress.inodes_seen) abort();
  }
  fclose(file);
  return 0;
}
