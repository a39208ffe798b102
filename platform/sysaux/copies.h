// Copies that file systems keep of their first sectors, and of their root. libblkid looks for few of them, so
// a file system whose first sectors are lost would pass for an empty device although all of its files can be
// had back.
#ifndef PLATFORM_SYSAUX_COPIES_H
#define PLATFORM_SYSAUX_COPIES_H

namespace sysaux {

// Looks for such a copy on the open device; `name` becomes "damaged_" and the kind of file system, null when
// there is none. Returns false when a read failed, so nothing is known.
bool find_copy(int device, const char** name);

}  // namespace sysaux

#endif
