// A share name as a user may choose it, a server's configuration and a generated file as anybody may have
// left them. A name that is not refused stays one section with one path, whatever it holds.
#include <cstdlib>
#include <string>

#include "server_config.h"
#include "share_file.h"
#include "share_name.h"
#include "utf8.h"

extern "C" int LLVMFuzzerTestOneInput(const unsigned char* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  shares::ServerConfig any;
  shares::parse_server_config(text, true, any);
  shares::parse_sections(text);
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
