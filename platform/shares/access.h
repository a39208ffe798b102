// Who may use a share: remvol-shares.conf(5), a file of the administrator's.
#ifndef PLATFORM_SHARES_ACCESS_H
#define PLATFORM_SHARES_ACCESS_H

#include <string>
#include <string_view>
#include <vector>

namespace shares {

// The users and groups of one share.
struct AccessRule {
  std::string share;               // its name as printable text
  std::wstring folded;             // that name, folded
  std::vector<std::string> names;  // of users, and of groups with an "@" before them; never empty
};

struct Access {
  std::vector<AccessRule> rules;  // of different shares
  int line = 0;                   // what is wrong with this line of the file, counted from 1; 0: nothing
  const char* why = nullptr;      // null: nothing is wrong
};

// Reads the text of the file. When a line of it is not understood there are no rules: whom the administrator
// meant to shut out is not known then.
Access parse_access(std::string_view text);

// Reads the file; without one there are no rules, and one that cannot be read is wrong as well.
Access read_access(const char* file);

// The rule of a share; null when everybody may use it.
const AccessRule* rule_of(const Access& access, std::string_view share);

// The option that holds it, a whole line, in the form that smb.conf and afp.conf share.
std::string access_option(const AccessRule& rule);

// The line of that option among those of a section; empty when it has none.
std::string_view access_line(std::string_view section);

// True when a name holds a blank. Samba takes such names in quotes, netatalk does not.
bool has_blanks(const AccessRule& rule);

}  // namespace shares

#endif
