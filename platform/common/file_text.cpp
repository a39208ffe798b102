#include "common/file_text.h"

#include <unistd.h>

namespace platform {

std::string content_of(int file) {
  std::string text;
  char buffer[1 << 14];
  for (ssize_t n; (n = pread(file, buffer, sizeof buffer, static_cast<off_t>(text.size()))) > 0;) {
    text.append(buffer, static_cast<size_t>(n));
  }
  return text;
}

}  // namespace platform
