#include "common/utf8.h"

#include <locale.h>

#include <algorithm>
#include <cstdio>
#include <cwchar>
#include <cwctype>

namespace platform {
namespace {

// What the characters are is known from this locale. A small system may lack it; only ASCII is known then.
locale_t utf8_locale() {
  static const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  return locale;
}

// How a character of N bytes begins, from 2 on: its first byte, the bits of it that say so, the smallest
// character that needs N bytes.
constexpr struct {
  unsigned char first, mask;
  wchar_t smallest;
} kForms[] = {{0xc0, 0xe0, 0x80}, {0xe0, 0xf0, 0x800}, {0xf0, 0xf8, 0x10000}};

bool is_character(wchar_t character) {
  return character < 0xd800 || (character > 0xdfff && character <= 0x10ffff);
}

// Reads the character at the front of `text`. Returns the bytes that it takes, 0 when there is none.
size_t first_character(std::string_view text, wchar_t& character) {
  const auto first = static_cast<unsigned char>(text.front());
  if (first < 0x80) {
    character = first;
    return 1;
  }
  for (size_t size = 2; size < 2 + std::size(kForms); size++) {
    const auto& form = kForms[size - 2];
    if ((first & form.mask) != form.first) continue;
    if (text.size() < size) return 0;
    character = first & ~form.mask;
    for (const char next : text.substr(1, size - 1)) {
      if ((next & 0xc0) != 0x80) return 0;
      character = (character << 6) | (next & 0x3f);
    }
    return character >= form.smallest && is_character(character) ? size : 0;
  }
  return 0;
}

// Asked of the locale that is known here, which is not the process's.
size_t cells_of(wchar_t character) {
  const locale_t before = uselocale(utf8_locale());
  const int width = wcwidth(character);
  uselocale(before);
  return width > 0 ? static_cast<size_t>(width) : 0;
}

void append_escaped(std::string& text, std::string_view bytes) {
  for (const char byte : bytes) {
    char hex[8];
    snprintf(hex, sizeof hex, "\\x%02X", static_cast<unsigned char>(byte));
    text += hex;
  }
}

// Of text that is not UTF-8 there are no `characters`; only ASCII is plain then.
bool is_plain(std::string_view bytes, const std::wstring& characters, size_t at) {
  if (characters.empty()) return bytes.size() == 1 && !is_control(bytes.front());
  return !is_control(characters[at]) && !is_hidden(characters, at);
}

}  // namespace

bool is_printable_ascii(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char byte) { return byte >= 0x20 && byte < 0x7f; });
}

bool decode(std::string_view text, std::wstring& characters) {
  characters.clear();
  characters.reserve(text.size());
  while (!text.empty()) {
    wchar_t character = 0;
    const size_t size = first_character(text, character);
    if (size == 0) {
      characters.clear();
      return false;
    }
    characters += character;
    text.remove_prefix(size);
  }
  return true;
}

bool is_control(wchar_t character) {
  return character < 0x20 || (character >= 0x7f && character < 0xa0) || character == 0x2028 ||
         character == 0x2029;
}

// Unicode's Default_Ignorable_Code_Point (DerivedCoreProperties.txt), which has the direction marks in it,
// and the annotation marks.
bool is_invisible(wchar_t character) {
  constexpr struct {
    wchar_t first, last;
  } kRanges[] = {{0xad, 0xad},      {0x34f, 0x34f},   {0x61c, 0x61c},     {0x115f, 0x1160},
                 {0x17b4, 0x17b5},  {0x180b, 0x180f}, {0x200b, 0x200f},   {0x202a, 0x202e},
                 {0x2060, 0x206f},  {0x3164, 0x3164}, {0xfe00, 0xfe0f},   {0xfeff, 0xfeff},
                 {0xffa0, 0xffa0},  {0xfff0, 0xfffb}, {0x1bca0, 0x1bca3}, {0x1d173, 0x1d17a},
                 {0xe0000, 0xe0fff}};
  for (const auto& range : kRanges) {  // in their order
    if (character < range.first) return false;
    if (character <= range.last) return true;
  }
  return false;
}

bool is_hidden(std::wstring_view characters, size_t at) {
  constexpr std::wstring_view kJoiners = L"\u200c\u200d\ufe0e\ufe0f";
  constexpr wchar_t kKeyCap = 0x20e3;
  if (!is_invisible(characters[at])) return false;
  if (at == 0 || kJoiners.find(characters[at]) == std::wstring_view::npos) return true;
  return characters[at - 1] < 0x80 && (at + 1 == characters.size() || characters[at + 1] != kKeyCap);
}

wchar_t lower_case(wchar_t character) {
  if (character >= L'A' && character <= L'Z') return character + (L'a' - L'A');
  if (character < 0x80 || utf8_locale() == nullptr) return character;
  return static_cast<wchar_t>(towlower_l(static_cast<wint_t>(character), utf8_locale()));
}

size_t cells(std::string_view text) {
  if (is_printable_ascii(text)) return text.size();
  std::wstring characters;
  if (!decode(text, characters)) return text.size();
  if (utf8_locale() == nullptr) return characters.size();
  size_t sum = 0;
  for (const wchar_t character : characters) sum += cells_of(character);
  return sum;
}

size_t first_cells(std::string_view text, size_t most) {
  // A mark may stand behind a character that is ASCII, not within such text.
  if (is_printable_ascii(text.substr(0, most + 1))) return std::min(text.size(), most);
  std::wstring characters;
  if (!decode(text, characters)) return std::min(text.size(), most);
  size_t bytes = 0, sum = 0;
  while (bytes < text.size()) {
    wchar_t character = 0;
    const size_t size = first_character(text.substr(bytes), character);
    sum += utf8_locale() != nullptr ? cells_of(character) : 1;
    if (sum > most) break;
    bytes += size;
  }
  return bytes;
}

std::string printable(std::string_view text) {
  if (is_printable_ascii(text)) return std::string(text);
  std::wstring characters;
  decode(text, characters);
  std::string shown;
  for (size_t at = 0; !text.empty(); at++) {
    wchar_t character = 0;
    const size_t size = first_character(text, character);
    const std::string_view bytes = text.substr(0, size);
    is_plain(bytes, characters, at) ? static_cast<void>(shown += bytes)
                                    : append_escaped(shown, text.substr(0, size == 0 ? 1 : size));
    text.remove_prefix(size == 0 ? 1 : size);
  }
  return shown;
}

std::string ascii(std::string_view text) {
  std::string shown;
  for (size_t at = 0; at < text.size(); at++) {
    const bool plain = static_cast<unsigned char>(text[at]) < 0x80;
    plain ? static_cast<void>(shown += text[at]) : append_escaped(shown, text.substr(at, 1));
  }
  return shown;
}

}  // namespace platform
