#include "common/start.h"

#include <spawn.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

namespace platform {

pid_t start(const char* file, const char* const* argv) {
  posix_spawnattr_t attributes;
  sigset_t none;
  sigemptyset(&none);
  posix_spawnattr_init(&attributes);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setpgroup(&attributes, 0);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETPGROUP);
  pid_t process = -1;
  const int error =
      posix_spawnp(&process, file, nullptr, &attributes, const_cast<char* const*>(argv), environ);
  posix_spawnattr_destroy(&attributes);
  errno = error;
  return error != 0 ? -1 : process;
}

}  // namespace platform
