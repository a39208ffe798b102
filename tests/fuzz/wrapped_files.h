// fopen as the tool's library sees it (the target is linked with --wrap=fopen): every file holds the bytes of
// this run. The tool reads with the mode "re"; any other is the fuzzer's, which keeps its inputs and findings
// so. Included by one file of a target.
#ifndef FUZZ_WRAPPED_FILES_H
#define FUZZ_WRAPPED_FILES_H

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

inline const uint8_t* file_data = nullptr;
inline size_t file_size = 0;

// Has files hold `text`, which lives as long; there is none when it is empty.
inline void give_file(const std::string& text) {
  file_data = reinterpret_cast<const uint8_t*>(text.data());
  file_size = text.size();
}

// When it is set, it is called with the path of each file before that is opened.
inline void (*on_file)(const char* path) = nullptr;

extern "C" FILE* __real_fopen(const char* path, const char* mode);

extern "C" FILE* __wrap_fopen(const char* path, const char* mode) {
  if (strcmp(mode, "re") != 0) return __real_fopen(path, mode);
  if (on_file != nullptr) on_file(path);
  return file_size == 0 ? nullptr : fmemopen(const_cast<uint8_t*>(file_data), file_size, "r");
}

#endif
