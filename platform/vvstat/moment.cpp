#include "vvstat/moment.h"

namespace vvstat {
namespace {

struct MomentParts {
  std::string date, minutes, clock, offset;  // "2026-11-21", "12:34", "12:34:56", "+01:00"
};

// A moment that no calendar has is the zeroth of January.
MomentParts parts_of(time_t moment) {
  struct tm parts {};
  if (localtime_r(&moment, &parts) == nullptr) parts = {};
  char date[32] = "", clock[16] = "", offset[16] = "";
  strftime(date, sizeof date, "%F", &parts);
  strftime(clock, sizeof clock, "%H:%M:%S", &parts);
  strftime(offset, sizeof offset, "%z", &parts);
  const std::string hours(offset);
  const std::string text(clock);
  return {date, text.substr(0, 5), text, hours.substr(0, 3) + ":" + hours.substr(3)};
}

}  // namespace

std::string clock_of(time_t moment) {
  return parts_of(moment).clock;
}

std::string since_text(time_t moment, time_t now) {
  const MomentParts parts = parts_of(moment);
  return parts.date == parts_of(now).date ? parts.clock : parts.date + " " + parts.minutes;
}

std::string date_and_clock(time_t moment) {
  const MomentParts parts = parts_of(moment);
  return moment == 0 ? std::string() : parts.date + " " + parts.clock;
}

std::string date_for_programs(time_t moment) {
  const MomentParts parts = parts_of(moment);
  return moment == 0 ? std::string() : parts.date + "T" + parts.clock + parts.offset;
}

}  // namespace vvstat
