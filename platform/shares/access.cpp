#include "shares/access.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

#include "common/utf8.h"
#include "shares/server_config.h"
#include "shares/share_file.h"
#include "shares/share_name.h"

namespace shares {
namespace {

constexpr std::string_view kOption = "\tvalid users = ";
// netatalk does not read a line of more than 1023 bytes, nor anything else of a file that has one.
constexpr size_t kMaxOption = 900;
// What begins a substitution, a text, a comment or a list of its own in one of the servers' files.
constexpr wchar_t kForbidden[] = L"%\"'#;,=<>*?|/[]:";
constexpr wchar_t kForbiddenFirst[] = L"+&@-";

// Why this cannot be the name of a user, or of a group behind its "@"; null when it can.
const char* refusal(std::string_view name) {
  std::wstring characters;
  if (name.empty()) return "a name is empty";
  if (!platform::decode(name, characters)) return "a name is not UTF-8";
  for (size_t at = 0; at < characters.size(); at++) {
    if (platform::is_control(characters[at]) || platform::is_hidden(characters, at)) {
      return "a name holds a character that is not seen";
    }
  }
  if (characters.find_first_of(kForbidden) != std::wstring::npos ||
      std::wstring_view(kForbiddenFirst).find(characters.front()) != std::wstring_view::npos ||
      characters.back() == L'\\') {
    return "a name holds a character that the file servers do not take";
  }
  return nullptr;
}

// Reads "maria, @family" into the rule. Returns what is wrong with it, or null.
const char* take_names(std::string_view text, AccessRule& rule) {
  while (true) {
    const size_t end = std::min(text.find(','), text.size());
    const std::string_view name = trim(text.substr(0, end));
    const bool group = name.starts_with('@');
    if (const char* why = refusal(group ? name.substr(1) : name)) return why;
    rule.names.emplace_back(name);
    if (end == text.size()) break;
    text.remove_prefix(end + 1);
  }
  return access_option(rule).size() > kMaxOption ? "the list is too long" : nullptr;
}

// Reads "[Photos]" and begins its rule. Returns what is wrong with it, or null.
const char* take_heading(std::string_view line, Access& access) {
  if (!line.ends_with(']')) return "a heading has no ] at its end";
  AccessRule rule;
  rule.share = trim(line.substr(1, line.size() - 2));
  rule.folded = folded_name(rule.share);
  if (rule.folded.empty()) return "a heading names no share";
  const bool known = std::any_of(access.rules.begin(), access.rules.end(),
                                 [&rule](const AccessRule& other) { return other.folded == rule.folded; });
  access.rules.push_back(rule);
  return known ? "this share has been named above" : nullptr;
}

// The only option is "users = LIST".
const char* take_option(std::string_view line, Access& access) {
  const size_t equals = line.find('=');
  if (equals == std::string_view::npos || trim(line.substr(0, equals)) != "users") {
    return "this is neither [SHARE] nor users = NAME, ...";
  }
  if (access.rules.empty()) return "no [SHARE] stands above it";
  if (!access.rules.back().names.empty()) return "this share has a list already";
  return take_names(trim(line.substr(equals + 1)), access.rules.back());
}

Access wrong(int line, const char* why) {
  return {{}, line, why};
}

}  // namespace

Access parse_access(std::string_view text) {
  Access access;
  int heading = 0;
  for (int number = 1; !text.empty(); number++) {
    const size_t end = std::min(text.find('\n'), text.size());
    const std::string_view line = trim(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
    if (line.empty() || line.starts_with('#') || line.starts_with(';')) continue;
    const bool heads = line.starts_with('[');
    if (heads && heading != 0 && access.rules.back().names.empty()) return wrong(heading, "it has no list");
    if (const char* why = heads ? take_heading(line, access) : take_option(line, access)) {
      return wrong(number, why);
    }
    if (heads) heading = number;
  }
  if (heading != 0 && access.rules.back().names.empty()) return wrong(heading, "it has no list");
  return access;
}

Access read_access(const char* file) {
  // A link that leads nowhere is not a missing file.
  struct stat info {};
  if (lstat(file, &info) != 0 && errno == ENOENT) return {};
  const std::string text = read_file(file);
  if (stat(file, &info) != 0 || !S_ISREG(info.st_mode) || text.size() != static_cast<size_t>(info.st_size)) {
    return wrong(0, "it cannot be read");
  }
  return parse_access(text);
}

const AccessRule* rule_of(const Access& access, std::string_view share) {
  const std::wstring folded = folded_name(share);
  for (const AccessRule& rule : access.rules) {
    if (rule.folded == folded) return &rule;
  }
  return nullptr;
}

std::string access_option(const AccessRule& rule) {
  std::string text(kOption);
  for (const std::string& name : rule.names) {
    const bool blank = name.find(' ') != std::string::npos;
    if (&name != rule.names.data()) text += ',';
    text += blank ? '"' + name + '"' : name;
  }
  return text += '\n';
}

std::string_view access_line(std::string_view section) {
  const size_t at = section.find(kOption);
  return at == std::string_view::npos ? std::string_view() : section.substr(at, section.find('\n', at) - at);
}

bool has_blanks(const AccessRule& rule) {
  return std::any_of(rule.names.begin(), rule.names.end(),
                     [](const std::string& name) { return name.find(' ') != std::string::npos; });
}

}  // namespace shares
