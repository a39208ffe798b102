#include "shares/share_name.h"

#include <algorithm>

#include "common/utf8.h"

namespace shares {

// The administrative shares are those that clients take for a Windows server's own: C$ and every other drive.
// The characters are those that Samba's own "net conf addshare" refuses, and the brackets around a section's
// name. Its parser knows [global] by two names, whatever blanks are in them.
const NameRules kSambaNames = {
    L"%<>*?|/\\+=;:\",[]",
    {L"global", L"globals", L"homes", L"printers", L"print$", L"ipc$", L"admin$", L"netlogon", L"sysvol"},
    true};

// afp.conf(5): a dollar sign starts a variable.
const NameRules kNetatalkNames = {L"%<>*?|/\\+=;:\",[]$", {L"global", L"homes"}, false};

namespace {

bool hides_something(const std::wstring& characters) {
  for (size_t at = 0; at < characters.size(); at++) {
    if (platform::is_hidden(characters, at)) return true;
  }
  return false;
}

bool is_reserved(std::string_view name, const NameRules& rules) {
  std::wstring plain = folded_name(name);
  plain.erase(std::remove(plain.begin(), plain.end(), L' '), plain.end());
  const bool drive =
      rules.keeps_drives && plain.size() == 2 && plain[1] == L'$' && plain[0] >= L'a' && plain[0] <= L'z';
  return drive || std::find(rules.reserved.begin(), rules.reserved.end(), plain) != rules.reserved.end();
}

}  // namespace

const char* name_refusal(std::string_view name, const NameRules& rules) {
  std::wstring characters;
  if (name.empty() || name == "." || name == "..") return "it names no folder";
  if (!platform::decode(name, characters)) return "it is not UTF-8";
  if (std::any_of(characters.begin(), characters.end(), platform::is_control)) {
    return "it holds a control character";
  }
  if (hides_something(characters)) {
    return "it holds a character that is not seen or that turns the text around";
  }
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
  platform::decode(name, characters);
  std::erase_if(characters, platform::is_invisible);
  for (wchar_t& character : characters) character = platform::lower_case(character);
  return characters;
}

}  // namespace shares
