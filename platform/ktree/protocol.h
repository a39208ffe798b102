// The frames between the daemon and its clients on a unix stream socket; docs/wire-protocol.md tells all of
// it.
//
// Numbers are in the byte order of the machine. A client sends one request and waits for its reply before it
// sends the next one.
#ifndef PLATFORM_KTREE_PROTOCOL_H
#define PLATFORM_KTREE_PROTOCOL_H

#include <cstdint>
#include <string_view>

#include "ktree/limits.h"

namespace ktree {

enum class Operation : uint8_t {
  kGet = 1,   // value: the most bytes of the value that the client wants, a 32-bit number
  kSet = 2,   // value: the value
  kDel = 3,   // no value
  kDump = 4,  // no path, no value; a memory file is passed, which the daemon fills with the settings file
  kLoad = 5,  // no path, no value; a memory file is passed, which holds the settings file
  kList =
      6,  // no value; a memory file is passed, which the daemon fills with the listing; the path may be "/"
  kMirror = 7,  // no path, no value; the descriptor of the mirror comes with the reply
};

enum class ReplyStatus : uint8_t {
  kDone = 0,     // a get: the value follows
  kMissing = 1,  // no such node, or no value in it
  kRefused = 2,  // a bad path or value, or the tree would get too large
  kDamaged = 3,  // a load: the document is damaged; a text of at most kMaxErrorBytes follows that says where
  kFailed = 4,   // the memory file is of no use, or memory is short
};

struct RequestHeader {
  uint32_t length;  // bytes that follow this number
  uint8_t operation;
  uint8_t zero;
  uint16_t path_length;
};
static_assert(sizeof(RequestHeader) == 8);

struct ReplyHeader {
  uint32_t length;  // bytes that follow this number
  uint8_t status;
  uint8_t zero[3];
};
static_assert(sizeof(ReplyHeader) == 8);

constexpr size_t kLengthBytes = sizeof(uint32_t);
constexpr size_t kMaxRequestBytes = sizeof(RequestHeader) + kMaxPathBytes + kMaxValueBytes;
constexpr size_t kMaxReplyBytes = sizeof(ReplyHeader) + kMaxValueBytes;
constexpr size_t kMaxErrorBytes = 255;

struct Request {
  Operation operation;
  std::string_view path;
  std::string_view value;
  int document;  // the memory file that was passed, or -1
};

// The size of the request that starts with `bytes`: kMoreNeeded when they are too few to tell, kNoRequest
// when no request is that long or that short.
constexpr size_t kMoreNeeded = 0;
constexpr size_t kNoRequest = SIZE_MAX;
[[nodiscard]] size_t request_size(std::string_view bytes);

// Takes a whole request apart; the views point into `bytes`, and request.document is -1. Returns false when
// it is none.
[[nodiscard]] bool parse_request(std::string_view bytes, Request& request);

}  // namespace ktree

#endif
