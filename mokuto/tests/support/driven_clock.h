#pragma once
// DrivenClock: the service's clock in its tests. It waits each of the service's waits
// `scale` times as long as the robot would, and keeps its own time, which moves only when
// a limit of the service runs out, and then by that whole limit (as the robot would have
// waited it). So a test reads how long the service waited on its limits from this clock,
// whatever the load of the machine: a loaded machine makes the real waits longer, never
// this time. While rounds are held, a round of the director's watch for a bookmark ends only
// when the director is woken (a bookmark, a stop), never by running out.
//
// The events that end a limit come in real time, which a loaded machine stretches, whereas
// the robot delivers them at once. So, once watching deliveries, a limit runs out only when
// none of them is on its way (until then the wait goes on), and one that arrived meanwhile
// ends the wait as a wake-up would: the waiter looks again, and its limit begins anew.
//
// Any thread may wait on it; the time is an atomic, the held rounds are under a mutex of
// their own. Watch before the service's first wait.

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <mutex>
#include <utility>
#include <vector>

#include "mokuto/mokutoclock.h"

namespace mokutotest {

class DrivenClock : public ZU::MokutoClock {
 public:
  explicit DrivenClock(double scale) : fScale(scale) {}

  std::cv_status waitFor(std::condition_variable& condition, std::unique_lock<std::mutex>& lock,
                         std::chrono::microseconds duration, Wait wait) override {
    if (wait == Wait::Round && xHeldRound(condition, lock))
      return std::cv_status::no_timeout;
    const auto real = std::chrono::duration_cast<std::chrono::microseconds>(duration * fScale);
    const std::uint64_t before = fDelivered ? fDelivered() : 0;
    const std::cv_status status = condition.wait_for(lock, real);
    if (status == std::cv_status::timeout && wait == Wait::Limit) {
      if (fUndelivered) {
        while (fUndelivered() > 0) {
          if (condition.wait_for(lock, kDeliveryPoll) == std::cv_status::no_timeout)
            return std::cv_status::no_timeout;
        }
        if (fDelivered() != before)
          return std::cv_status::no_timeout;
      }
      fNowUs.fetch_add(duration.count());
    }
    return status;
  }

  // The events that may end a limit: how many are on their way, how many arrived so far.
  void watchDeliveries(std::function<std::size_t()> undelivered,
                       std::function<std::uint64_t()> delivered) {
    fUndelivered = std::move(undelivered);
    fDelivered = std::move(delivered);
  }

  // Released, the held rounds end at once: a waiter may be on its way into its wait, so they
  // are woken until none is left.
  void holdRounds(bool hold) {
    std::unique_lock held(fHeldMutex);
    fHoldRounds = hold;
    while (!hold && !fHeld.empty()) {
      for (std::condition_variable* condition : fHeld)
        condition->notify_all();
      fHeldLeft.wait_for(held, kDeliveryPoll);
    }
  }
  // The threads waiting in a held round now.
  int heldRounds() const {
    std::lock_guard held(fHeldMutex);
    return static_cast<int>(fHeld.size());
  }

  // The limits that ran out so far, in the robot's time.
  std::chrono::milliseconds now() const {
    return std::chrono::duration_cast<std::chrono::milliseconds>(
        std::chrono::microseconds(fNowUs.load()));
  }

 private:
  static constexpr auto kDeliveryPoll = std::chrono::milliseconds(5);

  // A held round waits without a deadline: a timed wait that its notify reaches only after
  // the deadline (a loaded machine) reports a timeout, and the round would miss its wake-up.
  bool xHeldRound(std::condition_variable& condition, std::unique_lock<std::mutex>& lock) {
    {
      std::lock_guard held(fHeldMutex);
      if (!fHoldRounds)
        return false;
      fHeld.push_back(&condition);
    }
    condition.wait(lock);
    {
      std::lock_guard held(fHeldMutex);
      fHeld.erase(std::find(fHeld.begin(), fHeld.end(), &condition));
    }
    fHeldLeft.notify_all();
    return true;
  }

  const double fScale;
  std::function<std::size_t()> fUndelivered;
  std::function<std::uint64_t()> fDelivered;
  std::atomic<std::int64_t> fNowUs{0};
  mutable std::mutex fHeldMutex;
  bool fHoldRounds = false;                     // with fHeldMutex
  std::vector<std::condition_variable*> fHeld;  // the held rounds' conditions, with fHeldMutex
  std::condition_variable fHeldLeft;            // a held round ended
};

}  // namespace mokutotest
