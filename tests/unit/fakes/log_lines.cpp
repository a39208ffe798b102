#include "log_lines.h"

#include <regex>
#include <sstream>

#include "fakes.h"
#include "frontend/log.h"

namespace fakes {

std::vector<std::string> logged(int level, const std::function<void()>& function) {
  static const std::regex prefix(R"(^\(([^:()]+):([^:()]+):[1-9][0-9]*\): )");
  const int before = remvol::debug_level;
  remvol::debug_level = level;
  std::istringstream text(output_of(function));
  remvol::debug_level = before;
  std::vector<std::string> found;
  for (std::string line; std::getline(text, line);) {
    found.push_back(std::regex_replace(line, prefix, "$1:$2: "));
  }
  return found;
}

}  // namespace fakes
