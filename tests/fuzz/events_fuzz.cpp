// What arrives on the netlink socket: no datagram is read beyond its end, and every one comes to an end.
#include "events/kernel_event.h"

#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const unsigned char* data, size_t size) {
  events::KernelEvent event{};
  for (size_t left = size; events::take_kernel_event(data, size, event); left = size) {
    if (size >= left) abort();
  }
  return 0;
}
