// Reads the XML of the settings file into a tree.
#ifndef PLATFORM_KTREE_SETTINGS_READER_H
#define PLATFORM_KTREE_SETTINGS_READER_H

#include <string>
#include <string_view>

#include "ktree/tree.h"

namespace ktree {

// Reads the document in `fd` from offset 0 to its end into `tree`, which must be empty. Returns true, or
// false when the document is damaged or holds what a tree may not hold: `tree` is then of no use, and `error`
// says what and where ("line 7: ..."). Throws std::bad_alloc when memory is short.
[[nodiscard]] bool read_settings(int fd, Tree& tree, std::string& error);

// The same for a document in memory.
[[nodiscard]] bool read_settings(std::string_view document, Tree& tree, std::string& error);

}  // namespace ktree

#endif
