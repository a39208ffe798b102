#include "log_lines.h"

#include <sstream>

#include "fakes.h"
#include "frontend/log.h"

namespace fakes {

std::vector<std::string> logged(int level, const std::function<void()>& function) {
  const Expression prefix{R"(^\(([^:()]+):([^:()]+):[1-9][0-9]*\): )"};
  const int before = remvol::debug_level;
  remvol::debug_level = level;
  std::istringstream text(output_of(function));
  remvol::debug_level = before;
  std::vector<std::string> found;
  for (std::string line; std::getline(text, line);) {
    const std::optional<Match> part = match(prefix, line);
    found.push_back(part ? part->groups[1] + ":" + part->groups[2] + ": " + part->after : line);
  }
  return found;
}

}  // namespace fakes
