#include "ktree/series.h"

#include <algorithm>

namespace ktree {
namespace {

constexpr int kMostTrust = 64;
constexpr int kInVain = 8;  // requests that came as expected make up for one wake-up in vain
constexpr int kMostNeeded = 1024;

}  // namespace

void Series::count_reply() {
  if (running()) return;
  replies_++;
  if (replies_ >= needed_) trust_ = kMostTrust;
}

void Series::count_wake_up(bool came) {
  trust_ = came ? std::min(trust_ + 1, kMostTrust) : std::max(trust_ - kInVain, 0);
  if (running()) return;
  replies_ = 0;
  needed_ = std::min(needed_ * 2, kMostNeeded);
}

}  // namespace ktree
