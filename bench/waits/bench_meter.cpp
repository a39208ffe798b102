// Runs a command and appends to a file where its time goes: bench_meter FILE NAME COMMAND [ARGUMENT...]. In
// front of what meter.cpp (bench_meter.so, beside this program) writes of the command is a line
//   run NAME
// and after it, what the clock said in nanoseconds before the start and after the end:
//   around BEGIN END STATUS
// Exit status: the command's.
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <climits>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <string>

namespace {

constexpr int kCannot = 126;

std::string meter_path() {
  char self[PATH_MAX];
  const ssize_t length = readlink("/proc/self/exe", self, sizeof self);
  return std::string(self, length > 0 ? static_cast<size_t>(length) : 0) + ".so";
}

long long now() {
  timespec moment;
  clock_gettime(CLOCK_MONOTONIC, &moment);
  return static_cast<long long>(moment.tv_sec) * 1'000'000'000 + moment.tv_nsec;
}

bool append(const char* path, const std::string& line) {
  FILE* file = fopen(path, "ae");
  if (file == nullptr) return false;
  const bool written = fputs(line.c_str(), file) >= 0;
  return fclose(file) == 0 && written;
}

// Returns the command's exit status, or -1 when it was not started or was killed.
int run(char** command) {
  pid_t child = 0;
  int status = 0;
  if (posix_spawnp(&child, command[0], nullptr, nullptr, command, environ) != 0) return -1;
  if (waitpid(child, &status, 0) != child || !WIFEXITED(status)) return -1;
  return WEXITSTATUS(status);
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 4) {
    fputs("usage: bench_meter FILE NAME COMMAND [ARGUMENT...]\n", stderr);
    return kCannot;
  }
  if (!append(argv[1], "run " + std::string(argv[2]) + "\n")) {
    perror(argv[1]);
    return kCannot;
  }
  setenv("BENCH_METER", argv[1], 1);
  setenv("LD_PRELOAD", meter_path().c_str(), 1);
  const long long begin = now();
  const int status = run(argv + 3);
  const long long end = now();
  const std::string moments = std::to_string(begin) + " " + std::to_string(end);
  if (!append(argv[1], "around " + moments + " " + std::to_string(status) + "\n")) return kCannot;
  return status < 0 ? kCannot : status;
}
