// What the kernel tells of processes, on any text: a command is running on a device only when a text holds
// the device.
#include <dirent.h>

#include <cstring>
#include <string>

#include "frontend/log.h"
#include "require.h"
#include "volume/process_check.h"
#include "wrapped_files.h"

using namespace remvol;

namespace {

bool listed = false;  // this run's text is the process list, not a process's files

}  // namespace

extern "C" {

DIR* __real_opendir(const char* path);

// The folder /proc of this run has few entries, all of them numbers. Other folders are the fuzzer's.
DIR* __wrap_opendir(const char* path) {
  if (strcmp(path, "/proc") != 0) return __real_opendir(path);
  return listed ? nullptr : __real_opendir("/proc/self/fdinfo");
}

FILE* __wrap_popen(const char*, const char*) {
  return listed ? __wrap_fopen("", "re") : nullptr;
}

int __wrap_pclose(FILE* file) {
  return fclose(file);
}

}  // extern "C"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  if (size < 2) return 0;
  listed = (data[0] & 1) != 0;
  file_data = data + 1;
  file_size = size - 1;
  // As it is read: what follows a NUL counts in a process's own files only, where it is a blank.
  std::string text(reinterpret_cast<const char*>(file_data), file_size);
  if (is_command_running_on("mke2fs", "/dev/sdb1")) require(text.find("/dev/sdb1") != std::string::npos);
  // Both files of a process hold this text, so the name and the device cannot both be the whole of it.
  if (!listed) require(!is_command_running_on("mke2fs", "/dev/sdb1"));
  return 0;
}
