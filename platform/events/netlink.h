// The two netlink sockets: device events of the kernel, and those of its iSCSI transport class.
#ifndef PLATFORM_EVENTS_NETLINK_H
#define PLATFORM_EVENTS_NETLINK_H

#include <cstddef>

namespace events {

// Opens a socket that receives the kernel's device events. Returns it, or -1 with errno.
int open_device_events();

// Opens a socket that receives the events of iSCSI connections. As long as it is open the kernel module
// scsi_transport_iscsi cannot be unloaded. Returns it, or -1 with errno: EPROTONOSUPPORT when that module is
// not loaded, ECONNREFUSED outside of the initial network namespace.
int open_iscsi_events();

enum class Received { kMessage, kNothing, kOverrun, kFailed };

// Receives one message of the kernel without waiting; messages of anybody else are dropped. kOverrun:
// messages were lost because they were not received in time.
Received receive(int socket, unsigned char* buffer, size_t room, size_t& size);

// True when a device event is about an iSCSI session.
bool is_session_event(const unsigned char* message, size_t size);

}  // namespace events

#endif
