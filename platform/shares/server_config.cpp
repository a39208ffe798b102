#include "server_config.h"

#include <algorithm>
#include <cctype>

#include "share_name.h"

namespace shares {
namespace {

bool is_blank(char character) {
  return isspace(static_cast<unsigned char>(character)) != 0;
}

std::string_view trim(std::string_view text) {
  while (!text.empty() && is_blank(text.front())) text.remove_prefix(1);
  while (!text.empty() && is_blank(text.back())) text.remove_suffix(1);
  return text;
}

// A name as the servers compare it: lower case, no blanks.
std::string plain_name(std::string_view text) {
  std::string name;
  for (const char character : text) {
    if (!is_blank(character)) name += static_cast<char>(tolower(static_cast<unsigned char>(character)));
  }
  return name;
}

void take_option(std::string_view line, std::string_view generated, bool global, ServerConfig& config) {
  const size_t equals = line.find('=');
  if (equals == std::string_view::npos) return;
  const std::string name = plain_name(line.substr(0, equals));
  if (name == "include" && trim(line.substr(equals + 1)) == generated) config.includes_shares = true;
  if (global && (name == "vfsobjects" || name == "vfsobject")) config.sets_vfs_objects = true;
}

}  // namespace

ServerConfig parse_server_config(std::string_view text, std::string_view generated) {
  ServerConfig config;
  bool global = true;
  while (!text.empty()) {
    const size_t end = std::min(text.find('\n'), text.size());
    const std::string_view line = trim(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
    if (line.empty() || line.front() == '#' || line.front() == ';') continue;
    if (line.front() != '[') {
      take_option(line, generated, global, config);
      continue;
    }
    const std::string_view name = trim(line.substr(1, std::min(line.find(']'), line.size()) - 1));
    const std::string plain = plain_name(name);
    global = plain == "global" || plain == "globals";
    if (!global) config.names.push_back(folded_name(name));
  }
  return config;
}

}  // namespace shares
