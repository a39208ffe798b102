// A configuration tree whose values are parts of the input (between NULs), given one after the other to
// whatever is asked for, over and over; "-" stands for a missing one. Included by one file of a
// target.
#ifndef FUZZ_HOSTILE_TREE_H
#define FUZZ_HOSTILE_TREE_H

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "ktreec.h"

inline std::vector<std::string> values;
inline size_t asked = 0;

inline void take_values(const uint8_t* data, size_t size) {
  values.assign(1, "");
  asked = 0;
  for (size_t i = 0; i < size; i++) {
    if (data[i] == '\0') {
      values.emplace_back();
    } else {
      values.back() += static_cast<char>(data[i]);
    }
  }
}

inline const std::string& next_value() {
  return values[asked++ % values.size()];
}

extern "C" int ktreec_get_wb(const char*, unsigned, const char*, char* buffer, size_t size) {
  const std::string& value = next_value();
  if (value == "-") return -1;
  const size_t length = value.size() < size ? value.size() : size - 1;
  memcpy(buffer, value.data(), length);
  buffer[length] = '\0';
  return static_cast<int>(length);
}

#endif
