#include "expression.h"

#include <regex.h>

#include <cstdio>
#include <cstdlib>

namespace fakes {

std::optional<Match> match(const Expression& expression, const std::string& text) {
  regex_t compiled;
  if (regcomp(&compiled, expression.text.c_str(), REG_EXTENDED) != 0) {
    fprintf(stderr, "'%s' is no expression\n", expression.text.c_str());
    abort();
  }
  std::vector<regmatch_t> places(compiled.re_nsub + 1);
  const bool fits = regexec(&compiled, text.c_str(), places.size(), places.data(), 0) == 0;
  regfree(&compiled);
  if (!fits) return std::nullopt;
  Match found;
  for (const auto& [from, to] : places) {
    found.groups.push_back(from < 0 ? ""
                                    : text.substr(static_cast<size_t>(from), static_cast<size_t>(to - from)));
  }
  found.before = text.substr(0, static_cast<size_t>(places[0].rm_so));
  found.after = text.substr(static_cast<size_t>(places[0].rm_eo));
  return found;
}

}  // namespace fakes
