#include "zurobotbodytalktime.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "ko/log.hpp"

namespace ZU {

namespace {
// Beyond this (about three centuries) a scaled time is clamped.
constexpr double kLongestUs = 1e16;
}  // namespace

ZURobotBodyTalkTime::ZURobotBodyTalkTime(double scale) : fScale(scale) {
  if (!std::isfinite(scale) || scale <= 0) {
    KO_LOG_ERROR("robotbodytalk") << "Invalid time scale " << scale << "; 1.0 is used";
    fScale = 1.0;
  }
}

std::int64_t ZURobotBodyTalkTime::usOf(double seconds) const noexcept {
  const double us = std::clamp(seconds * 1e6 * fScale, 0.0, kLongestUs);
  return static_cast<std::int64_t>(std::llround(us));
}

int ZURobotBodyTalkTime::msOf(int ms) const noexcept {
  const double scaled = std::round(static_cast<double>(ms) * fScale);
  return static_cast<int>(
      std::clamp(scaled, 1.0, static_cast<double>(std::numeric_limits<int>::max())));
}

}  // namespace ZU
