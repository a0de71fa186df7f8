#pragma once
// The clock of the body talk: every rest, wait and limit (rests of 1 to 5 s, the 10 s
// limits, the 1 s preload waits) goes through one scale, 1.0 on the robot. Tests run the
// body talk faster with a small scale; the moves themselves keep their own times.
//
// A value type, fixed at construction: any thread.

#include <chrono>
#include <cstdint>

namespace ZU {

class ZURobotBodyTalkTime {
 public:
  // A scale that is not a positive finite number is logged and replaced by 1.0.
  explicit ZURobotBodyTalkTime(double scale = 1.0);

  double scale() const noexcept { return fScale; }
  // `seconds` scaled, in microseconds (for the periods of the workers).
  std::int64_t usOf(double seconds) const noexcept;
  // `ms` scaled, in milliseconds, at least 1 (a limit of 0 would mean none).
  int msOf(int ms) const noexcept;
  std::chrono::microseconds durationOf(double seconds) const noexcept {
    return std::chrono::microseconds(usOf(seconds));
  }

 private:
  double fScale;
};

}  // namespace ZU
