// A share name as a user may choose it, a server's configuration and a generated file as anybody may have
// left them. A name that is not refused stays one section with one path, whatever it holds, and a list of
// users stays one line in it.
#include <cstdlib>
#include <string>

#include "common/utf8.h"
#include "shares/access.h"
#include "shares/server_config.h"
#include "shares/share_file.h"
#include "shares/share_name.h"

namespace {

// Of a file that is understood every rule is one option of its section.
void check_access(const std::string& text) {
  const shares::Access access = shares::parse_access(text);
  if (access.why != nullptr && (!access.rules.empty() || access.line < 1)) abort();
  for (const shares::AccessRule& rule : access.rules) {
    const std::string option = shares::access_option(rule);
    if (rule.names.empty() || option.find('\n') != option.size() - 1 || option.size() > 1000) abort();
    if (option.find_first_of("%#;[]'") != std::string::npos || option.ends_with("\\\n")) abort();
    const shares::Section section = shares::make_section("S", "/mnt/VV/S", option);
    if (section.text.find(shares::access_line(section.text)) == std::string::npos) abort();
    const auto read = shares::parse_sections(shares::compose("fuzz", {section}));
    if (read.size() != 1 || !(read[0] == section)) abort();
    if (shares::rule_of(access, rule.share) != &rule) abort();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const unsigned char* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  shares::ServerConfig any;
  shares::parse_server_config(text, true, any);
  shares::parse_sections(text);
  check_access(text);
  for (const char byte : platform::printable(text)) {
    if (static_cast<unsigned char>(byte) < 0x20 || byte == 0x7f) abort();
  }
  if (text.find('\0') != std::string::npos || shares::name_refusal(text, shares::kSambaNames) != nullptr)
    return 0;
  const shares::Section section = shares::make_section(text, "/mnt/VV/" + text, "\tread only = no\n");
  const shares::Section after = shares::make_section("after", "/mnt/VV/after", "");
  const auto read = shares::parse_sections(shares::compose("fuzz", {section, after}));
  if (read.size() != 2 || !(read[0] == section) || !(read[1] == after)) abort();
  shares::ServerConfig config;
  shares::parse_server_config(section.text, true, config);
  if (config.names.size() != 1 || config.names[0] != shares::folded_name(text) || !config.includes.empty())
    abort();
  return 0;
}
