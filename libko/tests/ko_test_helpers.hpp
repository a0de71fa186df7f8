#pragma once
// Synchronisation helpers of the ko tests: every wait is bounded.

#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <thread>

namespace ko::test {

inline constexpr auto kBound = std::chrono::seconds(10);

// A one-shot gate: wait() blocks until open() (or the bound passes; answers false then).
class Gate {
 public:
  // Notifies under the lock: a waiter may destroy the gate as soon as it wakes.
  void open() {
    std::lock_guard lock(mutex_);
    open_ = true;
    cv_.notify_all();
  }
  bool wait() {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, kBound, [this] { return open_; });
  }
  bool isOpen() const {
    std::lock_guard lock(mutex_);
    return open_;
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable cv_;
  bool open_ = false;
};

// A counter that can be waited on until it reaches a value.
class Counter {
 public:
  int increment() {
    std::lock_guard lock(mutex_);
    cv_.notify_all();
    return ++value_;
  }
  bool waitFor(int target) {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, kBound, [&] { return value_ >= target; });
  }
  int value() const {
    std::lock_guard lock(mutex_);
    return value_;
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable cv_;
  int value_ = 0;
};

// For states that publish no notification: polls `pred` until it holds or the bound passes.
inline bool eventually(const std::function<bool()>& pred) {
  const auto end = std::chrono::steady_clock::now() + kBound;
  while (!pred()) {
    if (std::chrono::steady_clock::now() > end)
      return false;
    std::this_thread::yield();
  }
  return true;
}

}  // namespace ko::test
