#include "common/tree_listing.h"

#include <sys/mman.h>
#include <sys/stat.h>

#include "ktree/client/calls.h"
#include "ktree/client/document.h"

namespace platform {
namespace {

using ktree::client::CallResult;

int digit(char character) {
  constexpr std::string_view kDigits = "0123456789ABCDEF";
  const size_t at = kDigits.find(character);
  return at == std::string_view::npos ? -1 : static_cast<int>(at);
}

// All of a memory file, mapped; empty when there is nothing in it or it cannot be had.
std::string_view mapped_text(int file) {
  struct stat info {};
  if (fstat(file, &info) != 0 || info.st_size <= 0) return {};
  const auto size = static_cast<size_t>(info.st_size);
  void* text = mmap(nullptr, size, PROT_READ, MAP_PRIVATE | MAP_POPULATE, file, 0);
  return text == MAP_FAILED ? std::string_view() : std::string_view(static_cast<const char*>(text), size);
}

}  // namespace

TreeListing::TreeListing(const char* socket, const char* root) {
  const ktree::client::MemoryFile document;
  ktree::client::Reason reason;
  const CallResult result = ktree::client::list(socket, root, document, reason);
  answered_ = result == CallResult::kDone || result == CallResult::kMissing;
  if (result == CallResult::kDone) text_ = mapped_text(document.fd());
}

TreeListing::~TreeListing() {
  if (copy_.empty() && !text_.empty()) munmap(const_cast<char*>(text_.data()), text_.size());
}

// A listing has control characters and the backslash as \xHH.
std::string_view TreeListing::unescaped(std::string_view value, std::string& room) {
  if (value.find('\\') == std::string_view::npos) return value;
  room.clear();
  while (!value.empty()) {
    const bool escaped = value.starts_with("\\x") && value.size() >= 4;
    const int byte = escaped ? digit(value[2]) * 16 + digit(value[3]) : value.front();
    room += static_cast<char>(byte);
    value.remove_prefix(escaped ? 4 : 1);
  }
  return room;
}

}  // namespace platform
