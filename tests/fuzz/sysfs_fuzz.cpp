// Files of sysfs, on any text: numbers are numbers from end to end, and lines end.
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <string>

#include "frontend/log.h"
#include "require.h"
#include "sysaux/block.h"
#include "volume/device.h"
#include "wrapped_files.h"

using namespace remvol;

extern "C" int __wrap_access(const char*, int) {
  return 0;
}

namespace {

void check_platform(const uint8_t* data, size_t size) {
  static const int file = memfd_create("file", MFD_CLOEXEC);
  static const int folder = open("/proc/self/fd", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const std::string name = std::to_string(file);
  require(ftruncate(file, 0) == 0 && pwrite(file, data, size, 0) == static_cast<ssize_t>(size));
  char line[16];
  if (sysaux::read_line_at(folder, name.c_str(), line, sizeof line)) {
    require_ended(line);
    require(strchr(line, '\n') == nullptr);
  }
  long long value = 0;
  if (!sysaux::read_number_at(folder, name.c_str(), &value)) return;
  const std::string text(reinterpret_cast<const char*>(data), size);
  require(text.find_first_of("0123456789") != std::string::npos);
  require(text.compare(0, 1, "0") == 0 || text.compare(0, 1, "-") != 0 || value <= 0);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  check_platform(data, size);
  file_data = data;
  file_size = size;
  DeviceId id{};
  if (_get_dev_id(&id, "sdb1") != 0) return 0;
  require(strcmp(id.name, "sdb1") == 0);
  // A colon in the first line, which is cut after 127 characters.
  const std::string text(reinterpret_cast<const char*>(data), size < 127 ? size : 127);
  require(text.substr(0, text.find('\n')).find(':') != std::string::npos);
  return 0;
}
