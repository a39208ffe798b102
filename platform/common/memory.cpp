#include "common/memory.h"

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <new>

#include "common/fd.h"

namespace platform {
namespace {

int exit_status = EXIT_FAILURE;

void say(const char* text) {
  (void)write_all(STDERR_FILENO, text, strlen(text));
}

}  // namespace

void end_when_memory_is_short(int status) {
  exit_status = status;
  std::set_new_handler(end_without_memory);
}

void end_without_memory() {
  say(program_invocation_short_name);
  say(": out of memory\n");
  exit(exit_status);
}

}  // namespace platform
