#include "common/tree_reader.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>

namespace platform {
namespace {

constexpr size_t kPathSize = 128;

__attribute__((format(printf, 1, 0))) std::string path_of(const char* format, va_list arguments) {
  char path[kPathSize];
  vsnprintf(path, sizeof path, format, arguments);
  return path;
}

}  // namespace

void TreeReader::index() {
  listing_.for_each([this](std::string_view path, std::string_view value) { values_.emplace(path, value); });
}

std::string TreeReader::read(const char* path) const {
  const auto found = values_.find(path);
  return found == values_.end() ? std::string() : found->second;
}

std::string TreeReader::value(const char* format, ...) const {
  va_list arguments;
  va_start(arguments, format);
  const std::string path = path_of(format, arguments);
  va_end(arguments);
  return read(path.c_str());
}

int TreeReader::number(int fallback, const char* format, ...) const {
  va_list arguments;
  va_start(arguments, format);
  const std::string path = path_of(format, arguments);
  va_end(arguments);
  const std::string text = read(path.c_str());
  return text.empty() ? fallback : atoi(text.c_str());
}

}  // namespace platform
