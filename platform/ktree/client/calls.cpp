#include "ktree/client/calls.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace ktree::client {
namespace {

// A call without a body in its reply.
Call plain_call(Operation operation, std::string_view path, std::string_view value, int document) {
  return {operation, path, value, document, nullptr, 0, 0};
}

CallResult file_result(int error, Reason& reason) {
  if (error == 0) return CallResult::kDone;
  snprintf(reason.text, sizeof reason.text, "%s", strerror(error));
  return CallResult::kFailed;
}

// Lets the daemon fill `document`.
CallResult fetch(const char* socket, Operation operation, const char* path, const MemoryFile& document,
                 Reason& reason) {
  if (document.fd() < 0) return file_result(errno, reason);
  Call call = plain_call(operation, path, {}, document.fd());
  const CallResult result = request(socket, call);
  return result == CallResult::kFailed ? file_result(EIO, reason) : result;
}

}  // namespace

CallResult set(const char* socket, const char* path, const char* value) {
  Call call = plain_call(Operation::kSet, path, value, -1);
  return request(socket, call);
}

CallResult del(const char* socket, const char* path) {
  Call call = plain_call(Operation::kDel, path, {}, -1);
  return request(socket, call);
}

CallResult get(const char* socket, const char* path, char* buffer, size_t room, size_t& size) {
  const auto wanted = static_cast<uint32_t>(room < kMaxValueBytes ? room : kMaxValueBytes);
  Call call = {Operation::kGet, path, {reinterpret_cast<const char*>(&wanted), sizeof wanted}, -1, buffer,
               wanted,          0};
  const CallResult result = request(socket, call);
  size = call.size;
  return result;
}

CallResult dump(const char* socket, const char* file, Reason& reason) {
  reason.text[0] = '\0';
  const MemoryFile document;
  const CallResult result = fetch(socket, Operation::kDump, "", document, reason);
  return result == CallResult::kDone ? file_result(document.replace_file(file), reason) : result;
}

CallResult dump_to(const char* socket, int fd, Reason& reason) {
  reason.text[0] = '\0';
  const MemoryFile document;
  const CallResult result = fetch(socket, Operation::kDump, "", document, reason);
  return result == CallResult::kDone ? file_result(document.write_to(fd), reason) : result;
}

CallResult list(const char* socket, const char* path, const MemoryFile& document, Reason& reason) {
  reason.text[0] = '\0';
  return fetch(socket, Operation::kList, path, document, reason);
}

CallResult list_to(const char* socket, const char* path, int fd, Reason& reason) {
  const MemoryFile document;
  const CallResult result = list(socket, path, document, reason);
  return result == CallResult::kDone ? file_result(document.write_to(fd), reason) : result;
}

CallResult load(const char* socket, const char* file, Reason& reason) {
  reason.text[0] = '\0';
  const MemoryFile document;
  const int wrong = document.fd() < 0 ? errno : document.read_from(file);
  if (wrong != 0) return file_result(wrong, reason);
  Call call = {Operation::kLoad, {}, {}, document.fd(), reason.text, kMaxErrorBytes, 0};
  const CallResult result = request(socket, call);
  reason.text[call.size] = '\0';
  return result == CallResult::kFailed ? file_result(EIO, reason) : result;
}

}  // namespace ktree::client
