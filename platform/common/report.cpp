#include "common/report.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace platform {

bool is_journal(int fd) {
  const int error = errno;
  sockaddr_un peer{};
  socklen_t size = sizeof peer - 1;
  const bool connected = getpeername(fd, reinterpret_cast<sockaddr*>(&peer), &size) == 0;
  errno = error;
  return connected && peer.sun_family == AF_UNIX && strcmp(peer.sun_path, "/run/systemd/journal/stdout") == 0;
}

// In one write, because several processes write lines there.
void report(int priority, const char* format, ...) {
  char line[8192];
  const int mark = is_journal(STDERR_FILENO) ? snprintf(line, sizeof line, "<%d>", priority) : 0;
  va_list arguments;
  va_start(arguments, format);
  vsnprintf(line + mark, sizeof line - static_cast<size_t>(mark), format, arguments);
  va_end(arguments);
  fprintf(stderr, "%s\n", line);
}

int print_asked_for(const char* text) {
  if (fputs(text, stdout) >= 0 && fflush(stdout) == 0) return 0;
  report(LOG_ERR, "%s: write error: %s", program_invocation_short_name, strerror(errno));
  return 1;
}

}  // namespace platform
