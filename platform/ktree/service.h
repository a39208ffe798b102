// What the daemon does with a request.
#ifndef PLATFORM_KTREE_SERVICE_H
#define PLATFORM_KTREE_SERVICE_H

#include <string>

#include "ktree/protocol.h"
#include "ktree/tree.h"

namespace ktree {

class Service {
 public:
  // Carries `request` out. The returned body belongs to the reply and stays valid until the next call.
  struct Answer {
    Status status;
    std::string_view body;
  };
  // When memory is short the answer is Status::kFailed, and the tree is as it was.
  [[nodiscard]] Answer handle(const Request& request);

  // Makes the tree what the settings file in `fd` holds, or leaves it as it was. Throws std::bad_alloc when
  // memory is short.
  [[nodiscard]] Answer load_document(int fd);

 private:
  Answer carry_out(const Request& request);
  Answer get(const Request& request) const;
  Answer set(const Request& request);
  Answer del(const Request& request);
  Answer dump(const Request& request) const;
  Answer load(const Request& request);
  Answer list(const Request& request) const;

  Tree tree_;
  std::string error_;
};

}  // namespace ktree

#endif
