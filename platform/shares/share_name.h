// Which share names a file server's configuration can carry.
#ifndef PLATFORM_SHARES_SHARE_NAME_H
#define PLATFORM_SHARES_SHARE_NAME_H

#include <string>
#include <string_view>
#include <vector>

namespace shares {

// What a file server keeps for itself.
struct NameRules {
  std::wstring_view forbidden;              // characters that its names may not hold
  std::vector<std::wstring_view> reserved;  // names, in lower case and without blanks
  bool keeps_drives;                        // a letter and a dollar sign
};

extern const NameRules kSambaNames, kNetatalkNames;

// Why `name` cannot be the name of a share, as a person reads it; null when it can.
const char* name_refusal(std::string_view name, const NameRules& rules);

// `name` in lower case and without what is not seen: file servers take names that differ in case alone for
// one, and people do so for the rest. Empty when it is not UTF-8.
std::wstring folded_name(std::string_view name);

}  // namespace shares

#endif
