#include "ktree/path.h"

namespace ktree {
namespace {

bool is_name_start(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || c == '_';
}

bool is_name_part(char c) {
  return is_name_start(c) || (c >= '0' && c <= '9') || c == '.' || c == '-';
}

// "1" to "4096" without leading zeros; 0 for anything else.
uint16_t parse_number(std::string_view text) {
  constexpr size_t kMaxDigits = 4;
  if (text.empty() || text.size() > kMaxDigits || text.front() == '0') return 0;
  unsigned number = 0;
  for (char c : text) {
    if (c < '0' || c > '9') return 0;
    number = number * 10 + static_cast<unsigned>(c - '0');
  }
  return number <= kMaxNumber ? static_cast<uint16_t>(number) : uint16_t{0};
}

bool parse_element(std::string_view text, Element& element) {
  const size_t colon = text.find(':');
  const std::string_view name = text.substr(0, colon);
  element.text = name.data();
  element.length = static_cast<uint16_t>(name.size());
  element.number = colon == std::string_view::npos ? uint16_t{1} : parse_number(text.substr(colon + 1));
  return element.number != 0 && valid_name(name);
}

}  // namespace

bool valid_name(std::string_view text) {
  if (text.empty() || !is_name_start(text.front())) return false;
  for (char c : text) {
    if (!is_name_part(c)) return false;
  }
  return true;
}

bool parse_path(std::string_view text, Path& path) {
  path.depth = 0;
  if (text.size() > kMaxPathBytes || text.empty()) return false;
  while (!text.empty()) {
    if (text.front() != '/' || path.depth == path.elements.size()) return false;
    text.remove_prefix(1);
    std::string_view element = text.substr(0, text.find('/'));
    if (!parse_element(element, path.elements[path.depth])) return false;
    path.depth++;
    text.remove_prefix(element.size());
  }
  return true;
}

size_t number_length(size_t number) {
  if (number == 1) return 0;
  size_t length = 1;
  for (; number > 0; number /= 10) length++;
  return length;
}

}  // namespace ktree
