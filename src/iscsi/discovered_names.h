// The names that a portal offers. They come from a remote machine: as many as it sends.
#ifndef REMVOL_ISCSI_DISCOVERED_NAMES_H
#define REMVOL_ISCSI_DISCOVERED_NAMES_H

#include <cstddef>

#include "iscsi/session_listing.h"

namespace remvol {

struct DiscoveredName {
  char text[kListingLineSize];
};

class DiscoveredNames {
 public:
  DiscoveredNames() = default;
  DiscoveredNames(const DiscoveredNames&) = delete;
  DiscoveredNames& operator=(const DiscoveredNames&) = delete;
  ~DiscoveredNames();

  // Appends `name`. Returns false when memory is short; the names are as they were then.
  [[nodiscard]] bool add(const DiscoveredName& name);

  void sort();

  size_t size() const { return size_; }
  const DiscoveredName* begin() const { return names_; }
  const DiscoveredName* end() const { return names_ + size_; }

 private:
  DiscoveredName* names_ = nullptr;
  size_t size_ = 0;
  size_t room_ = 0;
};

}  // namespace remvol

#endif
