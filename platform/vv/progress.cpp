#include "vv/progress.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <string_view>

#include "common/utf8.h"
#include "tree_layout.h"

namespace vv {
namespace {

using vvstat::Target;
using vvstat::Volume;

constexpr size_t kBar = 40;  // cells of a whole bar
constexpr size_t kDefaultWidth = 80;

const Volume* same_lun(const Target& target, int lun) {
  for (const Volume& volume : target.volumes) {
    if (volume.lun == lun) return &volume;
  }
  return nullptr;
}

void add_target_steps(const Target& before, const Target& now, std::vector<std::string>& steps) {
  if (before.connect_state == now.connect_state) return;
  const std::string name = platform::printable(now.name);
  if (now.connect_state == remvol::kConnecting) {
    steps.push_back("logging in to " + name + " at " + now.address + ":" + std::to_string(now.port));
  }
  if (now.connect_state == remvol::kConnected) steps.push_back("logged in to " + name);
}

// What the change of a state means, if anything.
const char* step_of_format(int before, int now) {
  if (before == now) return nullptr;
  if (now == remvol::kFormatWaiting) return "waiting until another volume is formatted";
  if (now == remvol::kFormatting) return "formatting";
  return before == remvol::kFormatting && now != remvol::kFormatFailed ? "formatted" : nullptr;
}

const char* first_step(int before, int now) {
  return before != now && now == remvol::kVolumeCreating ? "looking at its disk" : nullptr;
}

// It may still be formatted: that it is mounted is said at the end, when it is so.
const char* last_step(int before, int now) {
  return before == remvol::kVolumeCreating && now == remvol::kVolumeNormal ? "its disk is ready" : nullptr;
}

void add_volume_steps(const Volume& before, const Volume& now, std::vector<std::string>& steps) {
  const std::string share = platform::printable(now.share) + ": ";
  for (const char* step : {first_step(before.volume_state, now.volume_state),
                           step_of_format(before.format_state, now.format_state),
                           last_step(before.volume_state, now.volume_state)}) {
    if (step != nullptr) steps.push_back(share + step);
  }
}

size_t width_of_terminal() {
  winsize size{};
  return ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col != 0 ? size.ws_col : kDefaultWidth;
}

Target find(const std::string& name) {
  for (const Target& target : vvstat::read_status(platform::TreeListing()).targets) {
    if (target.name == name) return target;
  }
  return {};
}

}  // namespace

std::vector<std::string> steps_between(const Target& before, const Target& now) {
  std::vector<std::string> steps;
  add_target_steps(before, now, steps);
  for (const Volume& volume : now.volumes) {
    const Volume* earlier = same_lun(before, volume.lun);
    Volume fresh{};
    fresh.format_state = fresh.volume_state = -1;
    add_volume_steps(earlier != nullptr ? *earlier : fresh, volume, steps);
  }
  return steps;
}

const Volume* formatting(const Target& target) {
  for (const Volume& volume : target.volumes) {
    if (volume.format_state == remvol::kFormatting) return &volume;
  }
  return nullptr;
}

std::string bar(const Volume& volume, size_t width) {
  const std::string before = platform::printable(volume.share) + ": formatting ";
  const std::string percent = std::to_string(volume.progress) + "%";
  const size_t taken = platform::cells(before) + std::string_view("[] ").size() + percent.size();
  if (taken + 1 >= width) return percent;
  const size_t cells = std::min(kBar, width - taken - 1);
  const size_t done = cells * static_cast<size_t>(volume.progress) / 100;
  return before + "[" + std::string(done, '#') + std::string(cells - done, ' ') + "] " + percent;
}

Progress::Progress(const std::string& target, bool shown)
    : name_(target), shown_(shown), terminal_(isatty(STDERR_FILENO) != 0), before_(find(target)) {}

Progress::~Progress() {
  clear_bar();
}

void Progress::look() {
  if (!shown_) return;
  Target now = find(name_);
  if (now.name.empty()) return;  // not stored yet, not any more, or the tree is busy
  const std::vector<std::string> steps = steps_between(before_, now);
  if (!steps.empty()) clear_bar();
  for (const std::string& step : steps) fprintf(stderr, "%s\n", step.c_str());
  show_bar(now);
  before_ = std::move(now);
}

void Progress::show_bar(const Target& now) {
  const Volume* volume = terminal_ ? formatting(now) : nullptr;
  if (volume == nullptr) return clear_bar();
  const std::string now_shown = bar(*volume, width_of_terminal());
  if (bar_ == now_shown) return;
  bar_ = now_shown;
  fprintf(stderr, "\r\x1b[K%s", bar_.c_str());
}

void Progress::clear_bar() {
  if (!bar_.empty()) fputs("\r\x1b[K", stderr);
  bar_.clear();
}

}  // namespace vv
