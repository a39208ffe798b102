#include "ktree/protocol.h"

#include <cstring>

namespace ktree {

size_t request_size(std::string_view bytes) {
  uint32_t length = 0;
  if (bytes.size() < sizeof length) return kMoreNeeded;
  memcpy(&length, bytes.data(), sizeof length);
  const size_t size = sizeof length + size_t{length};
  return size < sizeof(RequestHeader) || size > kMaxRequestBytes ? kNoRequest : size;
}

bool parse_request(std::string_view bytes, Request& request) {
  RequestHeader header = {};
  if (bytes.size() < sizeof header || request_size(bytes) != bytes.size()) return false;
  memcpy(&header, bytes.data(), sizeof header);
  bytes.remove_prefix(sizeof header);
  if (header.operation < static_cast<uint8_t>(Operation::kGet) ||
      header.operation > static_cast<uint8_t>(Operation::kMirror) || header.zero != 0 ||
      header.path_length > bytes.size()) {
    return false;
  }
  request.operation = static_cast<Operation>(header.operation);
  request.path = bytes.substr(0, header.path_length);
  request.value = bytes.substr(header.path_length);
  request.document = -1;
  return true;
}

}  // namespace ktree
