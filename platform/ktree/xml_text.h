// What XML 1.0 can carry as plain text, and what a reader of the settings file makes of it.
#ifndef PLATFORM_KTREE_XML_TEXT_H
#define PLATFORM_KTREE_XML_TEXT_H

#include <string_view>

namespace ktree {

constexpr std::string_view kXmlBlanks = " \t\r\n";

// The encoding attribute of a value that goes as base64, and the mark of a node without any value.
constexpr char kEncodingAttribute[] = "encoding";
constexpr char kBase64[] = "base64";
constexpr char kValueAttribute[] = "value";
constexpr char kNoValue[] = "none";

[[nodiscard]] std::string_view trim_blanks(std::string_view text);

// True when `value` does not come back byte for byte as the plain text of an element: bytes that are not
// UTF-8 or not characters of XML 1.0 (section 2.2), a carriage return (readers turn it into a line feed,
// section 2.11), or white space that the rules of the settings file take for layout.
[[nodiscard]] bool needs_encoding(std::string_view value, bool has_children);

}  // namespace ktree

#endif
