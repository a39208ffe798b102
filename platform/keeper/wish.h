// The wish that a target be connected, which the tool takes back when it meets a session without a disk.
#ifndef PLATFORM_KEEPER_WISH_H
#define PLATFORM_KEEPER_WISH_H

#include <string>

#include "tree_layout.h"

namespace keeper {

// Storage whose portal answers before its LUNs are there, as after a power failure, is to be tried again. So
// a target that was given up is wanted once more: it has no wish, and a volume in the state that the tool has
// stored with that, kVolumeLost at start-up and kVolumeFailed for a connection. Its connection has failed
// then, and such volumes are offline, so that a later disconnection is taken for none of these. `target` is
// empty for all of them.
void want_again(const std::string& target, remvol::VolumeState given_up);

}  // namespace keeper

#endif
