// Processes of the machine, as /proc shows them.
#ifndef PLATFORM_COMMON_PROCESSES_H
#define PLATFORM_COMMON_PROCESSES_H

#include <initializer_list>
#include <string>
#include <string_view>

namespace platform {

// True when a process runs the program of that name, not in a container but in this process's own PID
// namespace (pid_namespaces(7)), and one of its arguments is one of `options`, or the beginning of one (any
// when there are none). With a target, only when it names no other one behind "-n", or only when it names
// that one.
enum class Names { kNoOther, kThatOne };
bool runs(std::string_view program, std::initializer_list<std::string_view> options = {},
          std::string_view target = {}, Names names = Names::kNoOther);

// True when a process, or a loop device, has the disk, such as /dev/sdb, or a partition of it open by a name
// in /dev; also when none can be looked at. Processes that run one of the `programs` do not count.
bool has_open(const std::string& disk, std::initializer_list<std::string_view> programs = {});

}  // namespace platform

#endif
