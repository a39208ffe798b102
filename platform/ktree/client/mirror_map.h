// The daemon's mirror in the memory of a client.
#ifndef PLATFORM_KTREE_CLIENT_MIRROR_MAP_H
#define PLATFORM_KTREE_CLIENT_MIRROR_MAP_H

#include "ktree/mirror.h"

namespace ktree::client {

// Maps the memory file `fd`, which may be closed afterwards. Returns null when it is no mirror, one of
// another layout, or memory is short.
[[nodiscard]] const mirror::Word* map_mirror(int fd);

// `words` may be null.
void unmap_mirror(const mirror::Word* words);

}  // namespace ktree::client

#endif
