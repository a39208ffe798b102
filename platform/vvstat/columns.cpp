#include "vvstat/columns.h"

#include <locale.h>
#include <strings.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <memory>

#include "common/scols.h"
#include "common/utf8.h"
#include "tree_layout.h"
#include "vvstat/moment.h"

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
  double width;  // of a text when the line is full: below 1 a part of the line, and cut first; else cells; 0:
                 // never cut
  int type;      // in JSON
  bool right;
  std::string (*text)(const Row& row, const Layout& layout);
};

constexpr int kText = SCOLS_JSON_STRING, kNumber = SCOLS_JSON_NUMBER, kFlag = SCOLS_JSON_BOOLEAN;

constexpr size_t kNameWidth = 13;  // more than the longest name has

// The first ones are the usual ones of a table.
constexpr size_t kUsual = 7;
constexpr size_t kTarget = 7;

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
    {"PORTAL", "address and port of the target's portal, as it is stored", 0.2, kText, false,
     [](const Row& row, const Layout&) {
       return word(!row.target->address.empty(),
                   row.target->address + ":" + std::to_string(row.target->port));
     }},
    {"TARGET", "the target's name", 0.3, kText, false,
     [](const Row& row, const Layout&) { return row.target->name; }},
    {"HEALTHY", "nothing is wrong, or it is not wanted", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.healthy()); }},
    {"WANTED", "it should be connected, and is not switched off", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.wanted); }},
    {"PROBLEM", "what is wrong", 0.3, kText, false,
     [](const Row& row, const Layout&) { return row.problem.what; }},
    {"ADVICE", "what to do about it", 0.3, kText, false,
     [](const Row& row, const Layout&) { return row.problem.advice; }},
    {"COMMAND", "the command that does it", 0.3, kText, false,
     [](const Row& row, const Layout&) { return row.problem.command; }},
    {"SINCE", "since when it is healthy, or not", 0, kText, false,
     [](const Row& row, const Layout& layout) { return moment_text(row.since, layout); }},
    {"LAST-ERROR", "what was wrong with it last", 0.3, kText, false,
     [](const Row& row, const Layout&) { return row.error; }},
    {"ERROR-TIME", "when that began", 0, kText, false,
     [](const Row& row, const Layout& layout) { return moment_text(row.error_time, layout); }},
    {"MOUNTED", "its file system is mounted", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.mounted); }},
    {"RO", "it cannot be written", 0, kFlag, true,
     [](const Row& row, const Layout&) { return flag(row.read_only); }},
    {"MOUNTPOINT", "where it is mounted", 0.2, kText, false,
     [](const Row& row, const Layout&) {
       return row.volume != nullptr ? row.volume->mount_point : std::string();
     }},
    {"OPTIONS", "the options that it is mounted with", 0.2, kText, false,
     [](const Row& row, const Layout&) { return row.options; }},
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
    {"ADDRESS", "the address that the session is connected with", 0.2, kText, false,
     [](const Row& row, const Layout&) { return row.address; }},
    {"TREE-STATUS", "the volume's status as the configuration tree has it", 0.2, kText, false,
     [](const Row& row, const Layout&) {
       return row.volume != nullptr ? row.volume->status : std::string();
     }},
    {"TREE-TARGET", "the target's status as the configuration tree has it", 0.2, kText, false,
     [](const Row& row, const Layout&) { return row.target->status; }},
    {"OTHERWISE", "how the configuration tree has it, where that is not how it is", 0.2, kText, false,
     [](const Row& row, const Layout&) { return row.otherwise; }},
};

// Whether the C library knows more than ASCII: see use_utf8().
bool has_utf8() {
  return MB_CUR_MAX > 1;
}

// The text as it may stand in a cell.
std::string cell(const Column& column, const Row& row, const Layout& layout) {
  const std::string text = platform::printable(column.text(row, layout));
  return has_utf8() ? text : platform::ascii(text);
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

// The cells that the columns take when nothing is cut; one with a width is never narrower.
size_t natural_width(const std::vector<Row>& rows, const std::vector<size_t>& columns, const Layout& layout) {
  size_t sum = 0;
  for (const size_t column : columns) {
    size_t width =
        std::max(std::string_view(kColumns[column].name).size(), static_cast<size_t>(kColumns[column].width));
    for (const Row& row : rows) width = std::max(width, platform::cells(cell(kColumns[column], row, layout)));
    sum += width + 1;
  }
  return sum;
}

std::vector<size_t> columns_of(const std::vector<Row>& rows, const Layout& layout) {
  if (!layout.columns.empty()) return layout.columns;
  if (layout.form == Form::kJson) return first_columns(std::size(kColumns));
  std::vector<size_t> columns = first_columns(kUsual);
  if (layout.form == Form::kRaw) return columns;
  columns.push_back(kTarget);
  if (natural_width(rows, columns, layout) > layout.width) columns.pop_back();
  return columns;
}

bool add_column(libscols_table* table, const Column& column) {
  const int flags = (column.right ? SCOLS_FL_RIGHT : 0) | (column.width > 0 ? SCOLS_FL_TRUNC : 0);
  libscols_column* added = scols_table_new_column(table, column.name, column.width, flags);
  return added != nullptr && scols_column_set_json_type(added, column.type) == 0;
}

bool add_row(libscols_table* table, const Row& row, const std::vector<size_t>& columns,
             const Layout& layout) {
  libscols_line* line = scols_table_new_line(table, nullptr);
  if (line == nullptr) return false;
  for (size_t at = 0; at < columns.size(); at++) {
    const Column& column = kColumns[columns[at]];
    const std::string text = cell(column, row, layout);
    if (text.empty()) continue;
    if (scols_line_set_data(line, at, text.c_str()) != 0) return false;
    if (columns[at] == find_column("STATUS") && row.wanted) {
      scols_cell_set_color(scols_line_get_cell(line, at), row.healthy() ? kGood : kBad);
    }
  }
  return true;
}

platform::ScolsTable table_of(const std::vector<Row>& rows, const Layout& layout) {
  platform::ScolsTable table(scols_new_table());
  const std::vector<size_t> columns = columns_of(rows, layout);
  bool good = table != nullptr && scols_table_set_name(table.get(), "volumes") == 0;
  for (const size_t column : columns) good = good && add_column(table.get(), kColumns[column]);
  for (const Row& row : rows) good = good && add_row(table.get(), row, columns, layout);
  return good ? std::move(table) : nullptr;
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
  if (names.starts_with('+')) {
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

std::string volume_report(const std::vector<Row>& rows, const Layout& asked) {
  Layout layout = asked;
  layout.bytes = layout.bytes || layout.form == Form::kJson;
  const platform::ScolsTable table = table_of(rows, layout);
  if (table == nullptr) return {};
  scols_table_enable_noencoding(table.get(), 1);  // cell() has done it
  scols_table_enable_json(table.get(), layout.form == Form::kJson);
  scols_table_enable_raw(table.get(), layout.form == Form::kRaw);
  scols_table_enable_noheadings(table.get(), !layout.headings);
  scols_table_enable_colors(table.get(), layout.colour);
  scols_table_set_termforce(table.get(), SCOLS_TERMFORCE_ALWAYS);
  scols_table_set_termwidth(table.get(), layout.width);
  char* text = nullptr;
  if (scols_print_table_to_string(table.get(), &text) != 0) return {};
  const std::unique_ptr<char, decltype(&free)> owned(text, free);
  // The library ends all lines but the last one.
  return std::string(text).append("\n");
}

std::string block(const Row& row, bool bytes) {
  Layout layout;
  layout.bytes = bytes;
  std::string text;
  for (const Column& column : kColumns) {
    const std::string value = cell(column, row, layout);
    if (value.empty()) continue;
    text += column.name;
    text.append(kNameWidth - std::string_view(column.name).size(), ' ');
    text += value + "\n";
  }
  return text;
}

void use_utf8() {
  setlocale(LC_CTYPE, "C.UTF-8");
}

}  // namespace vvstat
