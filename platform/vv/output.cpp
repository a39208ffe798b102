#include "vv/output.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "common/memory.h"
#include "common/scols.h"
#include "common/utf8.h"
#include "vv/list.h"
#include "vv/options.h"

namespace vv {
namespace {

bool add_column(libscols_table* table, const TableColumn& column) {
  libscols_column* added = scols_table_new_column(table, column.name, 0, column.number ? SCOLS_FL_RIGHT : 0);
  return added != nullptr &&
         scols_column_set_json_type(added, column.number ? SCOLS_JSON_NUMBER : SCOLS_JSON_STRING) == 0;
}

bool add_row(libscols_table* table, const std::vector<std::string>& row) {
  libscols_line* line = scols_table_new_line(table, nullptr);
  if (line == nullptr) return false;
  for (size_t at = 0; at < row.size(); at++) {
    if (row[at].empty()) continue;
    if (scols_line_set_data(line, at, platform::printable(row[at]).c_str()) != 0) return false;
  }
  return true;
}

platform::ScolsTable filled(const Table& table) {
  platform::ScolsTable made(scols_new_table());
  bool good = made != nullptr && scols_table_set_name(made.get(), table.name) == 0;
  for (const TableColumn& column : table.columns) good = good && add_column(made.get(), column);
  for (const auto& row : table.rows) good = good && add_row(made.get(), row);
  if (!good) platform::end_without_memory();
  return made;
}

std::string joined(const std::vector<std::string>& lines) {
  std::string text;
  for (const std::string& line : lines) append(text, line, "; ");
  return text;
}

// Lines of a message as one.
std::string one_line(const std::string& message) {
  std::string line;
  for (const char byte : message) {
    if (line.ends_with("; ") && byte == ' ') continue;
    if (byte == '\n') {
      line += "; ";
    } else {
      line += byte;
    }
  }
  return line;
}

const char* word_of(int status) {
  if (status == kDone) return "done";
  return status == kRefused ? "refused" : "failed";
}

std::string as_json(const Outcome& outcome) {
  const Failure& failure = outcome.failure;
  return shown({"outcomes",
                {{"command"},
                 {"share"},
                 {"target"},
                 {"outcome"},
                 {"status", true},
                 {"message"},
                 {"step"},
                 {"why"},
                 {"advice"},
                 {"details"}},
                {{outcome.command, outcome.share, outcome.target, word_of(outcome.status),
                  std::to_string(outcome.status), one_line(outcome.message), failure.step, failure.why,
                  failure.advice, joined(failure.details)}}},
               true);
}

void tell_failure(const Outcome& outcome) {
  const Failure& failure = outcome.failure;
  fprintf(stderr, "vv: %s\n", outcome.message.c_str());
  if (!failure.step.empty()) fprintf(stderr, "  step: %s\n", failure.step.c_str());
  if (!failure.why.empty()) fprintf(stderr, "  why:  %s\n", failure.why.c_str());
  if (!failure.advice.empty()) fprintf(stderr, "  try:  %s\n", failure.advice.c_str());
  for (const std::string& detail : failure.details) fprintf(stderr, "  said: %s\n", detail.c_str());
}

}  // namespace

std::string shown(const Table& table, bool json) {
  const platform::ScolsTable made = filled(table);
  scols_table_enable_noencoding(made.get(), 1);  // add_row() has done it
  scols_table_enable_json(made.get(), json);
  scols_table_set_termforce(made.get(), SCOLS_TERMFORCE_NEVER);
  return platform::printed(made);
}

void put(const std::string& text) {
  fwrite(text.data(), 1, text.size(), stdout);
}

int tell(const Outcome& outcome, bool json) {
  if (json) {
    put(as_json(outcome));
  } else if (outcome.status == kDone) {
    put(outcome.message + "\n");
    for (const std::string& warning : outcome.failure.details) {
      fprintf(stderr, "  said: %s\n", warning.c_str());
    }
  } else {
    tell_failure(outcome);
  }
  return finish(outcome.status);
}

int finish(int status) {
  if (ferror(stdout) == 0 && fflush(stdout) == 0) return status;
  fprintf(stderr, "vv: write error: %s\n", strerror(errno));
  return kFailed;
}

}  // namespace vv
