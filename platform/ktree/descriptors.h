// Descriptors that go with a message over a unix socket (SCM_RIGHTS of unix(7)).
#ifndef PLATFORM_KTREE_DESCRIPTORS_H
#define PLATFORM_KTREE_DESCRIPTORS_H

#include <sys/socket.h>
#include <unistd.h>

#include <cstring>

namespace ktree {

// The control part of a message, with room for one descriptor.
struct DescriptorRoom {
  alignas(cmsghdr) char bytes[CMSG_SPACE(sizeof(int))];
};

// `room` has to live until the message is sent.
inline void pass_descriptor(msghdr& message, DescriptorRoom& room, int fd) {
  message.msg_control = room.bytes;
  message.msg_controllen = sizeof room.bytes;
  cmsghdr* part = CMSG_FIRSTHDR(&message);
  part->cmsg_level = SOL_SOCKET;
  part->cmsg_type = SCM_RIGHTS;
  part->cmsg_len = CMSG_LEN(sizeof fd);
  memcpy(CMSG_DATA(part), &fd, sizeof fd);
}

// Puts the descriptor that came with a received message into `fd`, which is closed when it held one; the last
// of several, the others are closed.
inline void take_descriptor(msghdr& message, int& fd) {
  for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof fd;
    for (size_t i = 0; i < count; i++) {
      if (fd >= 0) close(fd);
      memcpy(&fd, CMSG_DATA(part) + i * sizeof fd, sizeof fd);
    }
  }
}

}  // namespace ktree

#endif
