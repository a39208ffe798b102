// Reading of the debug level.
#ifndef REMVOL_FRONTEND_REMVOL_DEBUG_H
#define REMVOL_FRONTEND_REMVOL_DEBUG_H

namespace remvol {

// Returns the debug level stored in the tree; 0 when the key is missing, empty or not a number.
[[nodiscard]] int dbg_get_remvol_debug_lv();

}  // namespace remvol

#endif
