#include "common/processes.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <string>

namespace platform {
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

// Takes the first of the arguments, each of which ends with a null character.
std::string_view take_argument(std::string_view& arguments) {
  const size_t end = std::min(arguments.find('\0'), arguments.size());
  const std::string_view argument = arguments.substr(0, end);
  arguments.remove_prefix(std::min(end + 1, arguments.size()));
  return argument;
}

bool has_argument(std::string_view arguments, std::initializer_list<std::string_view> options) {
  while (!arguments.empty()) {
    if (std::find(options.begin(), options.end(), take_argument(arguments)) != options.end()) return true;
  }
  return false;
}

// Without a name behind "-n", a command is for every target.
bool is_for(std::string_view arguments, std::string_view target) {
  while (!arguments.empty()) {
    if (take_argument(arguments) == "-n") return take_argument(arguments) == target;
  }
  return true;
}

// A process that has ended, and that nobody waited for yet, has no arguments.
bool is_it(const char* process, std::string_view program, std::initializer_list<std::string_view> options,
           std::string_view target) {
  std::string name = read_process_file(process, "comm");
  if (!name.empty() && name.back() == '\n') name.pop_back();
  if (name != program) return false;
  const std::string arguments = read_process_file(process, "cmdline");
  return !arguments.empty() && (options.size() == 0 || has_argument(arguments, options)) &&
         (target.empty() || is_for(arguments, target));
}

}  // namespace

bool runs(std::string_view program, std::initializer_list<std::string_view> options,
          std::string_view target) {
  DIR* folder = opendir("/proc");
  if (folder == nullptr) return false;
  bool found = false;
  while (const dirent* entry = found ? nullptr : readdir(folder)) {
    found =
        entry->d_name[0] >= '1' && entry->d_name[0] <= '9' && is_it(entry->d_name, program, options, target);
  }
  closedir(folder);
  return found;
}

}  // namespace platform
