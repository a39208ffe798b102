// The reader of the settings file, on any document. What it takes must come back from a dump as it was.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <string>

#include "ktree/listing.h"
#include "ktree/settings_reader.h"
#include "ktree/settings_writer.h"

using namespace ktree;

namespace {

void require(bool holds) {
  if (!holds) abort();
}

template <typename Write>
std::string written_by(Write write) {
  const int fd = memfd_create("fuzz", MFD_CLOEXEC);
  require(write(fd));
  std::string text(static_cast<size_t>(lseek(fd, 0, SEEK_END)), '\0');
  require(pread(fd, text.data(), text.size(), 0) == static_cast<ssize_t>(text.size()));
  close(fd);
  return text;
}

std::string dump(const Tree& tree) {
  return written_by([&](int fd) { return write_settings(tree, fd); });
}

std::string list(const Tree& tree) {
  Path root;
  root.depth = 0;
  return written_by([&](int fd) { return write_listing(tree.root(), root, fd); });
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  Tree tree;
  std::string error;
  if (!read_settings(std::string_view(reinterpret_cast<const char*>(data), size), tree, error)) {
    require(error.starts_with("line "));
    return 0;
  }
  const std::string document = dump(tree);
  Tree copy;
  require(read_settings(document, copy, error));
  require(copy.node_count() == tree.node_count());
  require(list(copy) == list(tree));
  require(dump(copy) == document);
  return 0;
}
