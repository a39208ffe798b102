// What every fuzz target asserts with.
#ifndef FUZZ_REQUIRE_H
#define FUZZ_REQUIRE_H

#include <cstdlib>
#include <cstring>

inline void require(bool holds) {
  if (!holds) abort();
}

template <size_t N>
void require_ended(const char (&field)[N]) {
  require(memchr(field, '\0', N) != nullptr);
}

#endif
