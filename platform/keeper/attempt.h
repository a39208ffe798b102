// One try to connect a target again.
#ifndef PLATFORM_KEEPER_ATTEMPT_H
#define PLATFORM_KEEPER_ATTEMPT_H

#include <string>

namespace keeper {

// Has the tool connect or recover the target, silently: that something is missing has been told, and whoever
// gives the command by hand is told why it failed. Somebody who disconnects the target meanwhile has the last
// word: a connection that comes behind it is taken back. Returns the exit status, 1 when there is none.
int bring_up(const char* option, const std::string& target);

// Has the calling process end with the one that started it, the keeper, and bear its name; a run of the tool
// that has begun goes on. Returns false when the keeper has ended already.
bool end_with_keeper();

// Whether a portal accepts connections; waits some seconds for it. A link-local address is tried at every LAN
// port.
bool portal_answers(const std::string& address, const std::string& port);

// Has the tool connect the target, or, where volumes are still mounted from its lost session, recover it.
// Returns the exit status, 1 when the portal does not answer, or when the target was disconnected, deleted or
// connected meanwhile. With `refresh` the status texts are brought up to date before. Ends with the keeper.
int try_target(const std::string& target, bool refresh);

}  // namespace keeper

#endif
