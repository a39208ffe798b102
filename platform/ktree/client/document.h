// Documents on their way between a file and the daemon.
#ifndef PLATFORM_KTREE_CLIENT_DOCUMENT_H
#define PLATFORM_KTREE_CLIENT_DOCUMENT_H

#include <cstddef>

namespace ktree::client {

// A memory file that is closed when it goes out of scope.
class MemoryFile {
 public:
  MemoryFile();
  MemoryFile(const MemoryFile&) = delete;
  MemoryFile& operator=(const MemoryFile&) = delete;
  ~MemoryFile();

  // -1 when the system gave none; errno says why.
  [[nodiscard]] int fd() const { return fd_; }

  // Fills it with the regular file `file`. Returns 0 or an errno value.
  [[nodiscard]] int read_from(const char* file) const;

  // Writes all of it to `fd`, which stays open. Returns 0 or an errno value.
  [[nodiscard]] int write_to(int fd) const;

  // Makes `file` a regular file, mode 0600, that holds all of it, in one step: at any moment, also after a
  // power cut, `file` is the whole old one or the whole new one. A symbolic link is replaced, not followed; a
  // device, a pipe or a folder is refused. A file that is like that already stays, so that asking again and
  // again wears no flash; it is on its disk afterwards as well. Returns 0 or an errno value; `file` is then
  // as it was, unless the very last step failed, the writing of the folder to its disk.
  [[nodiscard]] int replace_file(const char* file) const;

 private:
  int fd_;
};

}  // namespace ktree::client

#endif
