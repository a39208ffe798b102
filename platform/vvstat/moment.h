// Moments as a report shows them, in local time.
#ifndef PLATFORM_VVSTAT_MOMENT_H
#define PLATFORM_VVSTAT_MOMENT_H

#include <ctime>
#include <string>

namespace vvstat {

// "12:34:56".
std::string clock_of(time_t moment);

// As people say it `now`: the clock of the same day, else "2026-11-21 12:34".
std::string since_text(time_t moment, time_t now);

// "2026-11-21 12:34:56"; empty for 0.
std::string date_and_clock(time_t moment);

// "2026-11-21T12:34:56+0100" with a colon in the offset, as RFC 3339 has it; empty for 0.
std::string date_for_programs(time_t moment);

}  // namespace vvstat

#endif
