// Reading of the volumes' configuration tree for programs that only look.
#ifndef PLATFORM_COMMON_TREE_READER_H
#define PLATFORM_COMMON_TREE_READER_H

#include <string>

namespace platform {

inline constexpr int kTargets = 8, kLuns = 8;  // slots; those in use are the first ones

// A hung daemon costs time once: after the first read that shows it every value is empty.
class TreeReader {
 public:
  // The value at the path that printf(format, ...) would print; empty when there is none.
  std::string value(const char* format, ...) __attribute__((format(printf, 2, 3)));

  // The same as a number; `fallback` when there is none.
  int number(int fallback, const char* format, ...) __attribute__((format(printf, 3, 4)));

  // True when the daemon listens and answered all reads in time. To be asked after the reads: the client
  // library does not tell a missing value from a missing daemon.
  bool answered() const;

 private:
  std::string read(const char* path);

  bool hung_ = false;
};

}  // namespace platform

#endif
