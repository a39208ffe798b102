// The queue of target names that wait for recovery after a connection loss. The tree keeps its entries dense,
// so entry 1 is always the oldest.
#ifndef REMVOL_TREE_RECOVER_QUEUE_H
#define REMVOL_TREE_RECOVER_QUEUE_H

#include <cstddef>

namespace remvol {

// Returns the first free entry (1 to 100), or -1 when all are used.
[[nodiscard]] int ktree_get_free_recover_queue_db_idx();

// Appends a name. Returns 0, -1 when the queue is full, -103 when the write failed.
[[nodiscard]] int ktree_insert_recover_queue(const char* target_name);

// Returns whether no name is queued.
[[nodiscard]] bool recover_queue_is_empty();

// Takes the oldest name into `target_name`, which holds at least 256 bytes. Returns 0; -1 when the queue is
// empty; -103 when the entry could not be deleted (the name is copied out all the same).
[[nodiscard]] int ktree_pop_recover_queue(char* target_name);

}  // namespace remvol

#endif
