#include "shares/share_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "common/fd.h"

namespace shares {
namespace {

constexpr std::string_view kPathOption = "\tpath = ";
constexpr size_t kMaxText = 1 << 20;

// Takes the first line, with its newline, off `text`.
std::string_view take_line(std::string_view& text) {
  const size_t end = text.find('\n');
  const std::string_view line = text.substr(0, end == std::string_view::npos ? end : end + 1);
  text.remove_prefix(line.size());
  return line;
}

}  // namespace

Section make_section(const std::string& name, const std::string& path, const std::string& options) {
  return {name, path, "[" + name + "]\n" + std::string(kPathOption) + path + "\n" + options};
}

std::vector<Section> parse_sections(std::string_view text) {
  std::vector<Section> sections;
  while (!text.empty()) {
    const std::string_view line = take_line(text);
    if (line.starts_with('[') && line.ends_with("]\n")) {
      sections.push_back({std::string(line.substr(1, line.size() - 3)), {}, {}});
    }
    if (sections.empty()) continue;
    Section& section = sections.back();
    section.text += line;
    if (line.starts_with(kPathOption)) {
      section.path = line.substr(kPathOption.size(), line.size() - kPathOption.size() - 1);
    }
  }
  return sections;
}

std::string compose(const char* maker, const std::vector<Section>& sections) {
  std::string text =
      std::string("# Made by ") + maker + " from the volumes that are mounted. Changes here are lost.\n";
  for (const Section& section : sections) text += section.text;
  return text;
}

std::string read_file(const char* path) {
  std::string text;
  const int fd = open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return text;
  struct stat info {};
  const bool regular = fstat(fd, &info) == 0 && S_ISREG(info.st_mode);
  char block[4096];
  ssize_t size = regular ? 1 : 0;
  while (size > 0 && text.size() < kMaxText) {
    size = read(fd, block, sizeof block);
    if (size > 0) text.append(block, static_cast<size_t>(size));
  }
  close(fd);
  return text;
}

bool replace_file(const char* path, std::string_view text) {
  const std::string draft = std::string(path) + ".new";
  unlink(draft.c_str());
  const int fd = open(draft.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
  if (fd < 0) return false;
  bool good = platform::write_all(fd, text.data(), text.size()) && fchmod(fd, 0644) == 0;
  const int error = errno;
  good = close(fd) == 0 && good;
  good = good && rename(draft.c_str(), path) == 0;
  if (!good && error != 0) errno = error;
  return good;
}

}  // namespace shares
