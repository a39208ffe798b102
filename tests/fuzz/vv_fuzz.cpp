// What the front end makes of the tool's output, of the kernel's records, of portals and of search results:
// nothing that moves a cursor is passed on, and a portal that was taken is taken again as it is told.
#include <cstdint>
#include <string>

#include "common/utf8.h"
#include "require.h"
#include "vv/explanation.h"
#include "vv/kernel_log.h"
#include "vv/portal.h"
#include "vv/searches.h"

namespace {

void check_line(const std::string& line) {
  std::wstring characters;
  require(platform::decode(line, characters));
  for (const wchar_t character : characters) require(!platform::is_control(character));
}

void check_portal(const std::string& text) {
  // Names are the resolver's business.
  if (text.find_first_not_of("0123456789.:[]abcdef") != std::string::npos) return;
  vv::Portal portal, again;
  std::string why;
  if (!vv::read_portal(text, portal, why)) return require(!why.empty());
  require(portal.port >= 1 && portal.port <= 65535);
  require(vv::read_portal(portal.text(), again, why) && again.text() == portal.text());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1) return 0;
  const std::string text(reinterpret_cast<const char*>(data + 1), size - 1);
  switch (data[0] % 4) {
    case 0:
      for (const std::string& line : vv::explain_output(text, vv::kLoginStep).details) check_line(line);
      break;
    case 1:
      check_line(vv::message_of(text));
      vv::tells_of(text, "sdb");
      break;
    case 2:
      check_portal(text);
      break;
    default:
      const platform::TreeReader tree{std::string_view(text)};
      vv::found_targets(tree);
      vv::found_luns(tree, "t");
  }
  return 0;
}
