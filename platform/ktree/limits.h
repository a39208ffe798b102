// Limits of the configuration tree, the same for the daemon, its client and the settings file.
#ifndef PLATFORM_KTREE_LIMITS_H
#define PLATFORM_KTREE_LIMITS_H

#include <cstddef>

namespace ktree {

constexpr size_t kMaxPathBytes = 1023;
constexpr size_t kMaxValueBytes = 65535;
constexpr unsigned kMaxNumber = 4096;  // children of one name below one node

// An element takes two bytes at least, so no path is deeper than this.
constexpr size_t kMaxDepth = kMaxPathBytes / 2;

// What one tree may hold in all. A set beyond is refused, so that no client can use up the machine's memory
// and every tree can be dumped and loaded again: a dump is at most kMaxDocumentBytes long (a value grows to
// five times its size in the worst case, a node adds less than 100 bytes beside its name).
constexpr size_t kMaxNodes = 262144;
constexpr size_t kMaxTreeBytes = size_t{32} << 20;  // names and values together
constexpr size_t kMaxDocumentBytes = size_t{256} << 20;

}  // namespace ktree

#endif
