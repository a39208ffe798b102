// Portals as people write them.
#ifndef PLATFORM_VV_PORTAL_H
#define PLATFORM_VV_PORTAL_H

#include <string>

namespace vv {

inline constexpr int kDefaultPort = 3260;

struct Portal {
  std::string address;  // numeric, IPv6 without brackets
  int port = kDefaultPort;

  // The address as the configuration tree has it: IPv6 in brackets.
  std::string stored_address() const;

  // "10.9.0.2:3260", "[fd00::2]:3260".
  std::string text() const;
};

// Takes "10.9.0.2", "10.9.0.2:3261", "fd00::2", "[fd00::2]", "[fd00::2]:3261", "nas.example.org:3261"; a name
// becomes the first address that the system has for it. Returns false when it is none; `why` says so then.
bool read_portal(const std::string& text, Portal& portal, std::string& why);

// The portal that the tree has, address and port.
Portal stored_portal(const std::string& address, int port);

}  // namespace vv

#endif
