#include "utf8.h"

#include <limits.h>
#include <locale.h>

#include <cstdio>
#include <cwchar>
#include <cwctype>

namespace platform {
namespace {

locale_t utf8_locale() {
  static const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  return locale;
}

class Utf8Scope {
 public:
  Utf8Scope() : before_(uselocale(utf8_locale())) {}
  ~Utf8Scope() { uselocale(before_); }
  Utf8Scope(const Utf8Scope&) = delete;
  Utf8Scope& operator=(const Utf8Scope&) = delete;

 private:
  locale_t before_;
};

void append_escaped(std::string& text, std::string_view bytes) {
  for (const char byte : bytes) {
    char hex[8];
    snprintf(hex, sizeof hex, "\\x%02X", static_cast<unsigned char>(byte));
    text += hex;
  }
}

bool is_plain(char byte) {
  return byte >= 0x20 && byte < 0x7f;
}

}  // namespace

bool decode(std::string_view text, std::wstring& characters) {
  const Utf8Scope scope;
  characters.resize(text.size());
  const char* next = text.data();
  mbstate_t state{};
  const size_t count = mbsnrtowcs(characters.data(), &next, text.size(), characters.size(), &state);
  const bool whole = count != static_cast<size_t>(-1) && mbsinit(&state) != 0;
  characters.resize(whole ? count : 0);
  return whole;
}

bool is_control(wchar_t character) {
  return character < 0x20 || (character >= 0x7f && character < 0xa0) || character == 0x2028 ||
         character == 0x2029;
}

wchar_t lower_case(wchar_t character) {
  return static_cast<wchar_t>(towlower_l(static_cast<wint_t>(character), utf8_locale()));
}

size_t cells(std::string_view text) {
  std::wstring characters;
  if (!decode(text, characters)) return text.size();
  const Utf8Scope scope;
  size_t sum = 0;
  for (const wchar_t character : characters) {
    const int width = wcwidth(character);
    sum += width > 0 ? static_cast<size_t>(width) : 0;
  }
  return sum;
}

std::string printable(std::string_view text) {
  std::wstring characters;
  std::string shown;
  if (!decode(text, characters)) {
    for (const char& byte : text) {
      is_plain(byte) ? static_cast<void>(shown += byte) : append_escaped(shown, {&byte, 1});
    }
    return shown;
  }
  const Utf8Scope scope;
  for (const wchar_t character : characters) {
    char bytes[MB_LEN_MAX];
    mbstate_t state{};
    const std::string_view encoded(bytes, wcrtomb(bytes, character, &state));
    is_control(character) ? append_escaped(shown, encoded) : static_cast<void>(shown += encoded);
  }
  return shown;
}

}  // namespace platform
