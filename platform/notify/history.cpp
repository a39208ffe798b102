#include "history.h"

#include <cstdio>
#include <utility>

#include "utf8.h"

namespace notify {
namespace {

using vvstat::Row;

constexpr time_t kSettled = 60;  // seconds
// A volume is nearly full from the first on, and not any more below the second.
constexpr double kNearlyFull = 0.95, kNotSoFull = 0.90;

std::string share_of(const Row& row) {
  return row.volume != nullptr ? platform::printable(row.volume->share) : std::string();
}

std::string key_of(const Row& row) {
  std::string key = platform::printable(row.target->name);
  if (row.volume == nullptr) return key;
  key.append(" ").append(std::to_string(row.volume->lun)).append(" ").append(share_of(row));
  return key;
}

Event event_of(Kind kind, const Row& row, std::string_view what) {
  const std::string target = platform::printable(row.target->name);
  std::string message = row.volume != nullptr ? "Volume " + share_of(row) : "Target " + target;
  message.append(": ").append(what);
  if (!row.healthy()) message.append("; ").append(row.problem.advice);
  return {kind, target, share_of(row), message};
}

Kind kind_of(Ailment ailment) {
  switch (ailment) {
    case Ailment::kLost:
      return Kind::kLost;
    case Ailment::kReadOnly:
      return Kind::kReadOnly;
    default:
      return Kind::kVolumeFailed;
  }
}

bool is_formatting(const Row& row) {
  return row.volume != nullptr && row.volume->format_state == vvstat::kFormatRunning;
}

void compare_health(const Row& row, time_t now, Past& past, std::vector<Event>& events) {
  const Ailment ailment = row.problem.ailment;
  if (ailment != past.now) past.since = now;
  past.now = ailment;
  const bool formatted = past.formatting && row.wanted && row.healthy();
  past.formatting = is_formatting(row) || (past.formatting && ailment == Ailment::kBusy);
  if (formatted) events.push_back(event_of(Kind::kFormatDone, row, "its format is done"));
  if (!row.wanted) {
    past.told = Ailment::kNone;
  } else if (ailment == Ailment::kNone) {
    if (past.told == Ailment::kNone || now - past.since < kSettled) return;
    events.push_back(event_of(Kind::kBack, row, "is well again"));
    past.told = Ailment::kNone;
  } else if (ailment != Ailment::kBusy && ailment != past.told) {
    events.push_back(event_of(kind_of(ailment), row, row.problem.what));
    past.told = ailment;
  }
}

void compare_space(const Row& row, Past& past, std::vector<Event>& events) {
  if (row.size == 0) return;
  const double part = static_cast<double>(row.used) / static_cast<double>(row.size);
  if (part >= kNearlyFull && !past.nearly_full) {
    events.push_back(event_of(Kind::kNearlyFull, row, "is nearly full"));
    past.nearly_full = true;
  } else if (part < kNotSoFull) {
    past.nearly_full = false;
  }
}

bool is_ailment(unsigned number) {
  return number <= static_cast<unsigned>(Ailment::kFailed);
}

}  // namespace

std::string name_of(Kind kind) {
  constexpr const char* kNames[] = {"lost",          "back",        "read-only",   "recovery-failed",
                                    "volume-failed", "format-done", "nearly-full", "test"};
  return kNames[static_cast<size_t>(kind)];
}

std::vector<Event> compare(const std::vector<Row>& rows, time_t now, History& history) {
  std::vector<Event> events;
  History after;
  for (const Row& row : rows) {
    const std::string key = key_of(row);
    const auto found = history.find(key);
    Past past = found != history.end() ? found->second : Past{.since = now};
    compare_health(row, now, past, events);
    compare_space(row, past, events);
    after.emplace(key, past);
  }
  history = std::move(after);
  return events;
}

std::string text_of(const History& history) {
  std::string text;
  for (const auto& [key, past] : history) {
    char numbers[64];
    snprintf(numbers, sizeof numbers, "%u %lld %u %u %u ", static_cast<unsigned>(past.now),
             static_cast<long long>(past.since), static_cast<unsigned>(past.told), past.formatting ? 1U : 0U,
             past.nearly_full ? 1U : 0U);
    text.append(numbers).append(key).append("\n");
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
        at == 0 || line.size() == static_cast<size_t>(at) || !is_ailment(now) || !is_ailment(told))
      continue;
    history[line.substr(static_cast<size_t>(at))] = {static_cast<Ailment>(now), static_cast<time_t>(since),
                                                     static_cast<Ailment>(told), formatting != 0,
                                                     nearly_full != 0};
  }
  return history;
}

}  // namespace notify
