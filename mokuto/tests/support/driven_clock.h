#pragma once
// DrivenClock: a director clock whose time passes only when the test says so. A wait of
// the director ends when its condition is notified or when the test lets that wait run
// out (`expireNext`); nothing else ends it. `release` gives the director the real clock
// back, which a test's end does so that a failed check never leaves the director waiting.
//
// Threads: the director waits in its thread, the test drives from its own; one mutex
// guards the waits. The test wakes a wait without the job's mutex, so it wakes it again
// every millisecond until the director has left it.

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <list>
#include <mutex>
#include <optional>

#include "mokuto/directortask.h"
#include "scripted_speech.h"

namespace mokutotest {

class DrivenClock : public ZU::DirectorClock {
 public:
  std::cv_status waitFor(std::condition_variable& condition, std::unique_lock<std::mutex>& lock,
                         std::chrono::milliseconds duration) override;

  // Whether the director is waiting, or begins to within `bound`; when it does not, false,
  // and the clock is released.
  bool waiting(std::chrono::milliseconds bound = kBound);
  // Lets the director's wait run out: its length; nullopt (the clock released) when the
  // director does not wait within `bound`.
  std::optional<std::chrono::milliseconds> expireNext(std::chrono::milliseconds bound = kBound);
  // Real time from now on, for the waits in progress too (they end as if woken).
  void release();

 private:
  struct Wait {
    std::uint64_t number;
    std::chrono::milliseconds duration;
    std::condition_variable* condition;
    bool expired = false;
  };

  // The first wait not expired yet, once there is one; end() after `bound`.
  std::list<Wait>::iterator xAwait(std::unique_lock<std::mutex>& lock,
                                   std::chrono::milliseconds bound);
  // Wakes the wait `number` until the director has left it.
  void xWake(std::unique_lock<std::mutex>& lock, std::uint64_t number);

  std::mutex fMutex;
  std::condition_variable fChanged;
  std::list<Wait> fWaits;  // in progress, in the order they began
  std::uint64_t fNextNumber = 0;
  bool fReleased = false;
};

}  // namespace mokutotest
