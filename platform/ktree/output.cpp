#include "ktree/output.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace ktree {

void Output::put(std::string_view text) {
  while (!text.empty()) {
    if (used_ == buffer_.size()) flush();
    size_t part = std::min(text.size(), buffer_.size() - used_);
    memcpy(buffer_.data() + used_, text.data(), part);
    used_ += part;
    text.remove_prefix(part);
  }
}

bool Output::finish() {
  flush();
  return !failed_;
}

void Output::flush() {
  size_t done = 0;
  while (done < used_ && !failed_) {
    ssize_t n = write(fd_, buffer_.data() + done, used_ - done);
    if (n > 0) {
      done += static_cast<size_t>(n);
    } else if (n == 0 || errno != EINTR) {
      failed_ = true;
    }
  }
  used_ = 0;
}

}  // namespace ktree
