// Lock files in /run/remvol, a folder of our own: what others may open, others may keep locked for ever.
#ifndef PLATFORM_COMMON_LOCK_FILE_H
#define PLATFORM_COMMON_LOCK_FILE_H

namespace platform {

// Opens the file `name` in the folder, for us alone, and makes both when they are missing. A folder or file
// that another user made, a link, or a file that others may open is not used but replaced. Returns the
// descriptor, or -1 with errno.
int open_lock_file(const char* name);

// Waits for the lock `how` (flock(2)) on `fd`. Returns false, with errno, when it cannot be had.
bool take_lock(int fd, int how);

}  // namespace platform

#endif
