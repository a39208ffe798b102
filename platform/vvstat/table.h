// Texts in rows and columns: as a table for people, as plain lines and as JSON for programs.
#ifndef PLATFORM_VVSTAT_TABLE_H
#define PLATFORM_VVSTAT_TABLE_H

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace vvstat {

struct Cell {
  std::string text;  // printable, see platform::printable(); it may be empty
  size_t width = 0;  // the cells of a terminal that it takes
};

// What a text is in JSON, where an empty one is null. A flag is "1" or "0".
enum class Kind { kText, kNumber, kFlag };

struct TableColumn {
  std::string name;  // ASCII
  Kind kind = Kind::kText;
  bool right = false;  // the texts of a table end below each other, they do not begin so
  size_t width = 0;    // that it has in a table at least, unless all of its texts are shorter than its name
  std::vector<Cell> cells{};  // as many in each column
  // The control sequences that begin the texts of a table, one for each cell, or null; empty: none at all.
  std::vector<const char*> colours{};
};

// Lines with a blank between the columns, below the names of these if there are to be headings.
std::string as_table(const std::vector<TableColumn>& columns, bool headings);

// The same without blanks within a text, or for the sake of the next one: blanks, backslashes and bytes that
// are not ASCII are \xhh. Without a row there is an empty line.
std::string as_raw(const std::vector<TableColumn>& columns, bool headings);

// An object with an array called `name` of an object for each row, whose names are those of the columns in
// lower case, and an empty line behind it: so one can be told from the next.
std::string as_json(std::string_view name, const std::vector<TableColumn>& columns);

}  // namespace vvstat

#endif
