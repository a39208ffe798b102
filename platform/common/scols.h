// Tables of libsmartcols.
#ifndef PLATFORM_COMMON_SCOLS_H
#define PLATFORM_COMMON_SCOLS_H

#include <libsmartcols.h>

#include <memory>

namespace platform {

struct ScolsEnd {
  void operator()(libscols_table* table) const { scols_unref_table(table); }
};

// A table that is freed at the end of its life.
using ScolsTable = std::unique_ptr<libscols_table, ScolsEnd>;

}  // namespace platform

#endif
