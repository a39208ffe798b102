// The daemon's places in the file system: its socket and the file with its process number.
#ifndef PLATFORM_KTREE_ENDPOINT_H
#define PLATFORM_KTREE_ENDPOINT_H

#include <sys/types.h>

#include <string>

namespace ktree {

// Holds the socket and the pid file from open() to the end of its life, and removes both then.
class Endpoint {
 public:
  Endpoint() = default;
  Endpoint(const Endpoint&) = delete;
  Endpoint& operator=(const Endpoint&) = delete;
  ~Endpoint();

  // Whether the place of the socket can be taken: no daemon answers there, and there is nothing else than a
  // socket. Returns false with a message in `error`; nothing is touched.
  [[nodiscard]] static bool is_free(const std::string& socket_path, std::string& error);

  // Makes the pid file SOCKET_NAME.pid and listens on `socket_path` (mode 0600), of at most 103 bytes. Both
  // get their names when they are ready. A socket file that a dead daemon left is replaced; when the place is
  // not free, nothing is touched. Two daemons that start at the same time keep out of each other's way by the
  // lock file SOCKET.lock. Returns false with a message in `error`.
  [[nodiscard]] bool open(const std::string& socket_path, const std::string& name, std::string& error);

  [[nodiscard]] int listener() const { return listener_; }

 private:
  // A file in the folder, known by its inode, so that a file that took its name is left alone.
  struct OwnFile {
    std::string name;
    dev_t device = 0;
    ino_t inode = 0;
  };

  [[nodiscard]] static bool make_free(const std::string& socket_path, std::string& error);
  [[nodiscard]] bool listen_on(const std::string& socket_path);
  [[nodiscard]] bool write_pid(const std::string& name);
  [[nodiscard]] bool remember(OwnFile& file, const std::string& name) const;
  [[nodiscard]] bool give_name(OwnFile& file, const std::string& name) const;
  void remove(const OwnFile& file) const;
  [[nodiscard]] int open_lock(const std::string& name) const;
  [[nodiscard]] bool take_lock(const std::string& name, int& lock) const;
  [[nodiscard]] bool open_locked(const std::string& socket_path, const std::string& name, std::string& error);

  int folder_ = -1;
  int listener_ = -1;
  int pid_file_ = -1;
  OwnFile socket_;
  OwnFile pid_;
};

}  // namespace ktree

#endif
