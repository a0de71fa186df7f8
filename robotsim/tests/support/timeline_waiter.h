#pragma once
// Lets a test wait, with a bound, for entries of the shared timeline: the services record
// what they do there from their own threads, so the timeline tells when something happened
// without polling.

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

#include "robotsim/timeline.h"

namespace robotsim::simtest {

class TimelineWaiter {
 public:
  // Listens to `timeline` from now on (a timeline keeps its listeners: the waiter's state
  // lives as long as the timeline).
  explicit TimelineWaiter(Timeline& timeline);

  // Waits at most `bound` until `count` entries of that service and operation have been
  // recorded since the waiter was made.
  bool waitFor(const std::string& service, const std::string& operation, std::size_t count = 1,
               std::chrono::milliseconds bound = std::chrono::seconds(10)) const;
  // Waits at most `bound` until `done` answers true; it is asked at once and after each
  // entry, outside the timeline's lock.
  bool waitUntil(const std::function<bool()>& done,
                 std::chrono::milliseconds bound = std::chrono::seconds(10)) const;

 private:
  struct State;
  std::shared_ptr<State> fState;
};

}  // namespace robotsim::simtest
