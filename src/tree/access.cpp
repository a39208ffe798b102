#include "tree/access.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "frontend/log.h"
#include "ktreec.h"
#include "support/result.h"
#include "tree_layout.h"

namespace remvol {

namespace {

// Seconds that a read may have taken which is done once more: one that has timed out would do so again.
constexpr time_t kPatience = 1;

// A daemon that is too busy to take the connection at once is one.
bool tree_takes_connections() {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  static_assert(sizeof kVolumesSocket <= sizeof address.sun_path);
  memcpy(address.sun_path, kVolumesSocket, sizeof kVolumesSocket);
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) return true;
  const bool refused = connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 &&
                       (errno == ECONNREFUSED || errno == ENOENT);
  close(fd);
  return !refused;
}

int get_once(const char* key, char* buffer, size_t size) {
  memset(buffer, 0, size);
  errno = 0;
  return ktreec_get_wb(kVolumesSocket, 0, key, buffer, size);
}

}  // namespace

bool tree_answers(const char* key) {
  TreeValue value;
  return ktreec_get_wb(kVolumesSocket, 0, key, value, sizeof value) >= 0 || tree_takes_connections();
}

bool TreeInstance::operator==(const TreeInstance& other) const {
  return inode == other.inode && made.tv_sec == other.made.tv_sec && made.tv_nsec == other.made.tv_nsec;
}

TreeInstance tree_instance() {
  struct stat info;
  if (stat(kVolumesSocket, &info) != 0) return {};
  return {info.st_ino, info.st_mtim};
}

int tree_get(const char* key, char* buffer, size_t size) {
  const time_t begin = time(nullptr);
  const int got = get_once(key, buffer, size);
  if (got != -1 || errno == ENODATA || time(nullptr) - begin > kPatience) return got;
  return get_once(key, buffer, size);
}

bool tree_read(const char* key, char* buffer, size_t size) {
  return tree_get(key, buffer, size) > 0 && buffer[0] != '\0';
}

bool tree_present(const char* key) {
  TreeValue value;
  return tree_read(key, value);
}

bool tree_is_missing(const char* key, const char* present) {
  if (tree_present(key)) return false;
  return errno == ENODATA || (tree_present(present) && !tree_present(key));
}

bool tree_is_loaded() {
  return tree_present(key::kVersion) || tree_present(key::kTargetCount);
}

int tree_read_number(const char* key, int missing) {
  TreeValue value;
  return tree_read(key, value) ? atoi(value) : missing;
}

bool tree_slot_is_free(const char* key) {
  TreeValue value;
  return tree_get(key, value, sizeof value) == -1 || value[0] == '\0';
}

int tree_write(const char* key, const char* value) {
  return tree_write_to(kVolumesSocket, key, value);
}

int tree_write_to(const char* socket, const char* key, const char* value) {
  return ktreec_set(socket, 0, key, value) == 0 ? kOk : kTreeFailed;
}

int tree_write_once(const char* key, const char* value) {
  return tree_write_once_to(kVolumesSocket, key, value);
}

int tree_write_once_to(const char* socket, const char* key, const char* value) {
  return tree_write_to(socket, key, value) == kOk ? kOk : tree_write_failed();
}

int tree_write_failed() {
  LOG(0, "ktreec_set() failed");
  return kTreeFailed;
}

int tree_write_with_tries(const char* key, const char* value, int tries) {
  return tree_write_with_tries_to(kVolumesSocket, key, value, tries);
}

int tree_write_with_tries_to(const char* socket, const char* key, const char* value, int tries) {
  for (int left = tries; left > 0; left--) {
    if (tree_write_to(socket, key, value) == kOk) return kOk;
    LOG(0, "ktreec_set(%s) failed", key);
  }
  return kTreeFailed;
}

int tree_write_logged(const char* key, const char* value) {
  return tree_write_logged_to(kVolumesSocket, key, value, kWriteTries);
}

int tree_write_logged_to(const char* socket, const char* key, const char* value, int tries) {
  LOG(1, "ktreec_set %s=%s", key, value);
  return tree_write_with_tries_to(socket, key, value, tries);
}

int tree_delete(const char* key) {
  return ktreec_del(kVolumesSocket, 0, key) == 0 ? kOk : kTreeFailed;
}

}  // namespace remvol
