#include "driven_clock.h"

#include <algorithm>
#include <vector>

namespace mokutotest {

std::cv_status DrivenClock::waitFor(std::condition_variable& condition,
                                    std::unique_lock<std::mutex>& lock,
                                    std::chrono::milliseconds duration) {
  std::uint64_t number = 0;
  {
    std::lock_guard guard(fMutex);
    if (fReleased)
      return condition.wait_for(lock, duration);
    number = fNextNumber++;
    fWaits.push_back(Wait{number, duration, &condition});
  }
  fChanged.notify_all();
  // One wake-up: the director's own notification, the test's, or a spurious one.
  condition.wait(lock);
  bool expired = false;
  {
    std::lock_guard guard(fMutex);
    const auto it = std::find_if(fWaits.begin(), fWaits.end(),
                                 [number](const Wait& w) { return w.number == number; });
    expired = it->expired;
    fWaits.erase(it);
  }
  fChanged.notify_all();
  return expired ? std::cv_status::timeout : std::cv_status::no_timeout;
}

std::list<DrivenClock::Wait>::iterator DrivenClock::xAwait(std::unique_lock<std::mutex>& lock,
                                                         std::chrono::milliseconds bound) {
  std::list<Wait>::iterator found = fWaits.end();
  fChanged.wait_for(lock, bound, [&] {
    found = std::find_if(fWaits.begin(), fWaits.end(), [](const Wait& w) { return !w.expired; });
    return found != fWaits.end();
  });
  if (found == fWaits.end()) {
    lock.unlock();
    release();
    lock.lock();
  }
  return found;
}

void DrivenClock::xWake(std::unique_lock<std::mutex>& lock, std::uint64_t number) {
  // The condition lives while its wait is listed: the director unlists it under fMutex.
  // A wake-up that comes before the director waits is lost, hence the rounds.
  for (;;) {
    const auto it = std::find_if(fWaits.begin(), fWaits.end(),
                                 [number](const Wait& w) { return w.number == number; });
    if (it == fWaits.end())
      return;
    it->condition->notify_all();
    fChanged.wait_for(lock, std::chrono::milliseconds(1));
  }
}

bool DrivenClock::waiting(std::chrono::milliseconds bound) {
  std::unique_lock lock(fMutex);
  return xAwait(lock, bound) != fWaits.end();
}

std::optional<std::chrono::milliseconds> DrivenClock::expireNext(std::chrono::milliseconds bound) {
  std::unique_lock lock(fMutex);
  const auto found = xAwait(lock, bound);
  if (found == fWaits.end())
    return std::nullopt;
  found->expired = true;
  const std::chrono::milliseconds duration = found->duration;
  xWake(lock, found->number);
  return duration;
}

void DrivenClock::release() {
  std::unique_lock lock(fMutex);
  fReleased = true;
  std::vector<std::uint64_t> numbers;
  for (const Wait& w : fWaits)
    numbers.push_back(w.number);
  for (const std::uint64_t number : numbers)
    xWake(lock, number);
}

}  // namespace mokutotest
