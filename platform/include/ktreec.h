/* Client of the configuration tree daemon (ktree). Usable from C and C++.
 *
 * A path is a slash and elements joined by slashes. An element is a name, or a name, a colon and a number N
 * from 1; a bare name means N = 1. A name is [A-Za-z_][A-Za-z0-9_.-]*. `name:N` is the N-th child of that
 * name; N above 4096 is refused. A value is any bytes but NUL, at most 65,535 of them; a path is at most
 * 1,023 bytes.
 *
 * In every call, `socket` NULL means "/var/run/ktree_sock" and `flags` is 0. The library keeps one
 * connection per socket for the life of the process, connects again when the daemon has been restarted,
 * and gives up on a daemon that does not answer within 5 seconds. What the daemon shows in memory, short
 * values, is read there from the second get on, as long as the daemon lives; a set that would change nothing
 * is not sent. Calls may come from several threads. */
#ifndef KTREEC_H
#define KTREEC_H

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Sets the node at `path` to `value` and creates what is missing on the way; setting `name:N` where fewer
 * than N children of that name exist creates the ones before it as empty nodes. Returns 0, or -1 on a bad
 * path, a value that is too long, or a daemon that does not answer; nothing is changed then. */
int ktreec_set(const char* socket, unsigned flags, const char* path, const char* value);

/* Reads the value at `path` into `buffer` of `size` bytes, always NUL-terminated when size > 0. Returns the
 * bytes put there without the NUL (at most size - 1), 0 for an empty value, -1 when the node is missing, has
 * no value, or on any error (the buffer then holds the empty text). errno is ENODATA when the daemon has
 * answered that there is no such node or value, and in no other case. */
int ktreec_get_wb(const char* socket, unsigned flags, const char* path, char* buffer, size_t size);

/* Deletes the node at `path` and all below it; the later children of the same name move down by one. Returns
 * 0, or -1 (also when there is no such node). */
int ktreec_del(const char* socket, unsigned flags, const char* path);

/* Writes the whole tree to `file` as XML, mode 0600, replacing it in one step, and has it on the disk. A file
 * that holds this already, with this mode and owner, stays. Returns 0, or -1; the file is then as it was,
 * unless the very last step failed, the writing of the folder to its disk. */
int ktreec_dump(const char* socket, unsigned flags, const char* file);

/* Makes the tree what `file` holds. Returns 0, or -1 when the file is missing or damaged; the tree is then as
 * it was. */
int ktreec_load(const char* socket, unsigned flags, const char* file);

#ifdef __cplusplus
}
#endif

#endif
