// The volumes of connected targets: which of them are to be mounted, and mounting one again.
#ifndef PLATFORM_KEEPER_VOLUMES_H
#define PLATFORM_KEEPER_VOLUMES_H

#include <string>
#include <vector>

#include "common/sessions.h"
#include "common/tree_reader.h"
#include "keeper/schedule.h"

namespace keeper {

// The volumes that are to be mounted, named by their shares, and whether they are. Nothing else is wrong with
// them: the tree calls them normal, and no run of the tool takes them away in this moment. Unless their
// target has one session, which works, they are unclear. One whose disk a program has open that is not this
// system's is taken away on purpose: whoever unmounts a volume by hand works on its disk next, in several
// steps maybe.
std::vector<Wanted> wanted_volumes(const platform::TreeReader& tree,
                                   const std::vector<platform::Session>& sessions);

// Has the tool connect the target of the volume, which mounts what of it is not mounted, and would format
// what shows no file system. So it does so only when every volume of the target is mounted, or nothing is
// wrong with it and its disk runs, is used by nobody, and shows something that wants no check; and when no
// other run is at work there. Returns the exit status, 1 when that is not so. Ends with the process that
// started it, but for a run of the tool that has begun.
int mount_again(const std::string& share);

}  // namespace keeper

#endif
