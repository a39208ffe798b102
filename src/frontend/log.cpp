#include "frontend/log.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace remvol {

namespace {

constexpr char kJournal[] = "/run/systemd/journal/stdout";

bool is_journal(int fd) {
  const int error = errno;  // of what is to be told
  sockaddr_un peer{};
  socklen_t size = sizeof peer - 1;  // its path ends in a NUL in any case
  const bool connected = getpeername(fd, reinterpret_cast<sockaddr*>(&peer), &size) == 0;
  errno = error;
  return connected && peer.sun_family == AF_UNIX && strcmp(peer.sun_path, kJournal) == 0;
}

// The journal takes a priority at the beginning of each line, of a message of several lines as well.
void print_lines(Weight weight, const char* text, size_t size) {
  while (const void* end = memchr(text, '\n', size)) {
    const size_t line = static_cast<size_t>(static_cast<const char*>(end) - text) + 1;
    fwrite(text, 1, line, stdout);
    begin_line(weight);
    text += line;
    size -= line;
  }
  fwrite(text, 1, size, stdout);
}

// A CHAP secret stands behind this in the command that stores it.
constexpr char kSecretSetting[] = "node.session.auth.password -v \"";

// Returns the quote that ends an escaped text, or its end.
const char* end_of_quoted(const char* text) {
  while (*text != '\0' && *text != '"') text += text[0] == '\\' && text[1] != '\0' ? 2 : 1;
  return text;
}

// Here rather than where commands are run: no message of any module can show a secret.
void print_without_secrets(Weight weight, const char* text) {
  while (const char* setting = strstr(text, kSecretSetting)) {
    const char* const secret = setting + strlen(kSecretSetting);
    print_lines(weight, text, static_cast<size_t>(secret - text));
    fputs(kMaskedSecret, stdout);
    text = end_of_quoted(secret);
  }
  print_lines(weight, text, strlen(text));
}

}  // namespace

int debug_level = 0;

const LogScope* LogScope::innermost_ = nullptr;

LogScope::LogScope(const char* function) : function_(function), outer_(innermost_) {
  innermost_ = this;
}

LogScope::~LogScope() {
  innermost_ = outer_;
}

void begin_line(Weight weight, FILE* stream) {
  if (is_journal(fileno(stream))) fprintf(stream, "<%d>", weight.priority);
}

void print_open(Weight weight, const char* format, ...) {
  begin_line(weight);
  va_list arguments;
  va_start(arguments, format);
  vprintf(format, arguments);
  va_end(arguments);
  if (is_journal(STDOUT_FILENO)) putchar('\n');
}

void log_prefix(Weight weight, const char* file, int line) {
  if (debug_level >= weight.level) {
    begin_line(weight);
    printf("(%s:%s:%d): ", file, LogScope::function(), line);
  }
  fflush(stdout);
}

void log_message(Weight weight, const char* file, int line, const char* format, ...) {
  log_prefix(weight, file, line);
  if (debug_level >= weight.level) {
    char* text = nullptr;
    va_list arguments;
    va_start(arguments, format);
    if (vasprintf(&text, format, arguments) < 0) text = nullptr;
    va_end(arguments);
    print_without_secrets(weight, text != nullptr ? text : format);
    free(text);
    putchar('\n');
  }
  fflush(stdout);
}

}  // namespace remvol
