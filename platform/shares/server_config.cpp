#include "shares/server_config.h"

#include <sys/stat.h>

#include <algorithm>
#include <cctype>

#include "shares/share_file.h"
#include "shares/share_name.h"

namespace shares {
namespace {

constexpr size_t kMaxFiles = 100;  // Samba's own limit

bool is_blank(char character) {
  return isspace(static_cast<unsigned char>(character)) != 0;
}

// An option's name, or a word, as the servers compare it: lower case, no blanks.
std::string plain_name(std::string_view text) {
  std::string name;
  for (const char character : text) {
    if (!is_blank(character)) name += static_cast<char>(tolower(static_cast<unsigned char>(character)));
  }
  return name;
}

// A section's name: several blanks in a row are one.
std::string section_name(std::string_view line) {
  std::string name;
  for (const char character : trim(line.substr(1, std::min(line.find(']'), line.size()) - 1))) {
    if (!is_blank(character)) name += character;
    if (is_blank(character) && name.back() != ' ') name += ' ';
  }
  return name;
}

bool is_comment(std::string_view line) {
  return line.starts_with('#') || line.starts_with(';');
}

// Takes the first line off `text`, trimmed, with those that it goes on in.
std::string take_line(std::string_view& text) {
  std::string line;
  for (bool more = true; more;) {
    const size_t end = std::min(text.find('\n'), text.size());
    std::string_view piece = trim(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
    more = piece.ends_with('\\') && !text.empty() && !(line.empty() && is_comment(piece));
    if (more) piece.remove_suffix(1);
    line += piece;
  }
  return std::string(trim(line));
}

bool is_yes(const std::string& value) {
  return value == "yes" || value == "true" || value == "on" || value == "1";
}

void take_option(std::string_view line, bool global, ServerConfig& config) {
  const size_t equals = line.find('=');
  if (equals == std::string_view::npos) return;
  const std::string name = plain_name(line.substr(0, equals));
  const std::string_view text = trim(line.substr(equals + 1));
  const std::string value = plain_name(text);
  if (name == "vfsobjects" || name == "vfsobject") config.sets_vfs_objects |= global;
  if (name == "registryshares") config.uses_registry |= is_yes(value);
  if (name == "configbackend" || name == "include") config.uses_registry |= value == "registry";
  if (name != "include" && name != "configfile") return;
  if (!text.empty() && text.find('%') == std::string_view::npos) {
    config.includes.push_back({std::string(text), global});
  }
}

// A file that is the same whatever path leads to it.
struct FileId {
  dev_t device;
  ino_t inode;
  bool operator==(const FileId&) const = default;
};

bool identify(const std::string& path, FileId& id) {
  struct stat info {};
  if (stat(path.c_str(), &info) != 0) return false;
  id = {info.st_dev, info.st_ino};
  return true;
}

// Services run in the root folder, which is where their relative paths begin.
std::string whole_path(const std::string& path) {
  return path.starts_with('/') ? path : "/" + path;
}

}  // namespace

std::string_view trim(std::string_view text) {
  while (!text.empty() && is_blank(text.front())) text.remove_prefix(1);
  while (!text.empty() && is_blank(text.back())) text.remove_suffix(1);
  return text;
}

void parse_server_config(std::string_view text, bool global, ServerConfig& config) {
  while (!text.empty()) {
    const std::string line = take_line(text);
    if (line.empty() || is_comment(line)) continue;
    if (line.front() != '[') {
      take_option(line, global, config);
      continue;
    }
    const std::string name = section_name(line);
    const std::string plain = plain_name(name);
    global = plain == "global" || plain == "globals";
    if (!global) config.names.push_back(folded_name(name));
  }
}

ServerConfig read_server_config(const char* file, const char* generated) {
  ServerConfig config;
  config.includes.push_back({file, true});
  FileId ours{};
  const bool have_ours = identify(generated, ours);
  std::vector<FileId> seen;
  for (size_t i = 0; i < config.includes.size() && seen.size() < kMaxFiles; i++) {
    const Include include = config.includes[i];
    const std::string path = whole_path(include.file);
    FileId id{};
    const bool there = identify(path, id);
    if (path == generated || (there && have_ours && id == ours)) {
      config.includes_shares = true;
    } else if (there && std::find(seen.begin(), seen.end(), id) == seen.end()) {
      seen.push_back(id);
      parse_server_config(read_file(path.c_str()), include.global, config);
    }
  }
  return config;
}

}  // namespace shares
