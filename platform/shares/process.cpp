#include "shares/process.h"

#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <cstdarg>
#include <cstdlib>
#include <string_view>

#include "common/lock_file.h"
#include "common/program.h"
#include "common/report.h"

namespace shares {
namespace {

constexpr int kPatience = 5000;  // milliseconds

void take_output(int sink, std::string& output) {
  char block[4096];
  off_t at = 0;
  output.clear();
  for (ssize_t size; (size = pread(sink, block, sizeof block, at)) > 0; at += size) {
    output.append(block, static_cast<size_t>(size));
  }
  if (sink >= 0) close(sink);
}

}  // namespace

void open_log(const char* program) {
  openlog(program, platform::is_journal(STDERR_FILENO) ? 0 : LOG_PERROR, LOG_DAEMON);
}

void log_line(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  vsyslog(priority, format, arguments);
  va_end(arguments);
}

bool take_turn(const char* lock_file) {
  const int fd = platform::open_lock_file(lock_file);
  return fd >= 0 && platform::take_lock(fd, LOCK_EX);
}

int run(const std::vector<std::string>& words, std::string* output) {
  const int sink = output != nullptr ? memfd_create("output", MFD_CLOEXEC) : -1;
  const std::vector<const char*> arguments = platform::arguments_of(words);
  const pid_t child =
      platform::start(arguments[0], arguments.data(), {platform::kNowhere, sink, platform::kNowhere});
  int status = -1;
  if (child > 0) {
    if (!platform::ends_within(child, kPatience)) kill(child, SIGKILL);
    status = platform::end_of(child);
  }
  if (output != nullptr) take_output(sink, *output);
  return platform::exit_status(status);
}

bool is_installed(const char* program) {
  const char* path = getenv("PATH");
  for (std::string_view rest = path != nullptr ? path : "/usr/sbin:/usr/bin:/sbin:/bin"; !rest.empty();) {
    const size_t end = rest.find(':');
    const std::string file = std::string(rest.substr(0, end)) + "/" + program;
    if (access(file.c_str(), X_OK) == 0) return true;
    rest.remove_prefix(end == std::string_view::npos ? rest.size() : end + 1);
  }
  return false;
}

}  // namespace shares
