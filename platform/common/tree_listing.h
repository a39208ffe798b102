// All values of a configuration tree below one path, one after the other.
#ifndef PLATFORM_COMMON_TREE_LISTING_H
#define PLATFORM_COMMON_TREE_LISTING_H

#include <algorithm>
#include <string>
#include <string_view>

#include "tree_layout.h"

namespace platform {

// A listing as `ktreec -t` prints it: of one moment, fetched with one request, and read where the daemon put
// it.
class TreeListing {
 public:
  // Asks the daemon for the targets and volumes; it has five seconds to answer.
  TreeListing() : TreeListing(remvol::kVolumesSocket, remvol::key::kInitiator) {}

  // Asks the daemon on `socket` for what is below `root`.
  TreeListing(const char* socket, const char* root);

  // Takes the values from a listing that is there already.
  explicit TreeListing(std::string_view listing) : copy_(listing), text_(copy_) {}

  TreeListing(const TreeListing&) = delete;
  TreeListing& operator=(const TreeListing&) = delete;
  ~TreeListing();

  // True when the daemon answered; without an answer there are no values.
  bool answered() const { return answered_; }

  // Calls `take(path, value)` for every value, children in the order in which they were made: all that is
  // below a node follows it at once. Both are std::string_view; the path's text lives as long as the object,
  // the value's until the next call. A line that is none is left out.
  template <typename Take>
  void for_each(Take take) const {
    const bool is_plain = text_.find('\\') == std::string_view::npos;
    std::string room;
    for (std::string_view rest = text_; !rest.empty();) {
      const std::string_view line = rest.substr(0, rest.find('\n'));
      rest.remove_prefix(std::min(line.size() + 1, rest.size()));
      const size_t equals = line.find('=');
      if (equals == std::string_view::npos) continue;
      const std::string_view value = line.substr(equals + 1);
      take(line.substr(0, equals), is_plain ? value : unescaped(value, room));
    }
  }

 private:
  // The value as it is in the tree; `room` is for one that has an escape.
  static std::string_view unescaped(std::string_view value, std::string& room);

  std::string copy_;       // of a listing that was there already
  std::string_view text_;  // else a mapping
  bool answered_ = true;
};

}  // namespace platform

#endif
