// What the daemon does with a request.
#pragma once

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
  [[nodiscard]] Answer handle(const Request& request);

 private:
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
