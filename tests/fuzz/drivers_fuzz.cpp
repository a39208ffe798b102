// The kernel's list of file systems, on any text: the stock kernel's driver is tried for a volume exactly
// when no line of it has the name of the other one, alone behind the first tab.
#include <cstdlib>
#include <sstream>
#include <string>

#include "frontend/log.h"
#include "require.h"
#include "volume/file_systems.h"
#include "volume/mount_command.h"
#include "wrapped_files.h"

using namespace remvol;

namespace {

int commands = 0;
std::string last_command;

// What stands behind a null character in a line is not looked at.
bool names_driver(const std::string& text) {
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    const std::string seen = line.c_str();
    const size_t tab = seen.find('\t');
    if (tab != std::string::npos && seen.substr(tab + 1) == "ufsd") return true;
  }
  return false;
}

}  // namespace

extern "C" {

int __wrap_system(const char* command) {
  commands++;
  last_command = command;
  return EXIT_FAILURE << 8;
}

int __wrap_usleep(unsigned) {
  return 0;
}

}  // extern "C"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  file_data = data;
  file_size = size;
  const FileSystem* ntfs = find_file_system("ntfs");
  commands = 0;
  run_mount(*ntfs, "/dev/sdb1", "/mnt/VV/a");
  const std::string text(reinterpret_cast<const char*>(data), size);
  const bool lacks = size != 0 && !names_driver(text);  // without a list nothing is known
  require(commands == (lacks ? 5 : 4));
  require((last_command.find("ntfs3") != std::string::npos) == lacks);
  return 0;
}
