// Measures reads of values beside each other: bench_get ROUNDS CALLS SOCKET PATH [SOCKET PATH]... In a round
// each value is read CALLS times. Prints one line for each round, the microseconds of one read of each value.
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <vector>

#include "ktreec.h"

namespace {

constexpr size_t kMostValue = 65536;

// Returns the microseconds of one read, below 0 when the value cannot be had.
double read_value(const char* socket, const char* path, int calls) {
  static char buffer[kMostValue];
  const auto start = std::chrono::steady_clock::now();
  for (int i = 0; i < calls; i++) {
    if (ktreec_get_wb(socket, 0, path, buffer, sizeof buffer) < 0) return -1;
  }
  const std::chrono::duration<double, std::micro> time = std::chrono::steady_clock::now() - start;
  return time.count() / calls;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 5 || argc % 2 == 0) {
    fputs("usage: bench_get ROUNDS CALLS SOCKET PATH [SOCKET PATH]...\n", stderr);
    return 2;
  }
  const int calls = atoi(argv[2]);
  for (int round = atoi(argv[1]); round > 0; round--) {
    for (int i = 3; i < argc; i += 2) {
      const double microseconds = read_value(argv[i], argv[i + 1], calls);
      if (microseconds < 0) {
        fprintf(stderr, "bench_get: %s: no value\n", argv[i + 1]);
        return 2;
      }
      printf("%.3f\t", microseconds);
    }
    puts("");
  }
  return 0;
}
