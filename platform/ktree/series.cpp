#include "ktree/series.h"

#include <algorithm>

namespace ktree {
namespace {

constexpr int kMostTrust = 64;
constexpr int kInVain = 8;  // requests that came as expected make up for one wake-up in vain
constexpr int kMostNeeded = 1024;

}  // namespace

bool Series::starts() {
  if (running() || ++replies_ < needed_) return false;
  trust_ = kMostTrust;
  return true;
}

bool Series::ends(bool came) {
  trust_ = came ? std::min(trust_ + 1, kMostTrust) : std::max(trust_ - kInVain, 0);
  if (running()) return false;
  replies_ = 0;
  needed_ = std::min(needed_ * 2, kMostNeeded);
  return true;
}

}  // namespace ktree
