#include "ktree/service.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <new>

#include "ktree/listing.h"
#include "ktree/settings_reader.h"
#include "ktree/settings_writer.h"

namespace ktree {
namespace {

// True for a memory file (memfd_create(2)) or a file of a memory file system, the only ones that answer
// F_GET_SEALS: reading and writing them never waits for a device or another process.
bool is_memory_file(int fd) {
  struct stat info = {};
  return fd >= 0 && fstat(fd, &info) == 0 && S_ISREG(info.st_mode) && fcntl(fd, F_GET_SEALS) >= 0;
}

// The same, emptied: a client whose reply was lost passes again a file that was filled already.
bool is_new_document(int fd) {
  return is_memory_file(fd) && ftruncate(fd, 0) == 0 && lseek(fd, 0, SEEK_SET) == 0;
}

}  // namespace

// A client that asks for more than the machine has must not cost the others their tree.
Service::Reply Service::handle(const Request& request) {
  try {
    return carry_out(request);
  } catch (const std::bad_alloc&) {
    return {ReplyStatus::kFailed, {}};
  }
}

Service::Reply Service::carry_out(const Request& request) {
  switch (request.operation) {
    case Operation::kGet:
      return get(request);
    case Operation::kSet:
      return set(request);
    case Operation::kDel:
      return del(request);
    case Operation::kDump:
      return dump(request);
    case Operation::kLoad:
      return load(request);
    case Operation::kList:
      return list(request);
    case Operation::kMirror:
      return mirror(request);
  }
  return {ReplyStatus::kRefused, {}};
}

Service::Reply Service::get(const Request& request) const {
  uint32_t wanted = 0;
  Path path;
  if (request.value.size() != sizeof wanted || !parse_path(request.path, path)) {
    return {ReplyStatus::kRefused, {}};
  }
  memcpy(&wanted, request.value.data(), sizeof wanted);
  const Node* node = tree_.find(path);
  if (node == nullptr || !node->has_value()) return {ReplyStatus::kMissing, {}};
  return {ReplyStatus::kDone, node->value().substr(0, wanted)};
}

Service::Reply Service::set(const Request& request) {
  Path path;
  const bool carried =
      request.value.size() <= kMaxValueBytes && request.value.find('\0') == std::string_view::npos;
  if (!carried || !parse_path(request.path, path) || !tree_.set(path, request.value)) {
    return {ReplyStatus::kRefused, {}};
  }
  mirror_.set(request.path, request.value);
  return {ReplyStatus::kDone, {}};
}

Service::Reply Service::del(const Request& request) {
  Path path;
  if (!request.value.empty() || !parse_path(request.path, path)) return {ReplyStatus::kRefused, {}};
  mirror_.before_removal(path);
  const bool removed = tree_.remove(path);
  mirror_.after_removal(path);
  return {removed ? ReplyStatus::kDone : ReplyStatus::kMissing, {}};
}

Service::Reply Service::dump(const Request& request) const {
  return {is_new_document(request.document) && write_settings(tree_, request.document) ? ReplyStatus::kDone
                                                                                       : ReplyStatus::kFailed,
          {}};
}

Service::Reply Service::load(const Request& request) {
  return is_memory_file(request.document) ? load_document(request.document) : Reply{ReplyStatus::kFailed, {}};
}

Service::Reply Service::load_document(int fd) {
  Tree loaded;
  if (!read_settings(fd, loaded, error_)) {
    return {ReplyStatus::kDamaged, std::string_view(error_).substr(0, kMaxErrorBytes)};
  }
  tree_.swap(loaded);
  mirror_.fill();
  return {ReplyStatus::kDone, {}};
}

Service::Reply Service::list(const Request& request) const {
  Path path;
  path.depth = 0;
  if (request.path != "/" && !parse_path(request.path, path)) return {ReplyStatus::kRefused, {}};
  const Node* node = tree_.find(path);
  if (node == nullptr) return {ReplyStatus::kMissing, {}};
  const bool written = is_new_document(request.document) && write_listing(*node, path, request.document);
  return {written ? ReplyStatus::kDone : ReplyStatus::kFailed, {}};
}

Service::Reply Service::mirror(const Request& request) {
  if (!request.path.empty() || !request.value.empty()) return {ReplyStatus::kRefused, {}};
  const int descriptor = mirror_.descriptor();
  return {descriptor < 0 ? ReplyStatus::kFailed : ReplyStatus::kDone, {}, descriptor};
}

}  // namespace ktree
