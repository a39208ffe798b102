// Short ways to use a tree in tests.
#ifndef TESTS_KTREE_SUPPORT_H
#define TESTS_KTREE_SUPPORT_H

#include <sys/mman.h>
#include <unistd.h>

#include <optional>
#include <string>
#include <string_view>

#include "ktree/listing.h"
#include "ktree/path.h"
#include "ktree/settings_reader.h"
#include "ktree/settings_writer.h"
#include "ktree/tree.h"

namespace ktree {

inline bool set(Tree& tree, std::string_view text, std::string_view value) {
  Path path;
  return parse_path(text, path) && tree.set(path, value);
}

inline bool remove(Tree& tree, std::string_view text) {
  Path path;
  return parse_path(text, path) && tree.remove(path);
}

inline std::optional<std::string> get(const Tree& tree, std::string_view text) {
  Path path;
  const Node* node = parse_path(text, path) ? tree.find(path) : nullptr;
  if (node == nullptr || !node->has_value()) return std::nullopt;
  return std::string(node->value());
}

inline bool exists(const Tree& tree, std::string_view text) {
  Path path;
  return parse_path(text, path) && tree.find(path) != nullptr;
}

// What write(fd) writes into a memory file.
template <typename Write>
std::string written_by(Write write) {
  const int fd = memfd_create("test", MFD_CLOEXEC);
  std::string text;
  if (write(fd)) {
    text.resize(static_cast<size_t>(lseek(fd, 0, SEEK_END)));
    if (pread(fd, text.data(), text.size(), 0) != static_cast<ssize_t>(text.size())) text = "unreadable";
  }
  close(fd);
  return text;
}

inline std::string dump(const Tree& tree) {
  return written_by([&](int fd) { return write_settings(tree, fd); });
}

inline std::string list(const Tree& tree, std::string_view text = "") {
  Path path = {};
  if (!text.empty() && (!parse_path(text, path) || tree.find(path) == nullptr)) return "missing";
  return written_by([&](int fd) { return write_listing(*tree.find(path), path, fd); });
}

}  // namespace ktree

#endif
