// Paths of the configuration tree.
//
// A path is a slash and elements joined by slashes. An element is a name, or a name, a colon and a number
// from 1 to 4096; a bare name means 1. A name is [A-Za-z_][A-Za-z0-9_.-]*. A path is at most 1,023 bytes.
#ifndef PLATFORM_KTREE_PATH_H
#define PLATFORM_KTREE_PATH_H

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "ktree/limits.h"

namespace ktree {

// Neither this record nor the next one sets anything by itself: a path is taken apart in every request, and
// has a few elements out of the many that it may have.
struct Element {
  const char* text;
  uint16_t length;
  uint16_t number;

  [[nodiscard]] std::string_view name() const { return {text, length}; }
};

// A path taken apart. The names point into the text that was parsed.
struct Path {
  std::array<Element, kMaxDepth> elements;
  size_t depth;
};

// True when `text` may name a node.
[[nodiscard]] bool valid_name(std::string_view text);

// Takes `text` apart into `path`. Returns false when it is not a path; `path` is then of no use. Numbers are
// decimal without leading zeros.
[[nodiscard]] bool parse_path(std::string_view text, Path& path);

// Digits that ":N" adds to an element in its shortest spelling: none for 1.
[[nodiscard]] size_t number_length(size_t number);

}  // namespace ktree

#endif
