// The report again and again, in place on a terminal.
#ifndef PLATFORM_VVSTAT_WATCH_H
#define PLATFORM_VVSTAT_WATCH_H

#include <functional>
#include <string>

namespace vvstat {

// A report in two parts; of the first one lines may be left out where the screen is too small.
struct Page {
  std::string table;  // with headings in its first line
  std::string verdict;
};

// Calls `make(width)` every second, with the terminal's width, or 0 without a terminal, and shows the page,
// until a signal ends it, "q" is typed, or nobody reads any more. On a terminal it uses the other screen;
// both are as before at the end. Without one, pages follow each other.
void watch(const std::function<Page(size_t width)>& make);

}  // namespace vvstat

#endif
