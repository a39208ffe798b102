// The report as a table, as raw text and as JSON.
#ifndef PLATFORM_VVSTAT_COLUMNS_H
#define PLATFORM_VVSTAT_COLUMNS_H

#include <string>
#include <string_view>
#include <vector>

#include "vvstat/health.h"

namespace vvstat {

enum class Form { kTable, kRaw, kJson };

// How the report is to look.
struct Layout {
  Form form = Form::kTable;
  bool headings = true;
  bool bytes = false;   // sizes in bytes; as JSON they always are
  bool colour = false;  // in a table
  size_t width = 80;    // cells that a line of a table may take; raw lines and JSON are as long as they are
  std::vector<size_t> columns;  // by their numbers; empty: the usual ones of the form
  bool added = false;           // they are the usual ones and, behind these, others that were asked for
};

// Takes a list of column names, as "SHARE,STATUS"; with a "+" before it they are added to the usual ones.
// Returns false when there is no such column; `unknown` is its name then.
bool choose_columns(std::string_view names, Layout& layout, std::string& unknown);

// The columns' names with what each shows, a line each, for a help text.
std::string describe_columns();

// How much of the kernel's facts the report shows, and a block.
Detail detail_of_report(const Layout& layout);
Detail detail_of_block(const Layout& layout);

// The report. A line of a table is never longer than the screen is wide: the columns that matter least are
// cut first, then left out, PORTAL before LUN, USE%, SIZE, USED and STATUS; a text that is cut ends with "~".
// Text of users is shown with \xHH for bytes that are not UTF-8, and for characters that move a cursor or
// cannot be seen. Secrets are not in it. The process gets a UTF-8 locale (use_utf8()) for all else that is
// not ASCII. Empty when there is no memory for it.
std::string volume_report(const std::vector<Row>& rows, const Layout& layout);

// Everything of one row, or the columns chosen, a column a line with its name before it; what is empty is
// left out, and what is longer than the screen is folded. Without headings there are the values alone, as
// long as they are, an empty line for an empty one. Text of users is shown as above.
std::string block(const Row& row, const Layout& layout);

// Sets the character set of the process to UTF-8, whatever its environment says; where the system lacks the
// locale, what is not ASCII is shown as \xHH.
void use_utf8();

// A size as a person reads it, such as "1.5G", in powers of 1024.
std::string readable_size(unsigned long long bytes);

}  // namespace vvstat

#endif
