#include "ktree/settings_writer.h"

#include <algorithm>

#include "ktree/base64.h"
#include "ktree/output.h"
#include "ktree/xml_text.h"

namespace ktree {
namespace {

constexpr unsigned kMaxIndent = 16;  // keeps a deep tree's document small

void indent(Output& out, unsigned depth) {
  for (unsigned i = std::min(depth, kMaxIndent); i > 0; i--) out.put(' ');
}

void put_attribute(Output& out, std::string_view name, std::string_view value) {
  out.put(' ');
  out.put(name);
  out.put("=\"");
  out.put(value);
  out.put('"');
}

void put_escaped(Output& out, std::string_view text) {
  for (char c : text) {
    switch (c) {
      case '&':
        out.put("&amp;");
        break;
      case '<':
        out.put("&lt;");
        break;
      case '>':
        out.put("&gt;");
        break;
      default:
        out.put(c);
    }
  }
}

void write_value(Output& out, std::string_view value, bool encoded) {
  if (encoded) {
    encode_base64(value, [&out](char c) { out.put(c); });
  } else {
    put_escaped(out, value);
  }
}

void write_node(Output& out, const Node& node, unsigned depth) {
  const bool has_children = node.first_child != nullptr;
  const bool encoded = node.has_value() && needs_encoding(node.value(), has_children);
  const std::string& name = node.group->name;
  indent(out, depth);
  out.put('<');
  out.put(name);
  if (encoded) put_attribute(out, kEncodingAttribute, kBase64);
  if (!node.has_value() && !has_children) put_attribute(out, kValueAttribute, kNoValue);
  if (node.value().empty() && !has_children) {
    out.put("/>\n");
    return;
  }
  out.put('>');
  write_value(out, node.value(), encoded);
  if (has_children) {
    out.put('\n');
    for_each_child(node, [&](const Node& child, unsigned) { write_node(out, child, depth + 1); });
    indent(out, depth);
  }
  out.put("</");
  out.put(name);
  out.put(">\n");
}

}  // namespace

bool write_settings(const Tree& tree, int fd) {
  Output out(fd);
  out.put("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<config>\n");
  for_each_child(tree.root(), [&](const Node& child, unsigned) { write_node(out, child, 1); });
  out.put("</config>\n");
  return out.finish();
}

}  // namespace ktree
