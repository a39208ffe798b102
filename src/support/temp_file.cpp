#include "support/temp_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstring>

#include "support/files.h"

namespace remvol {

namespace {

constexpr int kTries = 10;
constexpr char kNoFile[] = "/dev/null/none";  // a command that is to write there fails

// Makes the file, which nobody else may have made: in a folder like /tmp its owner alone can then exchange
// it.
bool make_anew(const char* path) {
  for (int tries = 0; tries < kTries; tries++) {
    remove_path(path);
    const int fd = open(path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (fd >= 0) {
      close(fd);
      return true;
    }
  }
  return false;
}

Text<256> lock_name(const char* path) {
  const char* slash = strrchr(path, '/');
  return Text<256>("%s.lock", slash != nullptr ? slash + 1 : path);
}

}  // namespace

TempFile::TempFile(const char* path) : path_("%s", path) {
  const bool free = lock_.try_take(lock_name(path), LockMode::kExclusive) != LockTry::kBusy;
  if (free && make_anew(path_)) return;
  own_name_ = true;
  path_ = PathText("%s.%d", path, static_cast<int>(getpid()));
  if (!make_anew(path_)) path_ = PathText("%s", kNoFile);
}

TempFile::~TempFile() {
  if (own_name_) remove_path(path_);
}

}  // namespace remvol
