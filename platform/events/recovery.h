// How the recovery of a target stands.
#ifndef PLATFORM_EVENTS_RECOVERY_H
#define PLATFORM_EVENTS_RECOVERY_H

#include <string>

#include "events/targets.h"

namespace events {

// Looks it up in the tree, which has five seconds to answer and may have been started anew since, and among
// the machine's processes.
Recovery recovery_of(const std::string& target);

}  // namespace events

#endif
