// What is shown: tables, outcomes and failures, for people and for programs.
#ifndef PLATFORM_VV_OUTPUT_H
#define PLATFORM_VV_OUTPUT_H

#include <string>
#include <vector>

#include "vv/explanation.h"

namespace vv {

struct TableColumn {
  const char* name;
  bool number = false;
};

struct Table {
  const char* name;  // of the list in JSON
  std::vector<TableColumn> columns;
  std::vector<std::vector<std::string>> rows;
};

// The table as a person reads it, or as JSON. Text of users is made printable; an empty cell is null in JSON.
std::string shown(const Table& table, bool json);

// Writes text to standard output.
void put(const std::string& text);

// How a command ended.
struct Outcome {
  std::string command;
  std::string share;
  std::string target;
  int status;           // the exit status
  std::string message;  // a sentence; for a failure, what failed
  Failure failure;      // of one that failed
};

// Tells how a command ended, on standard output when it is done and on standard error when not, or both as
// JSON on standard output. Returns the exit status.
int tell(const Outcome& outcome, bool json);

// Sees to it that what was to be written is written. Returns the exit status: `status`, or that of a failure.
int finish(int status);

}  // namespace vv

#endif
