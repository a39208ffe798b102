// Regular expressions of the tests: POSIX extended ones, regex(7). With <regex>, each test would take longer
// to compile for it than for all else.
#ifndef FAKES_EXPRESSION_H
#define FAKES_EXPRESSION_H

#include <optional>
#include <string>
#include <vector>

namespace fakes {

struct Expression {
  std::string text;
};

// Where an expression was found.
struct Match {
  std::string before;
  std::vector<std::string> groups;  // the first is the whole match
  std::string after;
};

// The first and longest match in the text. Ends the program when the expression is none.
std::optional<Match> match(const Expression& expression, const std::string& text);

}  // namespace fakes

#endif
