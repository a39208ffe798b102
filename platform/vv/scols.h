// Tables of libsmartcols.
#ifndef PLATFORM_VV_SCOLS_H
#define PLATFORM_VV_SCOLS_H

#include <libsmartcols.h>

#include <memory>

namespace vv {

struct ScolsEnd {
  void operator()(libscols_table* table) const { scols_unref_table(table); }
};

// A table that is freed at the end of its life.
using ScolsTable = std::unique_ptr<libscols_table, ScolsEnd>;

}  // namespace vv

#endif
