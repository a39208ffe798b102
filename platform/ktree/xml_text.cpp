#include "ktree/xml_text.h"

#include <cstddef>
#include <cstdint>

namespace ktree {
namespace {

bool is_xml_character(uint32_t c) {
  if (c < 0x20) return c == '\t' || c == '\n';
  return c < 0xD800 || (c >= 0xE000 && c <= 0xFFFD) || (c >= 0x10000 && c <= 0x10FFFF);
}

// The character at the start of `text` and its length in bytes; length 0 when it is not UTF-8 (RFC 3629),
// which leaves no second spelling of a character.
struct Decoded {
  uint32_t character;
  size_t length;
};

Decoded decode_utf8(std::string_view text) {
  const auto byte = [&](size_t i) { return static_cast<unsigned char>(text[i]); };
  const uint32_t lead = byte(0);
  if (lead < 0x80) return {lead, 1};
  const size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
  if (lead < 0xC2 || lead > 0xF4 || text.size() < length) return {0, 0};
  uint32_t character = lead & (0x7FU >> length);
  for (size_t i = 1; i < length; i++) {
    if ((byte(i) & 0xC0U) != 0x80) return {0, 0};
    character = character << 6 | (byte(i) & 0x3FU);
  }
  constexpr uint32_t kSmallest[] = {0, 0, 0x80, 0x800, 0x10000};
  return {character, character < kSmallest[length] ? 0 : length};
}

bool is_xml_text(std::string_view text) {
  while (!text.empty()) {
    Decoded next = decode_utf8(text);
    if (next.length == 0 || !is_xml_character(next.character)) return false;
    text.remove_prefix(next.length);
  }
  return true;
}

}  // namespace

std::string_view trim_blanks(std::string_view text) {
  size_t first = text.find_first_not_of(kXmlBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kXmlBlanks) - first + 1);
}

bool needs_encoding(std::string_view value, bool has_children) {
  std::string_view kept = trim_blanks(value);
  if (has_children ? kept.empty() || kept.size() != value.size() : kept.empty() && !value.empty()) {
    return true;
  }
  return !is_xml_text(value);
}

}  // namespace ktree
