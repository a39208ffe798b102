#include "ktree/endpoint.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>

namespace ktree {
namespace {

constexpr int kLockTries = 50;  // 100 ms apart: a starting daemon holds the lock for much less than 5 s
constexpr long kLockPause = 100000000;
constexpr int kNoLock = -2;      // what was there is removed
constexpr char kNew[] = ".new";  // behind the name of a file that is not ready

std::string folder_of(const std::string& path) {
  size_t slash = path.rfind('/');
  return slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
}

std::string name_of(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

bool socket_address(const std::string& path, sockaddr_un& address) {
  address = {};
  address.sun_family = AF_UNIX;
  if (path.empty() || path.size() >= sizeof address.sun_path) {
    errno = ENAMETOOLONG;
    return false;
  }
  memcpy(address.sun_path, path.c_str(), path.size() + 1);
  return true;
}

// True when a process listens there; one that is too busy to take the connection at once does, too.
bool is_answered(const sockaddr_un& address) {
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) return true;
  const bool refused = connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 &&
                       (errno == ECONNREFUSED || errno == ENOENT);
  close(fd);
  return !refused;
}

std::string system_error(const std::string& what) {
  return what + ": " + strerror(errno);
}

}  // namespace

// The socket last: as long as it is there, no successor has files of these names.
Endpoint::~Endpoint() {
  if (folder_ >= 0) {
    remove(pid_);
    remove(socket_);
    close(folder_);
  }
  if (pid_file_ >= 0) close(pid_file_);
  if (listener_ >= 0) close(listener_);
}

// Opens the lock file for this user alone: a file that others can open they can lock for ever.
int Endpoint::open_lock(const std::string& name) const {
  const int fd = openat(folder_, name.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0600);
  struct stat info = {};
  if (fd >= 0 && fstat(fd, &info) == 0 && S_ISREG(info.st_mode) && info.st_uid == geteuid() &&
      (info.st_mode & 077) == 0) {
    return fd;
  }
  const int error = fd < 0 ? errno : EACCES;
  if (fd >= 0) close(fd);
  if (unlinkat(folder_, name.c_str(), 0) == 0) return kNoLock;
  errno = error;
  return -1;
}

// The holder removes the file when it is done, so the one that was waited for may be gone.
bool Endpoint::take_lock(const std::string& name, int& lock) const {
  for (int i = 0; i < kLockTries; i++) {
    lock = open_lock(name);
    if (lock == -1) return false;
    struct stat mine = {};
    struct stat there = {};
    if (lock != kNoLock && flock(lock, LOCK_EX | LOCK_NB) == 0 && fstat(lock, &mine) == 0 &&
        fstatat(folder_, name.c_str(), &there, AT_SYMLINK_NOFOLLOW) == 0 && mine.st_ino == there.st_ino) {
      return true;
    }
    if (lock != kNoLock) {
      close(lock);
      timespec pause = {0, kLockPause};
      nanosleep(&pause, nullptr);
    }
  }
  errno = EWOULDBLOCK;
  return false;
}

bool Endpoint::open(const std::string& socket_path, const std::string& name, std::string& error) {
  const std::string folder = folder_of(socket_path);
  const std::string lock_name = name_of(socket_path) + ".lock";
  int lock = -1;
  folder_ = ::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (folder_ < 0 || !take_lock(lock_name, lock)) {
    error = system_error(folder);
    return false;
  }
  const bool opened = open_locked(socket_path, name, error);
  unlinkat(folder_, lock_name.c_str(), 0);
  close(lock);
  return opened;
}

bool Endpoint::open_locked(const std::string& socket_path, const std::string& name, std::string& error) {
  if (!make_free(socket_path, error)) return false;
  const std::string pid_name = name_of(socket_path) + "_" + name + ".pid";
  if (!write_pid(pid_name)) {
    error = system_error(folder_of(socket_path) + "/" + pid_name);
    return false;
  }
  if (!listen_on(socket_path)) {
    error = system_error(socket_path);
    return false;
  }
  return true;
}

bool Endpoint::is_free(const std::string& socket_path, std::string& error) {
  sockaddr_un address = {};
  struct stat info = {};
  if (!socket_address(socket_path, address)) {
    error = system_error(socket_path);
    return false;
  }
  if (lstat(socket_path.c_str(), &info) != 0) return true;
  if (!S_ISSOCK(info.st_mode)) {
    error = socket_path + ": there is a file of this name that is not a socket";
    return false;
  }
  if (is_answered(address)) {
    error = socket_path + ": another daemon listens on this socket";
    return false;
  }
  return true;
}

bool Endpoint::make_free(const std::string& socket_path, std::string& error) {
  if (!is_free(socket_path, error)) return false;
  if (unlink(socket_path.c_str()) == 0 || errno == ENOENT) return true;
  error = system_error(socket_path);
  return false;
}

// Under another name first: whoever sees the socket finds it answered.
bool Endpoint::listen_on(const std::string& socket_path) {
  const std::string name = name_of(socket_path);
  const std::string temporary = name + kNew;
  sockaddr_un address = {};
  if (!socket_address(socket_path + kNew, address)) return false;
  listener_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (listener_ < 0) return false;
  unlinkat(folder_, temporary.c_str(), 0);
  // The mask makes the socket private from its first moment; a chmod after the bind would leave a gap.
  const mode_t mask = umask(0177);
  const int bound = bind(listener_, reinterpret_cast<const sockaddr*>(&address), sizeof address);
  umask(mask);
  return bound == 0 && remember(socket_, temporary) && listen(listener_, SOMAXCONN) == 0 &&
         give_name(socket_, name);
}

// Writes the number into a file of another name first: whoever sees the pid file finds a whole number in it.
// The file stays open, or a successor's could get the number of its inode.
bool Endpoint::write_pid(const std::string& name) {
  char text[24];
  const int length = snprintf(text, sizeof text, "%ld\n", static_cast<long>(getpid()));
  const std::string temporary = name + kNew;
  unlinkat(folder_, temporary.c_str(), 0);
  pid_file_ = openat(folder_, temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
  return pid_file_ >= 0 && remember(pid_, temporary) &&
         write(pid_file_, text, static_cast<size_t>(length)) == length && give_name(pid_, name);
}

bool Endpoint::remember(OwnFile& file, const std::string& name) const {
  struct stat info = {};
  if (fstatat(folder_, name.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0) return false;
  file = {name, info.st_dev, info.st_ino};
  return true;
}

bool Endpoint::give_name(OwnFile& file, const std::string& name) const {
  if (renameat(folder_, file.name.c_str(), folder_, name.c_str()) != 0) return false;
  file.name = name;
  return true;
}

void Endpoint::remove(const OwnFile& file) const {
  struct stat info = {};
  if (file.inode != 0 && fstatat(folder_, file.name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0 &&
      info.st_dev == file.device && info.st_ino == file.inode) {
    unlinkat(folder_, file.name.c_str(), 0);
  }
}

}  // namespace ktree
