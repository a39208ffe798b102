// The frames of the tree's clients and what the daemon does with them, on any bytes.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "ktree/protocol.h"
#include "ktree/service.h"

using namespace ktree;

namespace {

void require(bool holds) {
  if (!holds) abort();
}

// Serves the frame at the start of `bytes` and takes it away. Returns false when a daemon would close the
// connection.
bool serve(Service& service, std::string_view& bytes, int document) {
  const size_t size = request_size(bytes);
  if (size == kMoreNeeded || size == kNoRequest || size > bytes.size()) {
    return false;
  }
  require(size <= kMaxRequestBytes);
  Request request = {};
  if (!parse_request(bytes.substr(0, size), request)) {
    return false;
  }
  request.document = document;
  const Service::Reply answer = service.handle(request);
  require(sizeof(ReplyHeader) + answer.body.size() <= kMaxReplyBytes);
  require(answer.body.empty() || answer.status == ReplyStatus::kDone ||
          answer.status == ReplyStatus::kDamaged);
  bytes.remove_prefix(size);
  return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::string_view bytes(reinterpret_cast<const char*>(data), size);
  Service service;
  const int document = memfd_create("fuzz", MFD_CLOEXEC);
  while (serve(service, bytes, document)) {
  }
  close(document);
  return 0;
}
