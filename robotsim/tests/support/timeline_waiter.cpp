#include "support/timeline_waiter.h"

#include <map>
#include <utility>

namespace robotsim::simtest {

struct TimelineWaiter::State {
  std::mutex mutex;
  std::condition_variable recorded;
  std::map<std::pair<std::string, std::string>, std::size_t> counts;
};

TimelineWaiter::TimelineWaiter(Timeline& timeline) : fState(std::make_shared<State>()) {
  timeline.addListener([state = fState](const TimelineEntry& entry) {
    {
      std::lock_guard lock(state->mutex);
      ++state->counts[{entry.service, entry.operation}];
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

}  // namespace robotsim::simtest
