#include "vvstat/table.h"

#include <algorithm>
#include <cstdio>

namespace vvstat {
namespace {

constexpr char kPlain[] = "\x1b[0m";

size_t rows_of(const std::vector<TableColumn>& columns) {
  return columns.empty() ? 0 : columns.front().cells.size();
}

size_t width_of(const TableColumn& column) {
  size_t width = 0;
  for (const Cell& cell : column.cells) width = std::max(width, cell.width);
  return width < column.name.size() ? column.name.size() : std::max(width, column.width);
}

const char* colour_of(const TableColumn& column, size_t row) {
  return column.colours.empty() || column.cells[row].text.empty() ? nullptr : column.colours[row];
}

// The lines of a table while it is written.
class Lines {
 public:
  explicit Lines(const std::vector<TableColumn>& columns) : columns_(columns) {
    for (const TableColumn& column : columns) widths_.push_back(width_of(column));
  }

  void put_headings() {
    for (size_t at = 0; at < columns_.size(); at++)
      put(at, columns_[at].name, columns_[at].name.size(), nullptr);
  }

  void put_row(size_t row) {
    for (size_t at = 0; at < columns_.size(); at++) {
      const Cell& cell = columns_[at].cells[row];
      put(at, cell.text, cell.width, colour_of(columns_[at], row));
    }
  }

  std::string taken() { return std::move(text_); }

 private:
  // A line ends with its last text. A colour is that of the whole column.
  void put(size_t at, std::string_view text, size_t width, const char* colour) {
    const size_t blanks = widths_[at] - width;
    const bool is_last = at + 1 == columns_.size(), is_right = columns_[at].right;
    if (colour != nullptr) text_ += colour;
    if (is_right && !(is_last && text.empty())) text_.append(blanks, ' ');
    text_ += text;
    if (!is_right && !is_last) text_.append(blanks, ' ');
    if (colour != nullptr) text_ += kPlain;
    text_ += is_last ? '\n' : ' ';
  }

  const std::vector<TableColumn>& columns_;
  std::vector<size_t> widths_;
  std::string text_;
};

void append_raw(std::string& lines, std::string_view text) {
  for (const char byte : text) {
    if (byte > 0x20 && byte < 0x7f && byte != '\\') {
      lines += byte;
      continue;
    }
    char hex[8];
    snprintf(hex, sizeof hex, "\\x%02x", static_cast<unsigned char>(byte));
    lines += hex;
  }
}

void append_quoted(std::string& json, std::string_view text) {
  json += '"';
  for (const char byte : text) {
    if (byte == '"' || byte == '\\') json += '\\';
    json += byte;
  }
  json += '"';
}

void append_value(std::string& json, Kind kind, const std::string& text) {
  if (text.empty()) {
    json += "null";
  } else if (kind == Kind::kText) {
    append_quoted(json, text);
  } else if (kind == Kind::kFlag) {
    json += text == "1" ? "true" : "false";
  } else {
    json += text;
  }
}

std::string in_lower_case(std::string name) {
  for (char& letter : name) {
    if (letter >= 'A' && letter <= 'Z') letter = static_cast<char>(letter + ('a' - 'A'));
  }
  return name;
}

}  // namespace

std::string as_table(const std::vector<TableColumn>& columns, bool headings) {
  Lines lines(columns);
  if (headings) lines.put_headings();
  for (size_t row = 0; row < rows_of(columns); row++) lines.put_row(row);
  return lines.taken();
}

std::string as_raw(const std::vector<TableColumn>& columns, bool headings) {
  if (rows_of(columns) == 0) return "\n";
  std::string lines;
  const auto put = [&](auto text_of) {
    for (const TableColumn& column : columns) {
      append_raw(lines, text_of(column));
      lines += &column == &columns.back() ? '\n' : ' ';
    }
  };
  if (headings) put([](const TableColumn& column) -> std::string_view { return column.name; });
  for (size_t row = 0; row < rows_of(columns); row++) {
    put([row](const TableColumn& column) -> std::string_view { return column.cells[row].text; });
  }
  return lines;
}

std::string as_json(std::string_view name, const std::vector<TableColumn>& columns) {
  std::vector<std::string> names;
  for (const TableColumn& column : columns) names.push_back(in_lower_case(column.name));
  std::string json = "{\n   \"";
  json.append(name).append("\": [\n");
  for (size_t row = 0; row < rows_of(columns); row++) {
    json += row == 0 ? "      {\n" : ",{\n";
    for (size_t at = 0; at < columns.size(); at++) {
      json.append("         \"").append(names[at]).append("\": ");
      append_value(json, columns[at].kind, columns[at].cells[row].text);
      json += at + 1 == columns.size() ? "\n" : ",\n";
    }
    json += "      }";
  }
  return json.append("\n   ]\n}\n\n");
}

}  // namespace vvstat
