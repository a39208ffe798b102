#include "ktree/listing.h"

#include <cstdio>
#include <string>

#include "ktree/output.h"

namespace ktree {
namespace {

void append_element(std::string& path, std::string_view name, unsigned number) {
  path += '/';
  path += name;
  if (number > 1 || name == "id") {
    char text[16];
    snprintf(text, sizeof text, ":%u", number);
    path += text;
  }
}

void put_value(Output& out, std::string_view value) {
  constexpr char kDigits[] = "0123456789ABCDEF";
  for (char c : value) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte >= 0x20 && c != '\\') {
      out.put(c);
      continue;
    }
    out.put("\\x");
    out.put(kDigits[byte >> 4]);
    out.put(kDigits[byte & 15U]);
  }
}

void list_node(Output& out, const Node& node, std::string& path) {
  if (node.has_value()) {
    out.put(path);
    out.put('=');
    put_value(out, node.value());
    out.put('\n');
  }
  const size_t length = path.size();
  for_each_child(node, [&](const Node& child, unsigned number) {
    append_element(path, child.group->name, number);
    list_node(out, child, path);
    path.resize(length);
  });
}

}  // namespace

bool write_listing(const Node& node, const Path& path, int fd) {
  std::string text;
  for (size_t i = 0; i < path.depth; i++) {
    append_element(text, path.elements[i].name(), path.elements[i].number);
  }
  Output out(fd);
  list_node(out, node, text);
  return out.finish();
}

}  // namespace ktree
