// Access to the configuration tree's main instance. A key counts as present only when the read gives more
// than 0 bytes and the value is not empty; a missing key is never an error by itself, each reader has a
// default.
#ifndef REMVOL_TREE_ACCESS_H
#define REMVOL_TREE_ACCESS_H

#include <sys/types.h>

#include <cstddef>
#include <ctime>

#include "tree_layout.h"

namespace remvol {

// Hold a value that is read, and the NUL behind it: a name, a path or a setting, and the number of a state. A
// longer one is cut.
using TreeValue = char[256];
using StateValue = char[128];

// Returns whether a daemon serves the tree: it has `key`, also with an empty value, or takes a connection.
[[nodiscard]] bool tree_answers(const char* key);

// The tree's daemon by its socket: another one, or one that was started anew, has another socket. That one
// has loaded the settings file, and knows nothing of what was stored since.
struct TreeInstance {
  ino_t inode = 0;
  timespec made = {};

  [[nodiscard]] bool operator==(const TreeInstance& other) const;
};

// Returns which daemon answers now; all zero when there is no socket.
[[nodiscard]] TreeInstance tree_instance();

// Reads `key` into `buffer` of `size` bytes, which is cleared first. Returns what the read gives: the number
// of bytes, -1 for a key that is missing; errno is ENODATA when the tree has said so, and it is no read that
// failed (a tree's library of another platform may not tell). What is read decides what is written, formatted
// and taken away, so a read that may have failed at once is done once more.
[[nodiscard]] int tree_get(const char* key, char* buffer, size_t size);

// The same. Returns whether the key is present.
[[nodiscard]] bool tree_read(const char* key, char* buffer, size_t size);

template <size_t N>
[[nodiscard]] bool tree_read(const char* key, char (&buffer)[N]) {
  return tree_read(key, buffer, N);
}

// Returns whether `key` is present.
[[nodiscard]] bool tree_present(const char* key);

// Returns whether `key` is missing for certain: the tree has said so, or it cannot be read twice, and
// `present`, a key that is there, can be read in between.
[[nodiscard]] bool tree_is_missing(const char* key, const char* present);

// Returns whether the tree answers and was loaded: a read does not tell a missing key from a tree that is not
// there, but one of two keys is in every tree that was loaded.
[[nodiscard]] bool tree_is_loaded();

// Returns the decimal number at `key`, 0 when its text is no number, `missing` when the key is not present.
[[nodiscard]] int tree_read_number(const char* key, int missing);

// The looser rule of the free-slot searches: free when the read is exactly -1 or the value is empty.
[[nodiscard]] bool tree_slot_is_free(const char* key);

// Sets `key` in one try. Returns 0, or -103 (not logged).
[[nodiscard]] int tree_write(const char* key, const char* value);

// The same on the tree behind `socket`; null means the client library's default.
[[nodiscard]] int tree_write_to(const char* socket, const char* key, const char* value);

// The same two, and log "ktreec_set() failed" at level 0 in the innermost scope's name.
[[nodiscard]] int tree_write_once(const char* key, const char* value);
[[nodiscard]] int tree_write_once_to(const char* socket, const char* key, const char* value);

// Logs what they do, for a value whose slot is gone. Returns -103.
[[nodiscard]] int tree_write_failed();

inline constexpr int kWriteTries = 3;

// Sets `key` in up to `tries` tries and logs "ktreec_set(%s) failed" in the innermost scope's name after each
// failed one. Returns 0, or -103 after the last.
[[nodiscard]] int tree_write_with_tries(const char* key, const char* value, int tries = kWriteTries);
[[nodiscard]] int tree_write_with_tries_to(const char* socket, const char* key, const char* value,
                                           int tries = kWriteTries);

// The same, and say first what they set, at level 1.
[[nodiscard]] int tree_write_logged(const char* key, const char* value);
[[nodiscard]] int tree_write_logged_to(const char* socket, const char* key, const char* value, int tries);

// Deletes `key` and all below it. Returns 0, or -103 (not logged).
[[nodiscard]] int tree_delete(const char* key);

}  // namespace remvol

#endif
