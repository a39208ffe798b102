// Long lines on a narrow screen.
#ifndef PLATFORM_VVSTAT_FOLDING_H
#define PLATFORM_VVSTAT_FOLDING_H

#include <cstddef>
#include <string>
#include <string_view>

namespace vvstat {

// Cells before a line: of the first one, and of those that it is folded to.
struct Indents {
  size_t first = 0, further = 0;
};

// The sentence in lines of at most `width` cells, each ended by a newline: it is folded between words, and a
// word that is longer than a line is broken. A screen of less than 20 cells has no indents. The text is
// printable, see platform::printable().
std::string folded(std::string_view text, Indents indents, size_t width);

// The same for a command, which means the same to a shell when all of its lines are copied. Words with other
// characters than letters, digits and marks without a meaning are quoted as quoted() does it. Below 8 cells a
// line may be longer.
std::string folded_command(std::string_view command, Indents indents, size_t width);

}  // namespace vvstat

#endif
