// The status shown to people and programs, for any values of the tree: nothing that moves a cursor reaches a
// terminal, no line is wider than the screen, and the JSON is one line of balanced, well-formed text.
#include <sys/socket.h>

#include <cstdint>
#include <string>

#include "../../platform/vvstat/json.h"
#include "../../platform/vvstat/table.h"
#include "hostile_tree.h"
#include "require.h"
#include "utf8.h"

using namespace vvstat;

// The daemon listens.
extern "C" int __wrap_connect(int, const sockaddr*, socklen_t) {
  return 0;
}

namespace {

void check_text(const std::string& text, size_t columns) {
  for (size_t at = 0; at < text.size();) {
    const size_t end = text.find('\n', at);
    require(end != std::string::npos);
    const std::string line = text.substr(at, end - at);
    std::wstring characters;
    require(platform::decode(line, characters));
    for (const wchar_t character : characters) require(!platform::is_control(character));
    require(columns == 0 || platform::cells(line) <= columns);
    at = end + 1;
  }
}

// Brackets match outside of texts, and texts end.
void check_json(const std::string& text) {
  std::string open;
  bool quoted = false;
  for (size_t i = 0; i < text.size(); i++) {
    const char byte = text[i];
    require(static_cast<unsigned char>(byte) >= 0x20 || (byte == '\n' && i + 1 == text.size()));
    if (quoted && byte == '\\')
      i++;
    else if (byte == '"')
      quoted = !quoted;
    else if (!quoted && (byte == '{' || byte == '['))
      open += byte;
    else if (!quoted && (byte == '}' || byte == ']')) {
      require(!open.empty() && open.back() == (byte == '}' ? '{' : '['));
      open.pop_back();
    }
  }
  require(!quoted && open.empty());
  std::wstring characters;
  require(platform::decode(text, characters));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 2) return 0;
  Screen screen;
  screen.columns = data[0] & 0x7fU;
  screen.lines = data[1] & 0x0fU;
  given_once = true;
  take_values(data + 2, size - 2);
  const Status status = read_status();
  require(status.reachable && status.targets.size() <= 8);
  check_text(table(status, screen), screen.columns);
  check_json(json(status));
  return 0;
}
