// Tables of libsmartcols.
#ifndef PLATFORM_COMMON_SCOLS_H
#define PLATFORM_COMMON_SCOLS_H

#include <libsmartcols.h>

#include <cstdlib>
#include <memory>
#include <string>

#include "common/memory.h"

namespace platform {

struct ScolsEnd {
  void operator()(libscols_table* table) const { scols_unref_table(table); }
};

// A table that is freed at the end of its life.
using ScolsTable = std::unique_ptr<libscols_table, ScolsEnd>;

// What the library makes of the table, with the end of the last line, which it leaves out. Without memory the
// program ends (common/memory.h).
inline std::string printed(const ScolsTable& table) {
  char* text = nullptr;
  // 2.38 says 0 as well when it got no memory for the text.
  if (scols_print_table_to_string(table.get(), &text) != 0 || text == nullptr) end_without_memory();
  const std::unique_ptr<char, decltype(&free)> owned(text, free);
  return std::string(text).append("\n");
}

}  // namespace platform

#endif
