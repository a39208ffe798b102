// A generated file of shares: sections as file servers read them, each "[name]" and lines below it.
#ifndef PLATFORM_SHARES_SHARE_FILE_H
#define PLATFORM_SHARES_SHARE_FILE_H

#include <string>
#include <string_view>
#include <vector>

namespace shares {

struct Section {
  std::string name;
  std::string path;
  std::string text;  // the whole section, its first line included

  bool operator==(const Section&) const = default;
};

// Makes a section: `options` are whole lines.
Section make_section(const std::string& name, const std::string& path, const std::string& options);

// The sections of a file that compose() made.
std::vector<Section> parse_sections(std::string_view text);

// The file with a comment on top that says who made it; `maker` is a program's name.
std::string compose(const char* maker, const std::vector<Section>& sections);

// The content of a file, a mebibyte of it at most; empty when it cannot be read or is no regular file, which
// might never come to an end.
std::string read_file(const char* path);

// Replaces `path` in one step by a file with this text, readable by everybody. Returns false, with errno.
bool replace_file(const char* path, std::string_view text);

}  // namespace shares

#endif
