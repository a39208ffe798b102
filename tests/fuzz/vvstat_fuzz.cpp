// The report for people and programs, for any listing of the tree and any facts of the kernel: nothing that
// moves a cursor reaches a terminal, no line is wider than the screen, and the JSON is balanced, well-formed
// text. The table of mounts too may be any text.
#include <algorithm>
#include <cstdint>
#include <string>

#include "common/mounts.h"
#include "common/utf8.h"
#include "require.h"
#include "vvstat/columns.h"
#include "vvstat/metrics.h"
#include "vvstat/verdict.h"

using namespace vvstat;

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
    require(static_cast<unsigned char>(byte) >= 0x20 || (byte == '\n' && !quoted));
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

// Facts that a byte stands for.
std::vector<TargetFacts> facts_of(const Status& status, uint8_t byte) {
  constexpr const char* kSessions[] = {"", "LOGGED_IN", "FAILED", "FREE"};
  std::vector<TargetFacts> all;
  for (const Target& target : status.targets) {
    const VolumeFacts volume{(byte & 4U) != 0, (byte & 8U) != 0, (byte & 16U) != 0, (byte & 32U) != 0, byte,
                             byte * 3ULL};
    all.push_back(
        {kSessions[byte & 3U], "10.0.0.1", std::vector<VolumeFacts>(target.volumes.size(), volume)});
  }
  return all;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 3) return 0;
  static const bool ready = (use_utf8(), true);
  require(ready);
  // Below this width the names of columns and the marks of a folded command alone fill the line.
  constexpr size_t kLeast = 12;
  Layout layout;
  layout.width = kLeast + data[0];
  layout.colour = false;
  const std::string_view listing(reinterpret_cast<const char*>(data + 2), size - 2);
  for (const platform::Mount& mount : platform::mounts_of(listing)) {
    require(!mount.point.empty() && (mount.options.starts_with("rw") || mount.options.starts_with("ro")));
  }
  const Status status = read_status(platform::TreeListing(listing));
  require(status.reachable && status.targets.size() <= 8);
  const std::vector<Row> rows = assess(status, facts_of(status, data[1]));
  // A table costs as much as all else together, and what is in it goes by the row: one in eight has one, of
  // two rows. The rest of the report is made of every row.
  const std::vector<Row> first(rows.begin(),
                               rows.begin() + static_cast<long>(std::min<size_t>(2, rows.size())));
  switch (data[1] >> 5U) {
    case 0:
      check_text(volume_report(first, layout), layout.width);
      break;
    case 1:
      layout.form = Form::kRaw;
      check_text(volume_report(first, layout), 0);
      break;
    case 2:
      layout.form = Form::kJson;
      check_json(volume_report(first, layout));
      break;
    case 3:
      check_text(metrics(true, rows, 0), 0);
      break;
    default:
      check_text(verdict(rows, 0, layout.width), layout.width);
      for (const Row& row : first) check_text(block(row, layout), layout.width);
  }
  return 0;
}
