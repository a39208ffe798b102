// What a shell offers after the words that were typed: only what exists.
#ifndef PLATFORM_VV_COMPLETION_H
#define PLATFORM_VV_COMPLETION_H

#include <string>
#include <vector>

namespace vv {

// The words that may stand in place of the last one of `words`, which are those behind the program's name;
// the last one may be empty. Names that a terminal cannot show as they are are left out.
std::vector<std::string> completions(const std::vector<std::string>& words);

}  // namespace vv

#endif
