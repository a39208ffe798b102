// Buffered writing to a descriptor, for the documents that the daemon fills in memory files.
#ifndef PLATFORM_KTREE_OUTPUT_H
#define PLATFORM_KTREE_OUTPUT_H

#include <array>
#include <cstddef>
#include <string_view>

namespace ktree {

class Output {
 public:
  explicit Output(int fd) : fd_(fd) {}
  Output(const Output&) = delete;
  Output& operator=(const Output&) = delete;

  void put(char c) {
    if (used_ == buffer_.size()) flush();
    buffer_[used_++] = c;
  }
  void put(std::string_view text);

  // Writes what is still in the buffer. Returns false when anything could not be written since the start.
  [[nodiscard]] bool finish();

 private:
  void flush();

  int fd_;
  bool failed_ = false;
  size_t used_ = 0;
  std::array<char, 16384> buffer_;
};

}  // namespace ktree

#endif
