#include "ktree/client/document.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>

#include "common/fd.h"
#include "ktree/limits.h"

namespace ktree::client {
namespace {

// Copies `from`, from offset 0 to its end, to the position of `to`. Returns 0 or an errno value.
int copy_all(int from, int to) {
  char buffer[65536];
  off_t offset = 0;
  for (;;) {
    const ssize_t n = pread(from, buffer, sizeof buffer, offset);
    if (n == 0) return 0;
    if (n < 0) {
      if (errno == EINTR) continue;
      return errno;
    }
    if (!platform::write_all(to, buffer, static_cast<size_t>(n))) return errno;
    offset += n;
    if (static_cast<size_t>(offset) > kMaxDocumentBytes) return EFBIG;
  }
}

constexpr char kTemporaryEnd[] = ".tmp";

// Opens the folder of `file`. Returns -1, with errno, when it cannot be had.
int open_folder_of(const char* file) {
  char folder[PATH_MAX];
  const char* slash = strrchr(file, '/');
  const size_t length = slash == nullptr ? 0 : static_cast<size_t>(slash - file) + 1;
  if (length >= sizeof folder) {
    errno = ENAMETOOLONG;
    return -1;
  }
  memcpy(folder, file, length);
  folder[length] = '\0';
  return open(length == 0 ? "." : folder, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

// True when `name` is "FILE.NUMBER.tmp" of the file called `file`.
bool is_temporary_of(const char* name, const char* file) {
  const size_t length = strlen(file);
  if (strncmp(name, file, length) != 0 || name[length] != '.') return false;
  const char* number = name + length + 1;
  const size_t digits = strspn(number, "0123456789");
  return digits > 0 && strcmp(number + digits, kTemporaryEnd) == 0;
}

// Removes `name` in the folder when it was left by a process of this user that died: a living one has it
// locked.
void remove_left_over(int folder, const char* name) {
  const int fd = openat(folder, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
  struct stat info = {};
  if (fd >= 0 && fstat(fd, &info) == 0 && S_ISREG(info.st_mode) && info.st_uid == geteuid() &&
      flock(fd, LOCK_EX | LOCK_NB) == 0) {
    unlinkat(folder, name, 0);
  }
  if (fd >= 0) close(fd);
}

// A process that is killed in the middle of a dump leaves its file behind, with all that the settings hold.
void remove_left_overs_of(const char* file) {
  const int folder = open_folder_of(file);
  DIR* entries = folder < 0 ? nullptr : fdopendir(folder);
  if (entries == nullptr) {
    if (folder >= 0) close(folder);
    return;
  }
  const char* slash = strrchr(file, '/');
  while (const dirent* entry = readdir(entries)) {
    if (is_temporary_of(entry->d_name, slash == nullptr ? file : slash + 1)) {
      remove_left_over(folder, entry->d_name);
    }
  }
  closedir(entries);
}

// A file that is about to take the place of another one; removed again unless it did.
class Replacement {
 public:
  // Makes it in the folder of `file`. Returns 0 or an errno value. The name holds the process and thread, so
  // what is there already was left by one that died.
  int create(const char* file) {
    const int length =
        snprintf(path_, sizeof path_, "%s.%ld%s", file, static_cast<long>(gettid()), kTemporaryEnd);
    if (length < 0 || static_cast<size_t>(length) >= sizeof path_) {
      path_[0] = '\0';
      return ENAMETOOLONG;
    }
    int wrong = make();
    for (int i = 0; i < kCreateTries && wrong == EBUSY; i++) wrong = make();
    return wrong;
  }

  // Writes it to the disk and gives it the name `file`; it stays open, and locked, until it has that. Returns
  // 0 or an errno value.
  int commit(const char* file) {
    if (fsync(fd_) != 0 || rename(path_, file) != 0) return errno;
    path_[0] = '\0';
    return 0;
  }

  [[nodiscard]] int fd() const { return fd_; }

  Replacement() = default;
  Replacement(const Replacement&) = delete;
  Replacement& operator=(const Replacement&) = delete;
  ~Replacement() {
    if (fd_ >= 0) close(fd_);
    if (path_[0] != '\0') unlink(path_);
  }

 private:
  static constexpr int kCreateTries = 10;

  // Makes and locks the file. Returns 0 or an errno value: EBUSY when another process took it for one that
  // was left behind, before it was locked.
  int make() {
    unlink(path_);
    fd_ = open(path_, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (fd_ < 0) {
      path_[0] = '\0';
      return errno;
    }
    struct stat info = {};
    const bool locked = flock(fd_, LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK;
    if (!locked || fstat(fd_, &info) != 0 || info.st_nlink == 0) {
      close(fd_);
      fd_ = -1;
      return EBUSY;
    }
    // The process's mask may take bits away; it cannot add any.
    return fchmod(fd_, 0600) == 0 ? 0 : errno;
  }

  int fd_ = -1;
  char path_[PATH_MAX] = "";
};

// Whether both hold the same bytes.
bool is_same(int one, int other) {
  char left[16384];
  char right[sizeof left];
  for (off_t offset = 0;;) {
    const ssize_t n = pread(one, left, sizeof left, offset);
    if (n < 0 || pread(other, right, sizeof right, offset) != n) return false;
    if (n == 0) return true;
    if (memcmp(left, right, static_cast<size_t>(n)) != 0) return false;
    offset += n;
  }
}

// Whether `file` is on its disk as a replacement that holds `document` would be.
bool is_there_already(const char* file, int document) {
  const platform::Fd fd(open(file, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  struct stat info = {};
  return fd.ok() && fstat(fd.get(), &info) == 0 && info.st_mode == (S_IFREG | 0600) &&
         info.st_uid == geteuid() && info.st_nlink == 1 && is_same(fd.get(), document) &&
         fsync(fd.get()) == 0;
}

// A rename is on the disk when its folder is.
int sync_folder_of(const char* file) {
  const int fd = open_folder_of(file);
  if (fd < 0) return errno;
  // A file system without this operation says EINVAL (fsync(2)); there is nothing more to be done then.
  const int wrong = fsync(fd) == 0 || errno == EINVAL ? 0 : errno;
  close(fd);
  return wrong;
}

// What a rename over `file` must not replace.
int check_replaceable(const char* file) {
  struct stat info = {};
  if (stat(file, &info) != 0 || S_ISREG(info.st_mode)) return 0;
  return S_ISDIR(info.st_mode) ? EISDIR : EINVAL;
}

}  // namespace

MemoryFile::MemoryFile() : fd_(memfd_create("ktree", MFD_CLOEXEC)) {}

MemoryFile::~MemoryFile() {
  if (fd_ >= 0) close(fd_);
}

int MemoryFile::read_from(const char* file) const {
  // Opening a pipe would wait for its other end.
  const int fd = open(file, O_RDONLY | O_CLOEXEC | O_NONBLOCK);
  if (fd < 0) return errno;
  struct stat info = {};
  int wrong = fstat(fd, &info) != 0   ? errno
              : S_ISREG(info.st_mode) ? 0
              : S_ISDIR(info.st_mode) ? EISDIR
                                      : EINVAL;
  if (wrong == 0) wrong = copy_all(fd, fd_);
  close(fd);
  return wrong;
}

int MemoryFile::write_to(int fd) const {
  return copy_all(fd_, fd);
}

int MemoryFile::replace_file(const char* file) const {
  int wrong = check_replaceable(file);
  if (wrong != 0) return wrong;
  remove_left_overs_of(file);
  if (is_there_already(file, fd_)) return sync_folder_of(file);
  Replacement replacement;
  wrong = replacement.create(file);
  if (wrong == 0) wrong = write_to(replacement.fd());
  if (wrong == 0) wrong = replacement.commit(file);
  return wrong == 0 ? sync_folder_of(file) : wrong;
}

}  // namespace ktree::client
