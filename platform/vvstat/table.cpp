#include "table.h"

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string_view>

#include "utf8.h"

namespace vvstat {
namespace {

constexpr size_t kColumns = 6;
constexpr size_t kStatusColumn = 2;
constexpr size_t kBarWidth = 20;
constexpr std::string_view kGap = "  ";

constexpr char kGood[] = "\x1b[32m", kBusy[] = "\x1b[33m", kBad[] = "\x1b[31m", kPlain[] = "\x1b[0m";

struct Row {
  std::array<std::string, kColumns> cells;
  const char* colour;  // of the status; null for none
};

Row header() {
  return {{"TARGET / SHARE", "PORTAL / LUN", "STATUS", "USED", "SIZE", "USE"}, nullptr};
}

const char* colour_of(const Target& target) {
  if (is_connected(target)) return kGood;
  if (target.connect_state == 2 || target.connect_state == 3) return kBusy;
  return target.wanted ? kBad : nullptr;
}

const char* colour_of(const Volume& volume) {
  if (!volume.enabled) return nullptr;
  if (volume.format_state == kFormatRunning || volume.format_state == 4 || volume.volume_state == 1)
    return kBusy;
  if (volume.format_state == 3 || volume.volume_state == 3 || volume.volume_state == 5) return kBad;
  return volume.status.starts_with("Running") ? kGood : nullptr;
}

// The text that snprintf(format, ...) would print; short.
std::string formatted(const char* format, ...) __attribute__((format(printf, 1, 2)));

std::string formatted(const char* format, ...) {
  char text[64];
  va_list arguments;
  va_start(arguments, format);
  vsnprintf(text, sizeof text, format, arguments);
  va_end(arguments);
  return text;
}

std::string bar(int progress) {
  char cells[kBarWidth + 1];
  memset(cells, '-', kBarWidth);
  memset(cells, '#', kBarWidth * static_cast<size_t>(progress) / 100);
  cells[kBarWidth] = '\0';
  return formatted("[%s] %d%%", cells, progress);
}

std::string share_of_size(const Volume& volume) {
  if (volume.format_state == kFormatRunning) return bar(volume.progress);
  if (volume.size == 0) return "-";
  return formatted("%.0f%%", 100.0 * static_cast<double>(volume.used) / static_cast<double>(volume.size));
}

std::string or_dash(const std::string& text) {
  return text.empty() ? "-" : platform::printable(text);
}

Row row_of(const Target& target) {
  std::string portal = or_dash(target.address);
  portal += formatted(":%d", target.port);
  return {{platform::printable(target.name), portal, or_dash(target.status), "", "", ""}, colour_of(target)};
}

Row row_of(const Volume& volume) {
  std::string share(2, ' ');
  share += or_dash(volume.share);
  const bool sized = volume.size != 0;
  return {{share, formatted("LUN %d", volume.lun), or_dash(volume.status),
           sized ? readable_size(volume.used) : "-", sized ? readable_size(volume.size) : "-",
           share_of_size(volume)},
          colour_of(volume)};
}

std::vector<Row> rows_of(const Status& status) {
  std::vector<Row> rows{header()};
  for (const Target& target : status.targets) {
    rows.push_back(row_of(target));
    for (const Volume& volume : target.volumes) rows.push_back(row_of(volume));
  }
  return rows;
}

// The longest start of `text` that takes at most that many cells.
std::string_view fitting(std::string_view text, size_t columns) {
  if (platform::cells(text) <= columns) return text;
  size_t size = 0;
  while (size < text.size()) {
    size_t end = size + 1;
    while (end < text.size() && (static_cast<unsigned char>(text[end]) & 0xc0) == 0x80) ++end;
    const size_t width = platform::cells(text.substr(size, end - size));
    if (width > columns) break;
    columns -= width;
    size = end;
  }
  return text.substr(0, size);
}

std::string line_of(const Row& row, const std::array<size_t, kColumns>& widths, const Screen& screen) {
  std::string line;
  size_t left = screen.columns == 0 ? SIZE_MAX : screen.columns;
  size_t pending = 0;  // blanks that go before the next cell, if there is one
  for (size_t column = 0; column < kColumns && pending < left; ++column) {
    const std::string_view text = fitting(row.cells[column], left - pending);
    const size_t width = platform::cells(text);
    const bool coloured = screen.colour && column == kStatusColumn && row.colour != nullptr && !text.empty();
    if (!text.empty()) {
      line.append(pending, ' ');
      left -= pending + width;
      pending = 0;
    }
    line += coloured ? row.colour : "";
    line += text;
    line += coloured ? kPlain : "";
    pending += widths[column] - std::min(width, widths[column]) + kGap.size();
  }
  return line += "\n";
}

}  // namespace

std::string readable_size(unsigned long long bytes) {
  constexpr const char* kUnits[] = {"B", "KiB", "MiB", "GiB", "TiB", "PiB", "EiB"};
  auto size = static_cast<double>(bytes);
  size_t unit = 0;
  for (; size >= 1024 && unit + 1 < std::size(kUnits); ++unit) size /= 1024;
  const bool whole = unit == 0 || size >= 99.95;
  return whole ? formatted("%.0f %s", size, kUnits[unit]) : formatted("%.1f %s", size, kUnits[unit]);
}

std::string table(const Status& status, const Screen& screen) {
  if (status.targets.empty()) {
    const std::string_view text = "No targets are configured.";
    return std::string(fitting(text, screen.columns == 0 ? text.size() : screen.columns)) + "\n";
  }
  const std::vector<Row> rows = rows_of(status);
  std::array<size_t, kColumns> widths{};
  for (const Row& row : rows) {
    for (size_t column = 0; column < kColumns; ++column) {
      widths[column] = std::max(widths[column], platform::cells(row.cells[column]));
    }
  }
  std::string text;
  const size_t shown = screen.lines == 0 ? rows.size() : std::min(rows.size(), screen.lines);
  for (size_t row = 0; row < shown; ++row) text += line_of(rows[row], widths, screen);
  return text;
}

}  // namespace vvstat
