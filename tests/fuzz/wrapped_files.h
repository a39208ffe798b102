// fopen as the tool's library sees it (the target is linked with --wrap=fopen): every file holds the bytes of
// this run. The tool reads with the mode "re"; any other is the fuzzer's, which keeps its inputs and findings
// so. Included by one file of a target.
#ifndef FUZZ_WRAPPED_FILES_H
#define FUZZ_WRAPPED_FILES_H

#include <cstdint>
#include <cstdio>
#include <cstring>

inline const uint8_t* file_data = nullptr;
inline size_t file_size = 0;

extern "C" FILE* __real_fopen(const char* path, const char* mode);

extern "C" FILE* __wrap_fopen(const char* path, const char* mode) {
  if (strcmp(mode, "re") != 0) return __real_fopen(path, mode);
  return file_size == 0 ? nullptr : fmemopen(const_cast<uint8_t*>(file_data), file_size, "r");
}

#endif
