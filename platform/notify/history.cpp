#include "notify/history.h"

#include <syslog.h>

#include <algorithm>
#include <iterator>
#include <utility>

#include "common/utf8.h"
#include "tree_layout.h"

namespace notify {
namespace {

using vvstat::Row;

constexpr time_t kSettled = 60;  // seconds
// A volume is nearly full from the first on, and no longer so below the second.
constexpr double kNearlyFull = 0.95, kNotSoFull = 0.90;

constexpr EventForm kForms[] = {
    {EventKind::kLost, "lost", LOG_ERR, "9ed0f88078e84644a9615f20f9b7ec79"},
    {EventKind::kBack, "back", LOG_NOTICE, "a8b67254a84d414cb92c138f6c361f06"},
    {EventKind::kReadOnly, "read-only", LOG_ERR, "cec71bd45f8842eca898881f1e7c00d3"},
    {EventKind::kRecoveryFailed, "recovery-failed", LOG_ERR, "aca10eddad834bdaac8dd594cc5bc8c3"},
    {EventKind::kVolumeFailed, "volume-failed", LOG_ERR, "e4ba738ea99d4eadb5764d1c5b8ae028"},
    {EventKind::kFormatDone, "format-done", LOG_NOTICE, "3c186e39b1474c6490c124c1b5596931"},
    {EventKind::kNearlyFull, "nearly-full", LOG_WARNING, "098f1413d38b43139c6787ef678e9a8b"},
    {EventKind::kTest, "test", LOG_INFO, "746f55b499aa48c6823cf5891c771352"},
};

constexpr bool is_each_at_its_number() {
  for (size_t at = 0; at < std::size(kForms); at++) {
    if (static_cast<size_t>(kForms[at].kind) != at) return false;
  }
  return std::size(kForms) == static_cast<size_t>(EventKind::kTest) + 1;
}
static_assert(is_each_at_its_number());

std::string share_of(const Row& row) {
  return row.volume != nullptr ? platform::printable(row.volume->share) : std::string();
}

Event event_of(EventKind kind, const Row& row, std::string_view what) {
  const std::string target = platform::printable(row.target->name);
  std::string message = row.volume != nullptr ? "Volume " + share_of(row) : "Target " + target;
  message.append(": ").append(what);
  if (!row.healthy()) message.append("; ").append(row.problem.advice);
  return {kind, target, share_of(row), message};
}

EventKind kind_of(Ailment ailment) {
  switch (ailment) {
    case Ailment::kLost:
      return EventKind::kLost;
    case Ailment::kReadOnly:
      return EventKind::kReadOnly;
    default:
      return EventKind::kVolumeFailed;
  }
}

unsigned bit_of(Ailment ailment) {
  return 1U << static_cast<unsigned>(ailment);
}

bool is_formatting(const Row& row) {
  return row.volume != nullptr && row.volume->format_state == remvol::kFormatting;
}

bool is_new(const Row& row, const Past& past) {
  return past.made != 0 && row.made > past.made;
}

// Work that is under way is no error.
void remember_error(const Row& row, time_t now, Past& past) {
  if (row.healthy() || past.now == Ailment::kBusy) return;
  const std::string error = platform::printable(row.problem.what);
  if (past.error == error && past.error_time >= past.since) return;
  past.error = error;
  past.error_time = now;
}

void compare_health(const Row& row, time_t now, Past& past, std::vector<Event>& events) {
  const Ailment ailment = row.problem.ailment;
  // Since when something has been well that nobody wants does not matter.
  if (ailment != past.now || !row.wanted) past.since = now;
  past.now = ailment;
  remember_error(row, now, past);
  const bool formatted = (past.formatting || is_new(row, past)) && row.wanted && row.healthy();
  past.formatting = is_formatting(row) || (past.formatting && ailment == Ailment::kBusy);
  if (past.made == 0 || row.healthy()) past.made = std::max(past.made, row.made);
  if (formatted) events.push_back(event_of(EventKind::kFormatDone, row, "its format is done"));
  if (!row.wanted) {
    past.told = 0;
  } else if (ailment == Ailment::kNone) {
    if (past.told == 0 || now - past.since < kSettled) return;
    events.push_back(event_of(EventKind::kBack, row, "is well again"));
    past.told = 0;
  } else if (ailment != Ailment::kBusy && (past.told & bit_of(ailment)) == 0) {
    events.push_back(event_of(kind_of(ailment), row, row.problem.what));
    past.told |= bit_of(ailment);
  }
}

void compare_space(const Row& row, Past& past, std::vector<Event>& events) {
  if (row.size == 0) return;
  const double part = static_cast<double>(row.used) / static_cast<double>(row.size);
  if (part >= kNearlyFull && !past.nearly_full) {
    events.push_back(event_of(EventKind::kNearlyFull, row, "is nearly full"));
    past.nearly_full = true;
  } else if (part < kNotSoFull) {
    past.nearly_full = false;
  }
}

// A volume that has come since the last look may have been formatted since then; its file system is of that
// second or later. Of the others what is there now is nothing new, nor is what came before this second.
Past first_look(const Row& row, time_t now, time_t last_look) {
  Past past;
  past.since = now;
  past.made = last_look != 0 ? last_look - 1 : row.mounted ? row.made : now - 1;
  return past;
}

}  // namespace

const EventForm& form_of(EventKind kind) {
  return kForms[static_cast<size_t>(kind)];
}

std::vector<Event> compare(const std::vector<Row>& rows, time_t now, time_t last_look, History& history) {
  std::vector<Event> events;
  History after;
  for (const Row& row : rows) {
    const std::string key = vvstat::key_of(row);
    const auto found = history.find(key);
    Past past = found != history.end() ? found->second : first_look(row, now, last_look);
    compare_health(row, now, past, events);
    compare_space(row, past, events);
    after.emplace(key, past);
  }
  history = std::move(after);
  return events;
}

}  // namespace notify
