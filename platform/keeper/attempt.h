// One try to connect a target again.
#ifndef PLATFORM_KEEPER_ATTEMPT_H
#define PLATFORM_KEEPER_ATTEMPT_H

#include <string>
#include <vector>

namespace keeper {

// Runs the tool silently: that something is missing has been told, and whoever gives the command by hand is
// told why it failed. Returns the exit status, 1 when there is none.
int run_silently(std::vector<const char*> arguments);

// Whether a portal accepts connections; waits some seconds for it. A link-local address is tried at every LAN
// port.
bool portal_answers(const std::string& address, const std::string& port);

// Has the tool connect the target, or, where volumes are still mounted from its lost session, recover it.
// Returns the exit status, 1 when the portal does not answer. With `refresh` the status texts are brought up
// to date before.
int try_target(const std::string& target, bool refresh);

}  // namespace keeper

#endif
