#include "vvstat/columns.h"

#include <locale.h>
#include <strings.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <iterator>

#include "common/utf8.h"
#include "tree_layout.h"
#include "vvstat/folding.h"
#include "vvstat/moment.h"
#include "vvstat/table.h"
#include "vvstat/widths.h"

namespace vvstat {
namespace {

constexpr char kGood[] = "\x1b[32m", kBad[] = "\x1b[31m";

std::string flag(bool yes) {
  return yes ? "1" : "0";
}

std::string word(bool known, const std::string& text) {
  return known ? text : std::string();
}

std::string size_text(unsigned long long bytes, const Row& row, const Layout& layout) {
  if (!row.mounted) return {};
  return layout.bytes ? std::to_string(bytes) : readable_size(bytes);
}

std::string moment_text(time_t moment, const Layout& layout) {
  return layout.form == Form::kTable ? date_and_clock(moment) : date_for_programs(moment);
}

std::string percent(const Row& row) {
  if (row.size == 0) return {};
  const int used =
      static_cast<int>(100.0 * static_cast<double>(row.used) / static_cast<double>(row.size) + 0.5);
  return std::to_string(used);
}

struct Column {
  const char* name;
  const char* what;
  size_t least;  // cells, which a text that is cut keeps; 0: it is never cut
  Kind kind;
  bool right;
  std::string (*text)(const Row& row, const Layout& layout);
  Extent extent = Extent::kHealth;  // of the facts that tell it
};

constexpr Kind kText = Kind::kText, kNumber = Kind::kNumber, kFlag = Kind::kFlag;

constexpr size_t kNameWidth = 13;  // more than the longest name has

// The first ones are the usual ones of a table.
constexpr size_t kUsual = 7;
constexpr size_t kShare = 0, kStatus = 1, kTarget = 7;
constexpr size_t kFirst = 2;  // of these, share and status, nothing else is as important

constexpr Column kColumns[] = {
    {"SHARE", "the volume's share name", 12, kText, false,
     [](const Row& row, const Layout&) { return row.volume != nullptr ? row.volume->share : ""; }},
    {"STATUS", "how it is now", 14, kText, false, [](const Row& row, const Layout&) { return row.status; }},
    {"USED", "space that is taken", 0, kNumber, true,
     [](const Row& row, const Layout& layout) { return size_text(row.used, row, layout); }},
    {"SIZE", "size of the file system", 0, kNumber, true,
     [](const Row& row, const Layout& layout) { return size_text(row.size, row, layout); }},
    {"USE%", "the part of it that is taken, in percent", 0, kNumber, true,
     [](const Row& row, const Layout&) { return percent(row); }},
    {"LUN", "its number on the target", 0, kNumber, true,
     [](const Row& row, const Layout&) {
       return row.volume != nullptr ? std::to_string(row.volume->lun) : std::string();
     }},
    {"PORTAL", "address and port of the target's portal, as it is stored", 13, kText, false,
     [](const Row& row, const Layout&) {
       return word(!row.target->address.empty(),
                   row.target->address + ":" + std::to_string(row.target->port));
     }},
    {"TARGET", "the target's name", 20, kText, false,
     [](const Row& row, const Layout&) { return row.target->name; }},
    {"HEALTHY", "nothing is wrong, or it is not wanted", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.healthy()); }},
    {"WANTED", "it should be connected, and is not switched off", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.wanted); }},
    {"PROBLEM", "what is wrong", 24, kText, false,
     [](const Row& row, const Layout&) { return row.problem.what; }},
    {"ADVICE", "what to do about it", 24, kText, false,
     [](const Row& row, const Layout&) { return row.problem.advice; }},
    {"COMMAND", "the command that does it", 24, kText, false,
     [](const Row& row, const Layout&) { return row.problem.command; }},
    {"SINCE", "since when it is healthy, or not", 0, kText, false,
     [](const Row& row, const Layout& layout) { return moment_text(row.since, layout); }},
    {"LAST-ERROR", "what was wrong with it last", 24, kText, false,
     [](const Row& row, const Layout&) { return row.error; }},
    {"ERROR-TIME", "when that began", 0, kText, false,
     [](const Row& row, const Layout& layout) { return moment_text(row.error_time, layout); }},
    {"MOUNTED", "its file system is mounted", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.mounted); }},
    {"RO", "it cannot be written", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.read_only); }},
    {"MOUNTPOINT", "where it is mounted", 12, kText, false,
     [](const Row& row, const Layout&) {
       return row.volume != nullptr ? row.volume->mount_point : std::string();
     }},
    {"OPTIONS", "the options that it is mounted with", 12, kText, false,
     [](const Row& row, const Layout&) { return row.options; }, Extent::kAll},
    {"DEVICE", "name of its disk", 0, kText, false,
     [](const Row& row, const Layout&) {
       return row.volume != nullptr ? row.volume->device : std::string();
     }},
    {"FSTYPE", "type of its file system", 0, kText, false,
     [](const Row& row, const Layout&) {
       return row.volume != nullptr ? row.volume->file_system : std::string();
     }},
    {"PROGRESS", "percent of a format that is under way", 0, kNumber, true,
     [](const Row& row, const Layout&) {
       const bool runs = row.volume != nullptr && row.volume->format_state == remvol::kFormatting;
       return word(runs, runs ? std::to_string(row.volume->progress) : "");
     }},
    {"SESSION", "the kernel's word for the session's state", 0, kText, false,
     [](const Row& row, const Layout&) { return row.session; }},
    {"ADDRESS", "the address that the session is connected with", 12, kText, false,
     [](const Row& row, const Layout&) { return row.address; }, Extent::kAll},
    {"TREE-STATUS", "the volume's status as the configuration tree has it", 14, kText, false,
     [](const Row& row, const Layout&) {
       return row.volume != nullptr ? row.volume->status : std::string();
     }},
    {"TREE-TARGET", "the target's status as the configuration tree has it", 14, kText, false,
     [](const Row& row, const Layout&) { return row.target->status; }},
    {"OTHERWISE", "how the configuration tree has it, where that is not how it is", 24, kText, false,
     [](const Row& row, const Layout&) { return row.otherwise; }},
};

// Whether the C library knows more than ASCII. It is asked where there is more to show: a locale is read from
// a file.
bool has_utf8() {
  static const bool known = (use_utf8(), MB_CUR_MAX > 1);
  return known;
}

// The text as it may stand in a cell.
std::string cell(const Column& column, const Row& row, const Layout& layout) {
  const std::string text = platform::printable(column.text(row, layout));
  return platform::is_ascii(text) || has_utf8() ? text : platform::ascii(text);
}

size_t find_column(std::string_view name) {
  size_t at = 0;
  while (at < std::size(kColumns) && (name.size() != std::string_view(kColumns[at].name).size() ||
                                      strncasecmp(name.data(), kColumns[at].name, name.size()) != 0)) {
    at++;
  }
  return at;
}

std::vector<size_t> first_columns(size_t count) {
  std::vector<size_t> columns;
  for (size_t at = 0; at < count; at++) columns.push_back(at);
  return columns;
}

// A column with its texts.
struct Content {
  size_t number;
  size_t width;  // of the widest text, and of the name
  TableColumn shown;
};

Content content_of(const std::vector<Row>& rows, size_t number, const Layout& layout) {
  const Column& column = kColumns[number];
  Content content{number, std::string_view(column.name).size(), {column.name, column.kind, column.right}};
  content.shown.cells.reserve(rows.size());
  for (const Row& row : rows) {
    std::string text = cell(column, row, layout);
    const size_t width = platform::cells(text);
    content.width = std::max(content.width, width);
    content.shown.cells.push_back({std::move(text), width});
  }
  return content;
}

std::vector<const char*> colours_of(const std::vector<Row>& rows) {
  std::vector<const char*> colours;
  for (const Row& row : rows) colours.push_back(!row.wanted ? nullptr : row.healthy() ? kGood : kBad);
  return colours;
}

// Share and status have their cells in any case: they are there again and again.
bool is_steady(size_t column) {
  return column == kShare || column == kStatus;
}

// The cells that a column takes as it is.
Wish wish_of(const Content& content) {
  const size_t least = kColumns[content.number].least;
  const size_t natural = is_steady(content.number) ? std::max(content.width, least) : content.width;
  return {least != 0 ? std::min(natural, least) : natural, natural};
}

size_t natural_width(const std::vector<Content>& contents) {
  size_t sum = 0;
  for (const Content& content : contents) sum += wish_of(content).natural + 1;
  return sum == 0 ? 0 : sum - 1;
}

std::vector<size_t> columns_of(const Layout& layout) {
  if (!layout.columns.empty()) return layout.columns;
  return first_columns(layout.form == Form::kJson ? std::size(kColumns) : kUsual);
}

std::vector<size_t> columns_of_block(const Layout& layout) {
  return layout.columns.empty() ? first_columns(std::size(kColumns)) : layout.columns;
}

Extent extent_of(const std::vector<size_t>& columns) {
  const auto needs_all = [](size_t column) { return kColumns[column].extent == Extent::kAll; };
  return std::any_of(columns.begin(), columns.end(), needs_all) ? Extent::kAll : Extent::kHealth;
}

// What the report is made of. The target is one of the usual columns of a table where there is room for it.
std::vector<Content> contents_of(const std::vector<Row>& rows, const Layout& layout) {
  std::vector<Content> contents;
  for (const size_t column : columns_of(layout)) {
    contents.push_back(content_of(rows, column, layout));
    if (column == kStatus && layout.colour) contents.back().shown.colours = colours_of(rows);
  }
  if (layout.form != Form::kTable || !layout.columns.empty()) return contents;
  contents.push_back(content_of(rows, kTarget, layout));
  if (natural_width(contents) > layout.width) contents.pop_back();
  return contents;
}

// The order of importance: that of the line, but what was asked for beside the usual ones follows the status.
std::vector<const Content*> by_importance(const std::vector<Content>& contents, const Layout& layout) {
  std::vector<const Content*> order;
  for (const Content& content : contents) order.push_back(&content);
  if (layout.added) {
    std::rotate(order.begin() + kFirst, order.begin() + static_cast<long>(kUsual), order.end());
  }
  return order;
}

// What was asked for is not cut, unless it were left out for that.
std::vector<size_t> widths_of(const std::vector<Wish>& wishes, size_t asked_for, const Layout& layout) {
  if (!layout.added) return fitting_widths(wishes, layout.width);
  std::vector<Wish> uncut = wishes;
  for (size_t at = kFirst; at < kFirst + asked_for; at++) uncut[at].least = uncut[at].natural;
  const std::vector<size_t> widths = fitting_widths(uncut, layout.width);
  return widths[kFirst + asked_for - 1] != 0 ? widths : fitting_widths(wishes, layout.width);
}

// A text that is cut says so.
void cut(Cell& cell, size_t width) {
  if (cell.width <= width) return;
  cell.text = cell.text.substr(0, platform::first_cells(cell.text, width - 1)) + "~";
  cell.width = platform::cells(cell.text);
}

TableColumn cut_column(Content& content, size_t width) {
  TableColumn& column = content.shown;
  column.name = column.name.substr(0, width);
  if (is_steady(content.number)) column.width = width;
  for (Cell& cell : column.cells) cut(cell, width);
  return std::move(column);
}

// The columns as they fit the screen; what has no room is left out.
std::vector<TableColumn> fitting(std::vector<Content> contents, const Layout& layout) {
  const std::vector<const Content*> order = by_importance(contents, layout);
  std::vector<Wish> wishes;
  for (const Content* content : order) wishes.push_back(wish_of(*content));
  const std::vector<size_t> widths = widths_of(wishes, contents.size() - kUsual, layout);
  std::vector<TableColumn> columns;
  for (Content& content : contents) {
    const size_t at = static_cast<size_t>(std::find(order.begin(), order.end(), &content) - order.begin());
    if (widths[at] != 0) columns.push_back(cut_column(content, widths[at]));
  }
  return columns;
}

std::vector<TableColumn> whole(std::vector<Content> contents) {
  std::vector<TableColumn> columns;
  for (Content& content : contents) columns.push_back(std::move(content.shown));
  return columns;
}

// "NAME  value", folded beside the name, or below it where there is no room beside.
std::string line_of_block(const Column& column, const std::string& value, size_t width) {
  const bool is_beside = width >= 2 * kNameWidth;
  std::string name = column.name;
  is_beside ? name.append(kNameWidth - name.size(), ' ') : name.append("\n");
  const size_t indent = is_beside ? kNameWidth : 0;
  if (platform::cells(value) + indent <= width) return name + value + "\n";
  const Indents indents{indent, indent};
  const std::string lines = std::string_view(column.name) == "COMMAND" ? folded_command(value, indents, width)
                                                                       : folded(value, indents, width);
  return name + lines.substr(indent);
}

}  // namespace

std::string readable_size(unsigned long long bytes) {
  constexpr char kUnits[] = "BKMGTPE";
  auto size = static_cast<double>(bytes);
  size_t unit = 0;
  for (; size >= 1024; unit++) size /= 1024;
  char text[32];
  snprintf(text, sizeof text, "%.*f%c", unit == 0 || size >= 9.95 ? 0 : 1, size, kUnits[unit]);
  return text;
}

bool choose_columns(std::string_view names, Layout& layout, std::string& unknown) {
  layout.columns.clear();
  layout.added = names.starts_with('+');
  if (layout.added) {
    layout.columns = first_columns(kUsual);
    names.remove_prefix(1);
  }
  while (true) {
    const std::string_view name = names.substr(0, names.find(','));
    const size_t column = find_column(name);
    unknown = name;
    if (column == std::size(kColumns)) return false;
    if (std::find(layout.columns.begin(), layout.columns.end(), column) == layout.columns.end()) {
      layout.columns.push_back(column);
    }
    if (name.size() == names.size()) return true;
    names.remove_prefix(name.size() + 1);
  }
}

std::string describe_columns() {
  std::string text;
  for (const Column& column : kColumns) {
    text += "  ";
    text += column.name;
    text.append(kNameWidth - std::string_view(column.name).size(), ' ');
    text += column.what;
    text += '\n';
  }
  return text;
}

Extent extent_of_report(const Layout& layout) {
  return extent_of(columns_of(layout));
}

Extent extent_of_block(const Layout& layout) {
  return extent_of(columns_of_block(layout));
}

std::string volume_report(const std::vector<Row>& rows, const Layout& asked) {
  Layout layout = asked;
  layout.bytes = layout.bytes || layout.form == Form::kJson;
  std::vector<Content> contents = contents_of(rows, layout);
  switch (layout.form) {
    case Form::kJson:
      return as_json("volumes", whole(std::move(contents)));
    case Form::kRaw:
      return as_raw(whole(std::move(contents)), layout.headings);
    case Form::kTable:
      break;
  }
  return as_table(fitting(std::move(contents), layout), layout.headings);
}

std::string block(const Row& row, const Layout& layout) {
  std::string text;
  for (const size_t number : columns_of_block(layout)) {
    const std::string value = cell(kColumns[number], row, layout);
    if (!layout.headings) {
      text += value + "\n";
    } else if (!value.empty()) {
      text += line_of_block(kColumns[number], value, layout.width);
    }
  }
  return text;
}

void use_utf8() {
  setlocale(LC_CTYPE, "C.UTF-8");
}

}  // namespace vvstat
