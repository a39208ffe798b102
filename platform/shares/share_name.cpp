#include "share_name.h"

#include <locale.h>

#include <algorithm>
#include <cstdio>
#include <cwchar>
#include <cwctype>

namespace shares {

// The characters are those that Samba's own "net conf addshare" refuses, and the brackets around a section's
// name. Its parser knows [global] by two names, whatever blanks are in them.
const NameRules kSambaNames = {L"%<>*?|/\\+=;:\",[]",
                               {L"global", L"globals", L"homes", L"printers", L"print$", L"ipc$", L"admin$"}};

// afp.conf(5): a dollar sign starts a variable.
const NameRules kNetatalkNames = {L"%<>*?|/\\+=;:\",[]$", {L"global", L"homes"}};

namespace {

locale_t utf8_locale() {
  static const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  return locale;
}

// Returns false when `text` is not UTF-8.
bool decode(std::string_view text, std::wstring& characters) {
  characters.resize(text.size());
  const char* next = text.data();
  mbstate_t state{};
  const locale_t before = uselocale(utf8_locale());
  const size_t count = mbsnrtowcs(characters.data(), &next, text.size(), characters.size(), &state);
  uselocale(before);
  const bool whole = count != static_cast<size_t>(-1) && mbsinit(&state) != 0;
  characters.resize(whole ? count : 0);
  return whole;
}

// U+0080 to U+009F are control characters too; the line and paragraph separators end lines for some readers.
bool is_control(wchar_t character) {
  return character < 0x20 || (character >= 0x7f && character < 0xa0) || character == 0x2028 ||
         character == 0x2029;
}

bool is_reserved(std::string_view name, const NameRules& rules) {
  std::wstring plain = folded_name(name);
  plain.erase(std::remove(plain.begin(), plain.end(), L' '), plain.end());
  return std::find(rules.reserved.begin(), rules.reserved.end(), plain) != rules.reserved.end();
}

}  // namespace

const char* name_refusal(std::string_view name, const NameRules& rules) {
  std::wstring characters;
  if (name.empty() || name == "." || name == "..") return "it names no folder";
  if (!decode(name, characters)) return "it is not UTF-8";
  if (std::any_of(characters.begin(), characters.end(), is_control)) return "it holds a control character";
  if (characters.find_first_of(rules.forbidden) != std::wstring::npos) {
    return "it holds a character that the file server does not allow in names";
  }
  if (name.front() == ' ' || name.back() == ' ') return "it begins or ends with a blank";
  if (name.find("  ") != std::string_view::npos) return "it holds several blanks in a row";
  if (name.front() == '#') return "it begins like a comment";
  return is_reserved(name, rules) ? "the file server keeps this name for itself" : nullptr;
}

std::wstring folded_name(std::string_view name) {
  std::wstring characters;
  decode(name, characters);
  for (wchar_t& character : characters) {
    character = static_cast<wchar_t>(towlower_l(static_cast<wint_t>(character), utf8_locale()));
  }
  return characters;
}

std::string printable_name(std::string_view name) {
  std::wstring characters;
  const bool utf8 = decode(name, characters);
  std::string text;
  for (const char byte : name) {
    const auto code = static_cast<unsigned char>(byte);
    if (code >= 0x20 && code != 0x7f && (utf8 || code < 0x80)) {
      text += byte;
    } else {
      char hex[8];
      snprintf(hex, sizeof hex, "\\x%02X", code);
      text += hex;
    }
  }
  return text;
}

}  // namespace shares
