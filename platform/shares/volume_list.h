// The volumes of the configuration tree, as far as their shares need it.
#ifndef PLATFORM_SHARES_VOLUME_LIST_H
#define PLATFORM_SHARES_VOLUME_LIST_H

#include <string>
#include <vector>

namespace shares {

struct SharedVolume {
  std::string name;  // share name, as the tree has it
  std::string path;  // where it is mounted
  bool read_only;
  bool extended_attributes;  // the file system keeps user attributes of files
  bool mounted;
  const char* failure;  // why it is not mounted although its target is connected; null for no such reason
};

// Puts the volumes into `volumes`, in the tree's order. Returns false when the tree cannot be reached; the
// list is then incomplete.
bool read_volumes(std::vector<SharedVolume>& volumes);

// True when `path` is a mount point.
bool is_mounted(const std::string& path);

}  // namespace shares

#endif
