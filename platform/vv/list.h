// Lists in a sentence.
#ifndef PLATFORM_VV_LIST_H
#define PLATFORM_VV_LIST_H

#include <string>
#include <string_view>

namespace vv {

// Appends `item` to `list`, with the separator between the two when the list is not empty.
inline void append(std::string& list, std::string_view item, std::string_view separator = ", ") {
  if (!list.empty()) list += separator;
  list += item;
}

}  // namespace vv

#endif
