#include "keeper/processes.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <string>

namespace keeper {
namespace {

std::string read_process_file(const char* process, const char* name) {
  char text[4096];
  const std::string path = std::string("/proc/") + process + "/" + name;
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return {};
  const ssize_t size = read(fd, text, sizeof text);
  close(fd);
  return {text, size > 0 ? static_cast<size_t>(size) : 0};
}

bool has_argument(std::string_view arguments, std::initializer_list<std::string_view> options) {
  while (!arguments.empty()) {
    const size_t end = std::min(arguments.find('\0'), arguments.size());
    if (std::find(options.begin(), options.end(), arguments.substr(0, end)) != options.end()) return true;
    arguments.remove_prefix(std::min(end + 1, arguments.size()));
  }
  return false;
}

// A process that has ended, and that nobody waited for yet, has no arguments.
bool is_it(const char* process, std::string_view program, std::initializer_list<std::string_view> options) {
  std::string name = read_process_file(process, "comm");
  if (!name.empty() && name.back() == '\n') name.pop_back();
  if (name != program) return false;
  const std::string arguments = read_process_file(process, "cmdline");
  return !arguments.empty() && (options.size() == 0 || has_argument(arguments, options));
}

}  // namespace

bool runs(std::string_view program, std::initializer_list<std::string_view> options) {
  DIR* folder = opendir("/proc");
  if (folder == nullptr) return false;
  bool found = false;
  while (const dirent* entry = found ? nullptr : readdir(folder)) {
    found = entry->d_name[0] >= '1' && entry->d_name[0] <= '9' && is_it(entry->d_name, program, options);
  }
  closedir(folder);
  return found;
}

}  // namespace keeper
