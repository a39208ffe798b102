#include "frontend/log.h"

#include <cstdarg>
#include <cstdio>

namespace remvol {

int debug_level = 0;

void log_prefix(int level, const char* file, const char* function, int line) {
  if (debug_level >= level) printf("(%s:%s:%d): ", file, function, line);
  fflush(stdout);
}

void log_message(int level, const char* file, const char* function, int line, const char* format, ...) {
  log_prefix(level, file, function, line);
  if (debug_level >= level) {
    va_list arguments;
    va_start(arguments, format);
    vprintf(format, arguments);
    va_end(arguments);
    putchar('\n');
  }
  fflush(stdout);
}

}  // namespace remvol
