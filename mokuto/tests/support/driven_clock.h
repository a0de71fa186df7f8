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
// Any thread may wait on it; the time is an atomic. Watch before the service's first wait.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <mutex>
#include <utility>

#include "mokuto/mokutoclock.h"

namespace mokutotest {

class DrivenClock : public ZU::MokutoClock {
 public:
  explicit DrivenClock(double scale) : fScale(scale) {}

  std::cv_status waitFor(std::condition_variable& condition, std::unique_lock<std::mutex>& lock,
                         std::chrono::microseconds duration, Wait wait) override {
    if (wait == Wait::Round && fHoldRounds.load()) {
      ++fHeldRounds;
      std::cv_status status = std::cv_status::timeout;
      while (fHoldRounds.load() && status == std::cv_status::timeout)
        status = condition.wait_for(lock, std::chrono::milliseconds(5));
      --fHeldRounds;
      return status;
    }
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

  void holdRounds(bool hold) { fHoldRounds = hold; }
  // The threads waiting in a held round now.
  int heldRounds() const { return fHeldRounds.load(); }

  // The limits that ran out so far, in the robot's time.
  std::chrono::milliseconds now() const {
    return std::chrono::duration_cast<std::chrono::milliseconds>(
        std::chrono::microseconds(fNowUs.load()));
  }

 private:
  static constexpr auto kDeliveryPoll = std::chrono::milliseconds(5);

  const double fScale;
  std::function<std::size_t()> fUndelivered;
  std::function<std::uint64_t()> fDelivered;
  std::atomic<std::int64_t> fNowUs{0};
  std::atomic<bool> fHoldRounds{false};
  std::atomic<int> fHeldRounds{0};
};

}  // namespace mokutotest
