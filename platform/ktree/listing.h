// The text form of a subtree, for people and scripts.
#ifndef PLATFORM_KTREE_LISTING_H
#define PLATFORM_KTREE_LISTING_H

#include <string_view>

#include "ktree/path.h"
#include "ktree/tree.h"

namespace ktree {

// Writes to `fd` a line `path=value` for every node with a value from `node` (which `path` leads to; empty
// for the root) downwards, children in the order in which they were made. The element `id` always carries its
// number, another only from 2 on. Bytes below 0x20 and the backslash of a value are written as \xHH. Returns
// false when it could not be written in full.
[[nodiscard]] bool write_listing(const Node& node, const Path& path, int fd);

}  // namespace ktree

#endif
