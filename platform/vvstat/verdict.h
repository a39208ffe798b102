// The verdict below the table: how many volumes are well, and for the others what is wrong and what to do.
#ifndef PLATFORM_VVSTAT_VERDICT_H
#define PLATFORM_VVSTAT_VERDICT_H

#include <ctime>
#include <string>
#include <vector>

#include "vvstat/health.h"

namespace vvstat {

// The first line is such as "all 8 healthy, as of 12:34:56" or "2 of 8 need attention, as of 12:34:56"; below
// it stand, for each of these, what is wrong, since when, and what to do. No line is longer than `width`
// cells; a command that is folded is still one for a shell. Every line is ended by a newline.
std::string verdict(const std::vector<Row>& rows, time_t now, size_t width);

}  // namespace vvstat

#endif
