#include "vvstat/columns.h"

#include <locale.h>
#include <strings.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <memory>

#include "common/memory.h"
#include "common/scols.h"
#include "common/utf8.h"
#include "tree_layout.h"
#include "vvstat/folding.h"
#include "vvstat/moment.h"
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
  int type;      // in JSON
  bool right;
  std::string (*text)(const Row& row, const Layout& layout);
  Detail detail = Detail::kHealth;  // of the facts that tell it
};

constexpr int kText = SCOLS_JSON_STRING, kNumber = SCOLS_JSON_NUMBER, kFlag = SCOLS_JSON_BOOLEAN;

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
     [](const Row& row, const Layout&) { return row.options; }, Detail::kAll},
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
     [](const Row& row, const Layout&) { return row.address; }, Detail::kAll},
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
  std::string text = column.text(row, layout);
  if (platform::is_printable_ascii(text)) return text;
  text = platform::printable(text);
  return platform::is_printable_ascii(text) || has_utf8() ? text : platform::ascii(text);
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

// What a column shows of the rows.
struct ColumnTexts {
  size_t column;
  std::vector<std::string> cells;  // one of each row
  size_t width;                    // of the widest one, and of the name
};

ColumnTexts texts_of(const std::vector<Row>& rows, size_t number, const Layout& layout) {
  const Column& column = kColumns[number];
  ColumnTexts content{number, {}, std::string_view(column.name).size()};
  content.cells.reserve(rows.size());
  for (const Row& row : rows) {
    content.cells.push_back(cell(column, row, layout));
    content.width = std::max(content.width, platform::cells(content.cells.back()));
  }
  return content;
}

// Share and status have their cells in any case: they are there again and again.
bool is_steady(size_t column) {
  return column == kShare || column == kStatus;
}

// The cells that a column takes as it is.
Wish wish_of(const ColumnTexts& content) {
  const size_t least = kColumns[content.column].least;
  const size_t natural = is_steady(content.column) ? std::max(content.width, least) : content.width;
  return {least != 0 ? std::min(natural, least) : natural, natural};
}

size_t natural_width(const std::vector<ColumnTexts>& contents) {
  size_t sum = 0;
  for (const ColumnTexts& content : contents) sum += wish_of(content).natural + 1;
  return sum == 0 ? 0 : sum - 1;
}

std::vector<size_t> columns_of(const Layout& layout) {
  if (!layout.columns.empty()) return layout.columns;
  return first_columns(layout.form == Form::kJson ? std::size(kColumns) : kUsual);
}

std::vector<size_t> columns_of_block(const Layout& layout) {
  return layout.columns.empty() ? first_columns(std::size(kColumns)) : layout.columns;
}

Detail detail_of(const std::vector<size_t>& columns) {
  const auto needs_all = [](size_t column) { return kColumns[column].detail == Detail::kAll; };
  return std::any_of(columns.begin(), columns.end(), needs_all) ? Detail::kAll : Detail::kHealth;
}

// What the report is made of. The target is one of the usual columns of a table where there is room for it.
std::vector<ColumnTexts> all_texts_of(const std::vector<Row>& rows, const Layout& layout) {
  std::vector<ColumnTexts> contents;
  for (const size_t column : columns_of(layout)) contents.push_back(texts_of(rows, column, layout));
  if (layout.form != Form::kTable || !layout.columns.empty()) return contents;
  contents.push_back(texts_of(rows, kTarget, layout));
  if (natural_width(contents) > layout.width) contents.pop_back();
  return contents;
}

// A column in a table. Of the library's own ways to cut a text none is the same in all its versions, so it
// gets texts that fit.
struct Place {
  const ColumnTexts* content;
  size_t width;  // cells; what is longer is cut
};

constexpr size_t kUncut = SIZE_MAX;

// The order of importance: that of the line, but what was asked for beside the usual ones follows the status.
std::vector<const ColumnTexts*> by_importance(const std::vector<ColumnTexts>& contents,
                                              const Layout& layout) {
  std::vector<const ColumnTexts*> order;
  for (const ColumnTexts& content : contents) order.push_back(&content);
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
void cut(ColumnTexts& content, size_t width) {
  if (content.width <= width) return;
  for (std::string& text : content.cells) {
    if (platform::cells(text) > width) text = text.substr(0, platform::first_cells(text, width - 1)) + "~";
  }
}

// Cuts the contents to their places.
std::vector<Place> places_of(std::vector<ColumnTexts>& contents, const Layout& layout) {
  std::vector<Place> places;
  if (layout.form != Form::kTable) {
    for (const ColumnTexts& content : contents) places.push_back({&content, kUncut});
    return places;
  }
  const std::vector<const ColumnTexts*> order = by_importance(contents, layout);
  std::vector<Wish> wishes;
  for (const ColumnTexts* content : order) wishes.push_back(wish_of(*content));
  const std::vector<size_t> widths = widths_of(wishes, contents.size() - kUsual, layout);
  for (ColumnTexts& content : contents) {
    const size_t at = static_cast<size_t>(std::find(order.begin(), order.end(), &content) - order.begin());
    if (widths[at] == 0) continue;
    cut(content, widths[at]);
    places.push_back({&content, widths[at]});
  }
  return places;
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

bool add_column(libscols_table* table, const Place& place) {
  const Column& column = kColumns[place.content->column];
  const std::string name = std::string(column.name).substr(0, place.width);
  const double width =
      place.width != kUncut && is_steady(place.content->column) ? static_cast<double>(place.width) : 0;
  libscols_column* added =
      scols_table_new_column(table, name.c_str(), width,
                             (column.right ? SCOLS_FL_RIGHT : 0) | (column.least != 0 ? SCOLS_FL_TRUNC : 0));
  return added != nullptr && scols_column_set_json_type(added, column.type) == 0;
}

// The row that is the `number`th of all.
bool add_row(libscols_table* table, const Row& row, size_t number, const std::vector<Place>& places,
             const Layout& layout) {
  libscols_line* line = scols_table_new_line(table, nullptr);
  if (line == nullptr) return false;
  for (size_t at = 0; at < places.size(); at++) {
    const std::string& text = places[at].content->cells[number];
    if (text.empty()) continue;
    if (scols_line_set_data(line, at, text.c_str()) != 0) return false;
    if (layout.colour && places[at].content->column == kStatus && row.wanted) {
      scols_cell_set_color(scols_line_get_cell(line, at), row.healthy() ? kGood : kBad);
    }
  }
  return true;
}

platform::ScolsTable table_of(const std::vector<Row>& rows, const Layout& layout) {
  platform::ScolsTable table(scols_new_table());
  std::vector<ColumnTexts> contents = all_texts_of(rows, layout);
  const std::vector<Place> places = places_of(contents, layout);
  bool good = table != nullptr && scols_table_set_name(table.get(), "volumes") == 0;
  for (const Place& place : places) good = good && add_column(table.get(), place);
  for (size_t at = 0; at < rows.size(); at++)
    good = good && add_row(table.get(), rows[at], at, places, layout);
  if (!good) platform::end_without_memory();
  return table;
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

Detail detail_of_report(const Layout& layout) {
  return detail_of(columns_of(layout));
}

Detail detail_of_block(const Layout& layout) {
  return detail_of(columns_of_block(layout));
}

std::string volume_report(const std::vector<Row>& rows, const Layout& asked) {
  Layout layout = asked;
  layout.bytes = layout.bytes || layout.form == Form::kJson;
  const platform::ScolsTable table = table_of(rows, layout);
  scols_table_enable_noencoding(table.get(), 1);  // cell() has done it
  scols_table_enable_json(table.get(), layout.form == Form::kJson);
  scols_table_enable_raw(table.get(), layout.form == Form::kRaw);
  scols_table_enable_noheadings(table.get(), !layout.headings);
  scols_table_enable_colors(table.get(), layout.colour);
  scols_table_set_termforce(table.get(), SCOLS_TERMFORCE_ALWAYS);
  scols_table_set_termwidth(table.get(), layout.width);
  return platform::printed(table);
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
