// Results of a LUN search, and the check that a share name is free.
#ifndef REMVOL_TREE_SEARCH_RESULTS_H
#define REMVOL_TREE_SEARCH_RESULTS_H

#include "support/lun_list.h"

namespace remvol {

// Publishes the LUNs found on `target_name` in the tree behind `socket` (null: the client library's default).
// `luns` may be null: none found. Prints one line for each LUN. Returns 0, -1 for a null name, or -103 at the
// first write that fails.
[[nodiscard]] int ktree_update_search_lun_result(const char* socket, const LunNode* luns,
                                                 const char* target_name);

// Writes the result code of a LUN search to the tree behind `socket`, in up to 3 tries. Returns 0 or -103.
[[nodiscard]] int ktree_update_search_lun_err_code(const char* socket, int code);

// Returns 1 when a LUN of any target has exactly this share name, else 0.
[[nodiscard]] int ktree_check_duplicate_share_name(const char* share);

}  // namespace remvol

#endif
