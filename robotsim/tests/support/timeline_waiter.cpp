#include "support/timeline_waiter.h"

#include <condition_variable>
#include <map>
#include <mutex>
#include <utility>

namespace robotsim::simtest {

struct TimelineWaiter::State {
  std::mutex mutex;
  std::condition_variable recorded;
  std::map<std::pair<std::string, std::string>, std::size_t> counts;
  std::size_t total = 0;
};

TimelineWaiter::TimelineWaiter(Timeline& timeline) : fState(std::make_shared<State>()) {
  timeline.addListener([state = fState](const TimelineEntry& entry) {
    {
      std::lock_guard lock(state->mutex);
      ++state->counts[{entry.service, entry.operation}];
      ++state->total;
    }
    state->recorded.notify_all();
  });
}

bool TimelineWaiter::waitFor(const std::string& service, const std::string& operation,
                             std::size_t count, std::chrono::milliseconds bound) const {
  std::unique_lock lock(fState->mutex);
  return fState->recorded.wait_for(lock, bound, [&] {
    return fState->counts[{service, operation}] >= count;
  });
}

bool TimelineWaiter::waitUntil(const std::function<bool()>& done,
                               std::chrono::milliseconds bound) const {
  const auto deadline = std::chrono::steady_clock::now() + bound;
  std::unique_lock lock(fState->mutex);
  for (;;) {
    const std::size_t seen = fState->total;
    lock.unlock();
    if (done())
      return true;
    lock.lock();
    if (!fState->recorded.wait_until(lock, deadline, [&] { return fState->total != seen; }))
      return false;
  }
}

}  // namespace robotsim::simtest
