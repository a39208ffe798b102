// Reading of the volumes' configuration tree for programs that only look.
#ifndef PLATFORM_COMMON_TREE_READER_H
#define PLATFORM_COMMON_TREE_READER_H

#include <functional>
#include <map>
#include <string>
#include <string_view>

#include "tree_layout.h"

namespace platform {

// Everything of a tree below one path at one moment, fetched with one request.
class TreeReader {
 public:
  // Asks the daemon for the targets and volumes; it has five seconds to answer.
  TreeReader() : TreeReader(remvol::kVolumesSocket, remvol::key::kInitiator) {}

  // Asks the daemon on `socket` for what is below `root`.
  TreeReader(const char* socket, const char* root);

  // Takes the values from a listing, as `ktreec -t` prints it; a line that is none is left out.
  explicit TreeReader(std::string_view listing);

  // True when the daemon answered; without an answer there are no values.
  bool answered() const { return answered_; }

  // The value at the path that printf(format, ...) would print, of 127 bytes at most; empty when there is
  // none.
  std::string value(const char* format, ...) const __attribute__((format(printf, 2, 3)));

  // The same as a number; `fallback` when there is none.
  int number(int fallback, const char* format, ...) const __attribute__((format(printf, 3, 4)));

 private:
  void take(std::string_view listing);
  std::string read(const char* path) const;

  bool answered_ = true;
  std::map<std::string, std::string, std::less<>> values_;
};

}  // namespace platform

#endif
