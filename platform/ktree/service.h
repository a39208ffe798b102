// What the daemon does with a request.
#ifndef PLATFORM_KTREE_SERVICE_H
#define PLATFORM_KTREE_SERVICE_H

#include <string>

#include "ktree/mirror_writer.h"
#include "ktree/protocol.h"
#include "ktree/tree.h"

namespace ktree {

class Service {
 public:
  // Carries `request` out. The returned body belongs to the reply and stays valid until the next call.
  struct Reply {
    ReplyStatus status;
    std::string_view body;
    int descriptor = -1;  // to be passed with the reply; it stays the service's
  };
  // When memory is short the answer is ReplyStatus::kFailed, and the tree is as it was.
  [[nodiscard]] Reply handle(const Request& request);

  // Makes the tree what the settings file in `fd` holds, or leaves it as it was. Throws std::bad_alloc when
  // memory is short.
  [[nodiscard]] Reply load_document(int fd);

 private:
  Reply carry_out(const Request& request);
  Reply get(const Request& request) const;
  Reply set(const Request& request);
  Reply del(const Request& request);
  Reply dump(const Request& request) const;
  Reply load(const Request& request);
  Reply list(const Request& request) const;
  Reply mirror(const Request& request);

  Tree tree_;
  MirrorWriter mirror_{tree_};
  std::string error_;
};

}  // namespace ktree

#endif
