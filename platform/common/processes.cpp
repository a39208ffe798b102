#include "common/processes.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <string>

namespace platform {
namespace {

constexpr char kDisks[] = "/sys/class/block/";

std::string read_file(const std::string& path) {
  char text[4096];
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return {};
  const ssize_t size = read(fd, text, sizeof text);
  close(fd);
  return {text, size > 0 ? static_cast<size_t>(size) : 0};
}

std::string read_process_file(const char* process, const char* name) {
  return read_file(std::string("/proc/") + process + "/" + name);
}

// Takes the first of the arguments, each of which ends with a null character.
std::string_view take_argument(std::string_view& arguments) {
  const size_t end = std::min(arguments.find('\0'), arguments.size());
  const std::string_view argument = arguments.substr(0, end);
  arguments.remove_prefix(std::min(end + 1, arguments.size()));
  return argument;
}

// An option may be given by its beginning, see getopt_long(3).
bool has_argument(std::string_view arguments, std::initializer_list<std::string_view> options) {
  while (!arguments.empty()) {
    const std::string_view argument = take_argument(arguments);
    const bool may_begin_one = argument.starts_with("--") && argument != "--";
    for (const std::string_view option : options) {
      if (option == argument || (may_begin_one && option.starts_with(argument))) return true;
    }
  }
  return false;
}

// Without a name behind "-n", a command is for every target.
bool is_for(std::string_view arguments, std::string_view target, Names names) {
  while (!arguments.empty()) {
    if (take_argument(arguments) == "-n") return take_argument(arguments) == target;
  }
  return names == Names::kNoOther;
}

// Cut after 15 characters.
std::string name_of(const char* process) {
  std::string name = read_process_file(process, "comm");
  if (!name.empty() && name.back() == '\n') name.pop_back();
  return name;
}

// Whether the process has a number of its own in a namespace further inside, see proc_pid_status(5).
bool is_in_container(const char* process) {
  constexpr std::string_view kNumbers = "\nNSpid:\t";
  const std::string status = read_process_file(process, "status");
  const size_t begin = status.find(kNumbers);
  if (begin == std::string::npos) return false;
  const size_t end = status.find_first_not_of("0123456789", begin + kNumbers.size());
  return end != std::string::npos && status[end] == '\t';
}

// A process that has ended, and that nobody waited for yet, has no arguments.
bool is_it(const char* process, std::string_view program, std::initializer_list<std::string_view> options,
           std::string_view target, Names names) {
  if (name_of(process) != program) return false;
  const std::string arguments = read_process_file(process, "cmdline");
  return !arguments.empty() && !is_in_container(process) &&
         (options.size() == 0 || has_argument(arguments, options)) &&
         (target.empty() || is_for(arguments, target, names));
}

// The name of a process's folder in /proc.
bool is_number(const char* name) {
  return name[0] >= '1' && name[0] <= '9';
}

// Whether the path is that of the disk or of a partition of it.
bool is_on_disk(std::string_view path, std::string_view disk) {
  return path.starts_with(disk) &&
         path.find_first_not_of("p0123456789", disk.size()) == std::string_view::npos;
}

// Whether one of the descriptors in `folder`, such as /proc/1/fd, leads to the disk.
bool leads_to(const std::string& folder, const std::string& disk) {
  bool found = false;
  DIR* descriptors = opendir(folder.c_str());
  if (descriptors == nullptr) return false;
  while (const dirent* entry = found ? nullptr : readdir(descriptors)) {
    char path[64];
    const ssize_t size = readlinkat(dirfd(descriptors), entry->d_name, path, sizeof path);
    found = is_on_disk({path, size > 0 ? static_cast<size_t>(size) : 0}, disk);
  }
  closedir(descriptors);
  return found;
}

// The kernel itself has open what a loop device shows.
bool is_below_loop(const std::string& disk) {
  bool found = false;
  DIR* disks = opendir(kDisks);
  while (const dirent* entry = disks == nullptr || found ? nullptr : readdir(disks)) {
    std::string file = read_file(std::string(kDisks) + entry->d_name + "/loop/backing_file");
    if (!file.empty()) file.pop_back();
    found = is_on_disk(file, disk);
  }
  if (disks != nullptr) closedir(disks);
  return found;
}

}  // namespace

bool runs(std::string_view program, std::initializer_list<std::string_view> options, std::string_view target,
          Names names) {
  DIR* folder = opendir("/proc");
  if (folder == nullptr) return false;
  bool found = false;
  while (const dirent* entry = found ? nullptr : readdir(folder)) {
    found = is_number(entry->d_name) && is_it(entry->d_name, program, options, target, names);
  }
  closedir(folder);
  return found;
}

bool has_open(const std::string& disk, std::initializer_list<std::string_view> programs) {
  DIR* folder = opendir("/proc");
  if (folder == nullptr) return true;
  bool found = is_below_loop(disk);
  while (const dirent* entry = found ? nullptr : readdir(folder)) {
    found = is_number(entry->d_name) && leads_to("/proc/" + std::string(entry->d_name) + "/fd", disk) &&
            std::find(programs.begin(), programs.end(), name_of(entry->d_name)) == programs.end();
  }
  closedir(folder);
  return found;
}

}  // namespace platform
