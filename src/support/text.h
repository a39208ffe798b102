// Bounded texts: formatting and copying that cannot overflow. Text that does not fit is cut.
#ifndef REMVOL_SUPPORT_TEXT_H
#define REMVOL_SUPPORT_TEXT_H

#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <cstring>

namespace remvol {

// A text of at most N - 1 bytes, made as printf would: Text<64> key("/iscsi/initiator/id:%d/target", n);
template <size_t N>
class Text {
 public:
  Text() { data_[0] = '\0'; }
  [[gnu::format(printf, 2, 3)]] explicit Text(const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(data_, N, format, arguments);
    va_end(arguments);
  }

  operator const char*() const { return data_; }
  const char* c_str() const { return data_; }
  char* data() { return data_; }
  static constexpr size_t size() { return N; }
  bool empty() const { return data_[0] == '\0'; }

 private:
  char data_[N];
};

using KeyText = Text<256>;       // a path in the configuration tree
using NumberText = Text<32>;     // a number in decimal
using PathText = Text<512>;      // a path in the file system
using CommandText = Text<4096>;  // a shell command

// Copies `source` into the array `target`, cut to its size, and clears the rest of it.
template <size_t N>
void copy_text(char (&target)[N], const char* source) {
  const size_t length = strnlen(source, N - 1);
  memmove(target, source, length);
  memset(target + length, 0, N - length);
}

}  // namespace remvol

#endif
