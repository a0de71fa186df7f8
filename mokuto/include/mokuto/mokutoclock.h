#pragma once
// MokutoClock: how the service waits out its time limits. On the robot they are real time;
// a host (a test) may give the service a clock that waits them shorter and keeps account
// of them, so that a test can tell how long the service waited without reading a wall
// clock.
//
// Any thread may wait on a clock; an implementation keeps its own state thread-safe.

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>

namespace ZU {

class MokutoClock {
 public:
  // Which of the service's waits.
  enum class Wait {
    // A limit of the service: a bookmark not received (400 ms), an animation asked to stop
    // (200 ms), the check of a running animation (5 s), a blocking _stopAll (3 s).
    Limit,
    // A round of the director's watch while the speech runs without news (500 ms).
    Round,
  };

  virtual ~MokutoClock() = default;
  // As condition.wait_for(lock, duration): the status tells whether the time ran out.
  virtual std::cv_status waitFor(std::condition_variable& condition,
                                 std::unique_lock<std::mutex>& lock,
                                 std::chrono::microseconds duration, Wait wait) {
    (void)wait;
    return condition.wait_for(lock, duration);
  }

  // The robot's clock, shared by every service that was given none.
  static const std::shared_ptr<MokutoClock>& real() {
    static const auto clock = std::make_shared<MokutoClock>();
    return clock;
  }
};

}  // namespace ZU
