#include "vvstat/metrics.h"

#include <algorithm>
#include <iterator>
#include <string_view>

#include "common/utf8.h"
#include "tree_layout.h"

namespace vvstat {
namespace {

std::string flag(bool yes) {
  return yes ? "1" : "0";
}

// A clock may have been set back.
std::string seconds_since(time_t moment, time_t now) {
  return moment == 0 ? std::string() : std::to_string(std::max<long long>(0, now - moment));
}

std::string when_mounted(const Row& row, unsigned long long bytes) {
  return row.mounted ? std::to_string(bytes) : std::string();
}

struct Metric {
  const char* name;
  const char* help;
  std::string (*value)(const Row& row, time_t now);  // empty: the row has none
};

constexpr Metric kOfVolumes[] = {
    {"remvol_volume_wanted", "It should be connected, and is not switched off.",
     [](const Row& row, time_t) { return flag(row.wanted); }},
    {"remvol_volume_healthy", "Nothing is wrong with it, or it is not wanted.",
     [](const Row& row, time_t) { return flag(row.healthy()); }},
    {"remvol_volume_mounted", "Its file system is mounted.",
     [](const Row& row, time_t) { return flag(row.mounted); }},
    {"remvol_volume_read_only", "It cannot be written.",
     [](const Row& row, time_t) { return flag(row.read_only); }},
    {"remvol_volume_used_bytes", "Space that is taken, while it is mounted.",
     [](const Row& row, time_t) { return when_mounted(row, row.used); }},
    {"remvol_volume_size_bytes", "Size of the file system, while it is mounted.",
     [](const Row& row, time_t) { return when_mounted(row, row.size); }},
    {"remvol_volume_format_progress_percent", "How far a format is that is under way.",
     [](const Row& row, time_t) {
       return row.volume->format_state == remvol::kFormatting ? std::to_string(row.volume->progress)
                                                              : std::string();
     }},
    {"remvol_volume_seconds_since_change", "Seconds since it became healthy, or unhealthy.",
     [](const Row& row, time_t now) { return seconds_since(row.since, now); }},
};

constexpr Metric kOfTargets[] = {
    {"remvol_target_wanted", "It should be connected.",
     [](const Row& row, time_t) { return flag(row.target->wanted); }},
    {"remvol_target_connected", "It has a session that is logged in.",
     [](const Row& row, time_t) {
       return flag(row.target->connect_state == remvol::kConnected && row.session == "LOGGED_IN");
     }},
};

// A label's value: the format has escapes for three characters, and is UTF-8.
std::string label_value(std::string_view text) {
  std::string out = "\"";
  for (const char byte : platform::printable(text)) {
    if (byte == '"' || byte == '\\') out += '\\';
    out += byte;
  }
  return out += '"';
}

std::string labels_of_volume(const Row& row) {
  std::string text = "{share=";
  text += label_value(row.volume->share);
  text += ",lun=\"";
  text += std::to_string(row.volume->lun);
  text += "\",target=";
  text += label_value(row.target->name);
  return text += "}";
}

std::string labels_of_target(const Row& row) {
  std::string text = "{target=";
  text += label_value(row.target->name);
  return text += "}";
}

std::string heading(const char* name, const char* help) {
  std::string text = "# HELP ";
  text.append(name).append(" ").append(help).append("\n# TYPE ").append(name).append(" gauge\n");
  return text;
}

std::string family(const Metric& metric, const std::vector<const Row*>& rows, time_t now,
                   std::string (*labels)(const Row&)) {
  std::string lines;
  for (const Row* row : rows) {
    const std::string value = metric.value(*row, now);
    if (!value.empty()) lines.append(metric.name).append(labels(*row)).append(" ").append(value).append("\n");
  }
  return lines.empty() ? lines : heading(metric.name, metric.help) + lines;
}

}  // namespace

std::string metrics(bool reachable, const std::vector<Row>& rows, time_t now) {
  std::vector<const Row*> volumes, targets;
  for (const Row& row : rows) {
    if (row.volume != nullptr) volumes.push_back(&row);
    if (targets.empty() || targets.back()->target != row.target) targets.push_back(&row);
  }
  std::string text = heading("remvol_tree_reachable", "The configuration tree answers.");
  text.append("remvol_tree_reachable ").append(flag(reachable)).append("\n");
  for (const Metric& metric : kOfTargets) text += family(metric, targets, now, labels_of_target);
  for (const Metric& metric : kOfVolumes) text += family(metric, volumes, now, labels_of_volume);
  return text;
}

}  // namespace vvstat
