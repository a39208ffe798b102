// The C interface of the client library.

#include "ktreec.h"

#include <cerrno>

#include "ktree/client/calls.h"

#define KTREEC_EXPORT extern "C" __attribute__((visibility("default")))

using ktree::client::CallResult;
using ktree::client::Reason;

namespace {

int c_result(CallResult result) {
  return result == CallResult::kDone ? 0 : -1;
}

}  // namespace

KTREEC_EXPORT int ktreec_set(const char* socket, unsigned, const char* path, const char* value) {
  return path == nullptr || value == nullptr ? -1 : c_result(ktree::client::set(socket, path, value));
}

KTREEC_EXPORT int ktreec_get_wb(const char* socket, unsigned, const char* path, char* buffer, size_t size) {
  if (buffer == nullptr || size == 0) return -1;
  size_t received = 0;
  const CallResult result =
      path == nullptr ? CallResult::kRefused : ktree::client::get(socket, path, buffer, size - 1, received);
  buffer[result == CallResult::kDone ? received : 0] = '\0';
  if (result == CallResult::kMissing) errno = ENODATA;
  return result == CallResult::kDone ? static_cast<int>(received) : -1;
}

KTREEC_EXPORT int ktreec_del(const char* socket, unsigned, const char* path) {
  return path == nullptr ? -1 : c_result(ktree::client::del(socket, path));
}

KTREEC_EXPORT int ktreec_dump(const char* socket, unsigned, const char* file) {
  Reason reason;
  return file == nullptr ? -1 : c_result(ktree::client::dump(socket, file, reason));
}

KTREEC_EXPORT int ktreec_load(const char* socket, unsigned, const char* file) {
  Reason reason;
  return file == nullptr ? -1 : c_result(ktree::client::load(socket, file, reason));
}
