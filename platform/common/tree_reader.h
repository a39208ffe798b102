// Reading of single values of the volumes' configuration tree, for programs that only look.
#ifndef PLATFORM_COMMON_TREE_READER_H
#define PLATFORM_COMMON_TREE_READER_H

#include <map>
#include <string>
#include <string_view>

#include "common/tree_listing.h"

namespace platform {

// The values of a listing by their paths.
class TreeReader {
 public:
  // Asks the daemon for the targets and volumes; it has five seconds to answer.
  TreeReader() : TreeReader(remvol::kVolumesSocket, remvol::key::kInitiator) {}

  // Asks the daemon on `socket` for what is below `root`.
  TreeReader(const char* socket, const char* root) : listing_(socket, root) { index(); }

  // Takes the values from a listing, as `ktreec -t` prints it; a line that is none is left out.
  explicit TreeReader(std::string_view listing) : listing_(listing) { index(); }

  // True when the daemon answered; without an answer there are no values.
  bool answered() const { return listing_.answered(); }

  // The value at the path that printf(format, ...) would print, of 127 bytes at most; empty when there is
  // none.
  std::string value(const char* format, ...) const __attribute__((format(printf, 2, 3)));

  // The same as a number; `fallback` when there is none.
  int number(int fallback, const char* format, ...) const __attribute__((format(printf, 3, 4)));

 private:
  void index();
  std::string read(const char* path) const;

  TreeListing listing_;
  std::map<std::string_view, std::string> values_;
};

}  // namespace platform

#endif
