// How many cells the columns of a table have on a screen that has not enough for all.
#ifndef PLATFORM_VVSTAT_WIDTHS_H
#define PLATFORM_VVSTAT_WIDTHS_H

#include <cstddef>
#include <vector>

namespace vvstat {

struct Wish {
  size_t least;    // cells below which the column is of no use
  size_t natural;  // that it takes as it is; not less
};

// The widths of columns in the order of their importance, with a blank between each two in a line of `width`
// cells. The least important ones are cut first, down to their least; where that is not enough they are left
// out: their width is 0. The first one is cut to the line.
std::vector<size_t> fitting_widths(const std::vector<Wish>& wishes, size_t width);

}  // namespace vvstat

#endif
