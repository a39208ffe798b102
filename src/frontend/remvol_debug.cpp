#define LOG_SOURCE "remvol_debug.cpp"
#include "frontend/remvol_debug.h"

#include <cstdlib>

#include "frontend/log.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

int dbg_get_remvol_debug_lv() {
  const LogScope scope;
  StateValue text;
  const int level = tree_read(key::kDebugLevel, text) ? atoi(text) : 0;
  LOG(1, "get debug level = %d", level);
  return level;
}

}  // namespace remvol
