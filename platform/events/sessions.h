// The iSCSI sessions of the machine, as sysfs shows them.
#ifndef PLATFORM_EVENTS_SESSIONS_H
#define PLATFORM_EVENTS_SESSIONS_H

#include <cstdint>
#include <string>
#include <vector>

namespace events {

enum class Link {
  kUp,    // logged in
  kDown,  // it had been logged in and lost its connection
  kNew,   // it was never logged in
};

struct Session {
  uint32_t number;
  std::string target;
  Link link;
};

// Lists the sessions; one that vanishes meanwhile is left out.
std::vector<Session> read_sessions();

}  // namespace events

#endif
