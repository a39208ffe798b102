// The status as a table for a person.
#ifndef PLATFORM_VVSTAT_TABLE_H
#define PLATFORM_VVSTAT_TABLE_H

#include <string>

#include "status.h"

namespace vvstat {

struct Screen {
  bool colour = false;
  size_t columns = 0;  // lines are cut to it; 0: as long as they are
  size_t lines = 0;    // further lines are left out; 0: none
};

// The whole table, every line ended by a newline.
std::string table(const Status& status, const Screen& screen);

// A size as a person reads it, such as "1.5 GiB".
std::string readable_size(unsigned long long bytes);

}  // namespace vvstat

#endif
