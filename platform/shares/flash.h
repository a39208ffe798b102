// The configuration flash: the file system that holds the appliance's saved settings. It is read-only except
// while somebody writes to it.
#ifndef PLATFORM_SHARES_FLASH_H
#define PLATFORM_SHARES_FLASH_H

namespace flash {

// How a folder's mount was made writable, and so how it becomes read-only again. The values are what the
// shared file records.
enum class Opened : char {
  kNot = 'n',         // it was writable
  kMount = 'm',       // the mount alone was read-only
  kFileSystem = 'f',  // the file system was
};

// True when `folder` is a mount of its own.
bool is_mount(const char* folder);

// Makes the mount at `folder` writable. Returns false, with errno, when it stays read-only; `opened` says
// what was changed either way.
bool make_writable(const char* folder, Opened& opened);

// Writes out what is pending on `folder` and takes back what make_writable did. Returns false, with errno:
// EBUSY when somebody still has a file open for writing.
bool make_read_only(const char* folder, Opened opened);

// Makes the flash writable for several programs at once. The last one to leave makes it read-only again.
// Whoever holds a UserLock and dies lets go of it; the mount then stays writable until the next one leaves. A
// forked child holds the lock as well.
class UserLock {
 public:
  UserLock() = default;
  UserLock(const UserLock&) = delete;
  UserLock& operator=(const UserLock&) = delete;
  ~UserLock();

  // Enters: waits its turn and makes `folder` writable. Returns false, with errno, when that failed.
  bool enter(const char* folder);

  // Leaves, and when no other user is left makes `folder` read-only. Returns false, with errno, when it is
  // still writable and should not be. Does nothing the second time.
  bool leave(const char* folder);

 private:
  bool open_files();
  bool recall(Opened& opened) const;
  void record(Opened opened) const;

  int door_ = -1;   // held while the mount changes
  int users_ = -1;  // shared by all users; holds how the first one made it writable
};

}  // namespace flash

#endif
