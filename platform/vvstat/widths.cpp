#include "vvstat/widths.h"

#include <algorithm>

namespace vvstat {

std::vector<size_t> fitting_widths(const std::vector<Wish>& wishes, size_t width) {
  std::vector<size_t> widths(wishes.size(), 0);
  size_t taken = 0, count = 0;
  for (; count < wishes.size(); count++) {
    const size_t more = wishes[count].least + (count > 0 ? 1 : 0);
    if (count > 0 && taken + more > width) break;
    taken += more;
    widths[count] = wishes[count].least;
  }
  if (count > 0) widths[0] = std::min(widths[0], std::max<size_t>(1, width));
  size_t room = width - std::min(width, taken);
  for (size_t at = 0; at < count; at++) {
    const size_t more = std::min(room, wishes[at].natural - wishes[at].least);
    widths[at] += more;
    room -= more;
  }
  return widths;
}

}  // namespace vvstat
