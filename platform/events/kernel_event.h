// What the kernel's iSCSI transport class multicasts on netlink (NETLINK_ISCSI, group 1).
#ifndef PLATFORM_EVENTS_KERNEL_EVENT_H
#define PLATFORM_EVENTS_KERNEL_EVENT_H

#include <cstddef>
#include <cstdint>

namespace events {

enum class KernelEventKind {
  kOther,           // nothing that matters here
  kConnectionLost,  // a session's connection failed
  kLoggedIn,        // the target accepted the last step of a login
};

struct KernelEvent {
  KernelEventKind kind;
  uint32_t session;  // its number, as in /sys/class/iscsi_session/session%u
};

// Takes the first message off a received datagram: `data` and `size` become what is left. Returns false when
// no whole message is left; a message of an unknown type, or one that is cut short, is kOther.
bool take_kernel_event(const unsigned char*& data, size_t& size, KernelEvent& event);

}  // namespace events

#endif
