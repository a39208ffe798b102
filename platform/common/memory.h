// A program that has no memory left.
#ifndef PLATFORM_COMMON_MEMORY_H
#define PLATFORM_COMMON_MEMORY_H

namespace platform {

// From now on a `new` without memory ends the program as end_without_memory() does, with this exit status.
void end_when_memory_is_short(int status);

// Says "PROGRAM: out of memory" on standard error and ends the program: for a library that says it has none.
[[noreturn]] void end_without_memory();

}  // namespace platform

#endif
