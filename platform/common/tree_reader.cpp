#include "tree_reader.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>

#include "ktreec.h"

namespace platform {
namespace {

constexpr char kSocket[] = "/var/run/ktree_sock_vv";
constexpr time_t kPatience = 2;  // seconds
constexpr size_t kPathSize = 128, kValueSize = 512;

time_t now() {
  timespec time{};
  clock_gettime(CLOCK_MONOTONIC, &time);
  return time.tv_sec;
}

}  // namespace

std::string TreeReader::read(const char* path) {
  if (hung_) return {};
  char text[kValueSize];
  const time_t start = now();
  const bool found = ktreec_get_wb(kSocket, 0, path, text, sizeof text) > 0;
  hung_ = now() - start > kPatience;
  return found ? text : std::string();
}

std::string TreeReader::value(const char* format, ...) {
  char path[kPathSize];
  va_list arguments;
  va_start(arguments, format);
  vsnprintf(path, sizeof path, format, arguments);
  va_end(arguments);
  return read(path);
}

int TreeReader::number(int fallback, const char* format, ...) {
  char path[kPathSize];
  va_list arguments;
  va_start(arguments, format);
  vsnprintf(path, sizeof path, format, arguments);
  va_end(arguments);
  const std::string text = read(path);
  return text.empty() ? fallback : atoi(text.c_str());
}

bool TreeReader::answered() const {
  sockaddr_un address{AF_UNIX, {}};
  snprintf(address.sun_path, sizeof address.sun_path, "%s", kSocket);
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) return false;
  const bool listens = connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  close(fd);
  return listens && !hung_;
}

}  // namespace platform
