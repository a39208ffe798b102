// Memory of the heap that frees itself. It comes from the C library: the tool starts for every request and
// would otherwise load the C++ library for that alone.
#ifndef REMVOL_SUPPORT_MEMORY_H
#define REMVOL_SUPPORT_MEMORY_H

#include <cstddef>
#include <cstdlib>
#include <memory>

namespace remvol {

struct MemoryFreer {
  void operator()(void* memory) const { free(memory); }
};

template <typename T>
using Memory = std::unique_ptr<T[], MemoryFreer>;

// Returns `count` zeroed values; null when memory is short.
template <typename T>
[[nodiscard]] Memory<T> allocate(size_t count) {
  return Memory<T>(static_cast<T*>(calloc(count, sizeof(T))));
}

}  // namespace remvol

#endif
