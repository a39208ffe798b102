// Writes the tree as the XML of the settings file.
#ifndef PLATFORM_KTREE_SETTINGS_WRITER_H
#define PLATFORM_KTREE_SETTINGS_WRITER_H

#include "ktree/tree.h"

namespace ktree {

// Writes `tree` to `fd` from its current position. Returns false when it could not be written in full.
[[nodiscard]] bool write_settings(const Tree& tree, int fd);

}  // namespace ktree

#endif
