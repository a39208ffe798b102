#include "iscsi/discovered_names.h"

#include <cstdlib>
#include <cstring>

namespace remvol {

namespace {
constexpr size_t kFirstRoom = 16;
}

DiscoveredNames::~DiscoveredNames() {
  free(names_);
}

bool DiscoveredNames::add(const DiscoveredName& name) {
  if (size_ == room_) {
    const size_t room = room_ == 0 ? kFirstRoom : room_ * 2;
    auto* names = static_cast<DiscoveredName*>(reallocarray(names_, room, sizeof *names_));
    if (names == nullptr) return false;
    names_ = names;
    room_ = room;
  }
  names_[size_++] = name;
  return true;
}

void DiscoveredNames::sort() {
  if (size_ == 0) return;
  qsort(names_, size_, sizeof *names_, [](const void* a, const void* b) {
    return strcmp(static_cast<const DiscoveredName*>(a)->text, static_cast<const DiscoveredName*>(b)->text);
  });
}

}  // namespace remvol
