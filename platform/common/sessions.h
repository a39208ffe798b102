// The iSCSI sessions of the machine, as sysfs shows them.
#ifndef PLATFORM_COMMON_SESSIONS_H
#define PLATFORM_COMMON_SESSIONS_H

#include <cstdint>
#include <string>
#include <vector>

namespace platform {

enum class Link {
  kUp,    // logged in
  kDown,  // it had been logged in and lost its connection
  kNew,   // it was never logged in
};

struct Session {
  uint32_t number;
  std::string target;
  std::string state;  // the kernel's word: LOGGED_IN, FAILED or FREE
  Link link;
};

// Returns whether there is a session, also one that has no target's name yet: the kernel tells of a new one
// before the initiator has named it.
bool is_any_session();

// Lists the sessions that have a target's name; one that vanishes meanwhile is left out.
std::vector<Session> read_sessions();

// The address of the portal that the session's connection was made to, as it was given; empty when it has
// none.
std::string address_of(const Session& session);

// The kernel's name of the disk that is a LUN of the session, such as "sdb"; empty when there is none, or
// when it takes no commands just now.
std::string running_disk(const Session& session, int lun);

}  // namespace platform

#endif
