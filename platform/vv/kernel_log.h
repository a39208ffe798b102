// What the kernel has said of a disk while something was done to it.
#ifndef PLATFORM_VV_KERNEL_LOG_H
#define PLATFORM_VV_KERNEL_LOG_H

#include <string>
#include <string_view>
#include <vector>

namespace vv {

// The text of a record of /dev/kmsg, such as "sd 2:0:0:1: [sdb] Write Protect is on"; empty when it is none.
std::string message_of(std::string_view record);

// True when a message tells of the disk or one of its partitions.
bool tells_of(std::string_view message, std::string_view disk);

// The messages of a span of time.
class KernelLog {
 public:
  KernelLog();  // it begins now
  ~KernelLog();
  KernelLog(const KernelLog&) = delete;
  KernelLog& operator=(const KernelLog&) = delete;

  // The last ones that tell of the disk, at most three; none when the log cannot be read.
  std::vector<std::string> messages_of(const std::string& disk);

 private:
  int file_;
};

}  // namespace vv

#endif
