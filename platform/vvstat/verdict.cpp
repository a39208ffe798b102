#include "vvstat/verdict.h"

#include <string_view>

#include "common/utf8.h"
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

// Folds `text` between words; further lines begin with `indent` blanks.
std::string folded(std::string_view text, size_t indent, size_t width) {
  std::string out;
  size_t column = 0;
  bool first = true;  // of its line
  for (size_t at = 0; at < text.size();) {
    const std::string_view word = text.substr(at, text.find(' ', at) - at);
    const size_t cells = platform::cells(word);
    if (!first && column + 1 + cells > width) {
      out += '\n';
      out.append(indent, ' ');
      column = indent;
      first = true;
    }
    if (!first) out += ' ';
    column += cells + (first ? 0 : 1);
    out += word;
    first = false;
    at += word.size() + 1;
  }
  return out += '\n';
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
  std::string text = folded(summary(rows, now), 0, width);
  for (const Row& row : rows) {
    if (row.healthy()) continue;
    text += "  " + folded(complaint(row, now), 4, width - 2);
    if (!row.problem.command.empty()) text += "    " + platform::printable(row.problem.command) + "\n";
  }
  return text;
}

}  // namespace vvstat
