#include "vvstat/verdict.h"

#include <string_view>

#include "common/utf8.h"
#include "vvstat/folding.h"
#include "vvstat/moment.h"

namespace vvstat {
namespace {

struct Counts {
  size_t wanted = 0, ailing = 0;
};

Counts count(const std::vector<Row>& rows) {
  Counts counts;
  for (const Row& row : rows) {
    counts.wanted += row.wanted ? 1 : 0;
    counts.ailing += row.healthy() ? 0 : 1;
  }
  return counts;
}

std::string summary(const std::vector<Row>& rows, time_t now) {
  const Counts counts = count(rows);
  if (rows.empty()) return "no volumes are configured, as of " + clock_of(now);
  std::string text;
  if (counts.ailing != 0) {
    text = std::to_string(counts.ailing) + " of " + std::to_string(counts.wanted) +
           (counts.ailing == 1 ? " needs attention" : " need attention");
  } else if (counts.wanted != 0) {
    text = "all " + std::to_string(counts.wanted) + " healthy";
  } else {
    text = "nothing is wanted";
  }
  const size_t idle = rows.size() - counts.wanted;
  if (idle != 0 && counts.wanted != 0) text += ", " + std::to_string(idle) + " not wanted";
  return text + ", as of " + clock_of(now);
}

std::string name_of(const Row& row) {
  return platform::printable(row.volume != nullptr ? row.volume->share : row.target->name);
}

std::string complaint(const Row& row, time_t now) {
  std::string text = name_of(row) + ": " + row.problem.what;
  if (row.since != 0) text += " (since " + since_text(row.since, now) + ")";
  return text + "; " + row.problem.advice;
}

}  // namespace

std::string verdict(const std::vector<Row>& rows, time_t now, size_t width) {
  std::string text = folded(summary(rows, now), {}, width);
  for (const Row& row : rows) {
    if (row.healthy()) continue;
    text += folded(complaint(row, now), {2, 4}, width);
    const std::string command = platform::printable(row.problem.command);
    if (!command.empty()) text += folded_command(command, {4, 6}, width);
  }
  return text;
}

}  // namespace vvstat
