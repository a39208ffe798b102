// The file systems that a volume may carry, each a row of one table. A further one needs its row and, when it
// is made, checked or grown by programs of its own, a file of their commands as e2fsprogs is one.
#ifndef REMVOL_VOLUME_FILE_SYSTEMS_H
#define REMVOL_VOLUME_FILE_SYSTEMS_H

#include "support/text.h"

namespace remvol {

using NodeCommand = CommandText (*)(const char* node);

struct FileSystem {
  const char* type;         // as the platform calls it
  const char* mount;        // what mount(8) is told of it
  const char* stock_mount;  // the same with a driver that stock kernels have; null: nothing else is tried
  NodeCommand make;         // null: no volume is formatted with it
  NodeCommand check;        // run before a mount when its state calls for it; null: never
  NodeCommand grow;         // run after a mount, since the partition may have grown; null: it stays as it is
};

// What a volume is formatted with that carried nothing, or what cannot be made.
inline constexpr char kDefaultFileSystem[] = "ext4";

// Returns the row of the file system; null when a volume cannot carry it.
[[nodiscard]] const FileSystem* find_file_system(const char* type);

}  // namespace remvol

#endif
