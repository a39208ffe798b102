#include "iscsi/discovered_names.h"

#include <algorithm>
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
  std::sort(names_, names_ + size_,
            [](const DiscoveredName& a, const DiscoveredName& b) { return strcmp(a.text, b.text) < 0; });
}

}  // namespace remvol
