// The settings files that the daemon is started with.
#ifndef PLATFORM_KTREE_START_SETTINGS_H
#define PLATFORM_KTREE_START_SETTINGS_H

#include <string>
#include <vector>

#include "ktree/service.h"

namespace ktree {

// Loads the first of `files` that can be loaded; none at all leaves the tree empty. A file that is there and
// cannot be loaded is told on standard error and kept: it gets the second name FILE.damaged, because the next
// dump will replace it. Throws std::bad_alloc when memory is short.
void load_first(const std::vector<std::string>& files, Service& service);

}  // namespace ktree

#endif
