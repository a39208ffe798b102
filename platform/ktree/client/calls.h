// The operations of the client, with more to tell than the C interface can: ktreec_*() and the ktreec program
// are made of these.
#ifndef PLATFORM_KTREE_CLIENT_CALLS_H
#define PLATFORM_KTREE_CLIENT_CALLS_H

#include <cstddef>

#include "ktree/client/channel.h"
#include "ktree/client/document.h"

namespace ktree::client {

// Why a call failed, as a person reads it; empty when there is nothing to add to the result.
struct Reason {
  char text[kMaxErrorBytes + 1];
};

[[nodiscard]] CallResult set(const char* socket, const char* path, const char* value);
[[nodiscard]] CallResult del(const char* socket, const char* path);

// Puts at most `room` bytes of the value into `buffer` and their number into `size`.
[[nodiscard]] CallResult get(const char* socket, const char* path, char* buffer, size_t room, size_t& size);

// Replaces `file` by the settings file of the tree.
[[nodiscard]] CallResult dump(const char* socket, const char* file, Reason& reason);

// Writes the settings file of the tree to `fd`.
[[nodiscard]] CallResult dump_to(const char* socket, int fd, Reason& reason);

// Makes the tree what `file` holds.
[[nodiscard]] CallResult load(const char* socket, const char* file, Reason& reason);

// Has the daemon write the listing of the subtree at `path` ("/" is the whole tree) into `document`.
[[nodiscard]] CallResult list(const char* socket, const char* path, const MemoryFile& document,
                              Reason& reason);

// Writes that listing to `fd`.
[[nodiscard]] CallResult list_to(const char* socket, const char* path, int fd, Reason& reason);

}  // namespace ktree::client

#endif
