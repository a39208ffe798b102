// What the tree says of a target that an event names: whether it is one of this system's, and how its
// recovery stands.
#ifndef PLATFORM_EVENTS_RECOVERY_H
#define PLATFORM_EVENTS_RECOVERY_H

#include <string>

#include "common/tree_reader.h"
#include "events/targets.h"

namespace events {

// True when `tree` has its settings and no such target in them: whatever becomes of its sessions is the
// business of whoever logged in. A tree that has not answered, or that is not loaded yet, does not say so of
// any.
bool is_others(const platform::TreeReader& tree, const std::string& target);

// Looks it up in the tree, which has five seconds to answer and may have been started anew since, and among
// the machine's processes.
Recovery recovery_of(const std::string& target);

}  // namespace events

#endif
