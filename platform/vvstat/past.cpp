#include "vvstat/past.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>

#include "common/file_text.h"
#include "common/utf8.h"

namespace vvstat {
namespace {

// Between a volume's name, the time of its file system and its last error; no printable text holds it.
constexpr char kMark = '\t';

constexpr unsigned kAilments = static_cast<unsigned>(Ailment::kFailed) + 1;

// Reads a last error, as "TIME TEXT".
void take_error(const std::string& text, Past& past) {
  long long time = 0;
  int at = 0;
  if (sscanf(text.c_str(), "%lld %n", &time, &at) != 1 || at == 0) return;
  past.error_time = static_cast<time_t>(time);
  past.error = text.substr(static_cast<size_t>(at));
}

// Reads what stands behind a volume's name: "TIME", and after a mark the last error. Earlier versions wrote
// the last error alone.
void take_end(const std::string& text, Past& past) {
  const size_t mark = text.find(kMark);
  int at = 0;
  long long time = 0;
  if (mark == std::string::npos && text.find(' ') != std::string::npos) return take_error(text, past);
  if (sscanf(text.c_str(), "%lld%n", &time, &at) == 1 &&
      static_cast<size_t>(at) == std::min(mark, text.size())) {
    past.made = static_cast<time_t>(time);
  }
  if (mark != std::string::npos) take_error(text.substr(mark + 1), past);
}

}  // namespace

std::string key_of(const Row& row) {
  std::string key = platform::printable(row.target->name);
  if (row.volume == nullptr) return key;
  key.append(" ").append(std::to_string(row.volume->lun)).append(" ");
  return key.append(platform::printable(row.volume->share));
}

std::string text_of(const History& history) {
  std::string text;
  for (const auto& [key, past] : history) {
    char numbers[64];
    snprintf(numbers, sizeof numbers, "%u %lld %u %u %u ", static_cast<unsigned>(past.now),
             static_cast<long long>(past.since), past.told, past.formatting ? 1U : 0U,
             past.nearly_full ? 1U : 0U);
    text.append(numbers).append(key);
    text.append(1, kMark).append(std::to_string(static_cast<long long>(past.made)));
    if (!past.error.empty()) {
      text.append(1, kMark).append(std::to_string(static_cast<long long>(past.error_time)));
      text.append(" ").append(past.error);
    }
    text.append("\n");
  }
  return text;
}

History history_of(std::string_view text) {
  History history;
  while (!text.empty()) {
    const std::string line(text.substr(0, text.find('\n')));
    text.remove_prefix(line.size() + (line.size() < text.size() ? 1 : 0));
    unsigned now = 0, told = 0, formatting = 0, nearly_full = 0;
    long long since = 0;
    int at = 0;
    if (sscanf(line.c_str(), "%u %lld %u %u %u %n", &now, &since, &told, &formatting, &nearly_full, &at) !=
            5 ||
        at == 0 || line.size() == static_cast<size_t>(at) || now >= kAilments || told >> kAilments != 0) {
      continue;
    }
    const size_t name = static_cast<size_t>(at), mark = line.find(kMark, name);
    Past& past = history[line.substr(name, mark - name)];
    past = {static_cast<Ailment>(now),
            static_cast<time_t>(since),
            told,
            formatting != 0,
            nearly_full != 0,
            "",
            0,
            0};
    if (mark != std::string::npos) take_end(line.substr(mark + 1), past);
  }
  return history;
}

History read_history() {
  const int file = open(kHistoryFile, O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
  if (file < 0) return {};
  const History history = history_of(platform::content_of(file));
  close(file);
  return history;
}

void recall(const History& history, std::vector<Row>& rows) {
  if (history.empty()) return;
  for (Row& row : rows) {
    const auto found = history.find(key_of(row));
    if (found == history.end()) continue;
    const Past& past = found->second;
    if (row.wanted && past.now == row.problem.ailment) row.since = past.since;
    row.error = past.error;
    row.error_time = past.error_time;
  }
}

}  // namespace vvstat
