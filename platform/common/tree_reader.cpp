#include "common/tree_reader.h"

#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>

#include "common/file_text.h"
#include "ktree/client/calls.h"

namespace platform {
namespace {

using ktree::client::CallResult;

constexpr size_t kPathSize = 128;

__attribute__((format(printf, 1, 0))) std::string path_of(const char* format, va_list arguments) {
  char path[kPathSize];
  vsnprintf(path, sizeof path, format, arguments);
  return path;
}

int digit(char character) {
  constexpr std::string_view kDigits = "0123456789ABCDEF";
  const size_t at = kDigits.find(character);
  return at == std::string_view::npos ? -1 : static_cast<int>(at);
}

// The value without the \xHH that a listing has for control characters and the backslash.
std::string unescaped(std::string_view text) {
  std::string value;
  while (!text.empty()) {
    const bool escaped = text.starts_with("\\x") && text.size() >= 4;
    const int byte = escaped ? digit(text[2]) * 16 + digit(text[3]) : text.front();
    value += static_cast<char>(byte);
    text.remove_prefix(escaped ? 4 : 1);
  }
  return value;
}

}  // namespace

TreeReader::TreeReader(const char* socket, const char* root) {
  const int file = memfd_create("listing", MFD_CLOEXEC);
  ktree::client::Reason reason;
  const CallResult result =
      file < 0 ? CallResult::kFailed : ktree::client::list_to(socket, root, file, reason);
  answered_ = result == CallResult::kDone || result == CallResult::kMissing;
  if (result == CallResult::kDone) take(content_of(file));
  if (file >= 0) close(file);
}

TreeReader::TreeReader(std::string_view listing) {
  take(listing);
}

void TreeReader::take(std::string_view listing) {
  while (!listing.empty()) {
    const std::string_view line = listing.substr(0, listing.find('\n'));
    const size_t equals = line.find('=');
    if (equals != std::string_view::npos) {
      values_.emplace(line.substr(0, equals), unescaped(line.substr(equals + 1)));
    }
    listing.remove_prefix(std::min(line.size() + 1, listing.size()));
  }
}

std::string TreeReader::read(const char* path) const {
  const auto found = values_.find(std::string_view(path));
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
