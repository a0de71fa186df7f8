#pragma once
// Helpers of the tests: synchronisation (every wait is bounded), the text of an expected
// exception and scratch folders.

#include <stdlib.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <functional>
#include <mutex>
#include <stdexcept>
#include <string>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

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

// What other threads record, in order, for a test to read and to wait for.
template <class T>
class Recorded {
 public:
  void add(T value) {
    std::lock_guard lock(mutex_);
    values_.push_back(std::move(value));
    cv_.notify_all();
  }
  std::vector<T> all() const {
    std::lock_guard lock(mutex_);
    return values_;
  }
  // Waits until `count` values have come.
  bool waitFor(std::size_t count) const {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, kBound, [&] { return values_.size() >= count; });
  }
  // Waits until `value` has come `times` times.
  bool waitForValue(const T& value, std::size_t times = 1) const {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, kBound, [&] {
      return static_cast<std::size_t>(std::count(values_.begin(), values_.end(), value)) >= times;
    });
  }

 private:
  mutable std::mutex mutex_;
  mutable std::condition_variable cv_;
  std::vector<T> values_;
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

// The what() of the exception of type E that `call` raises; "<none>" when it raises none.
template <class E = std::exception>
std::string errorOf(const std::function<void()>& call) {
  try {
    call();
  } catch (const E& e) {
    return e.what();
  }
  return "<none>";
}

// A temporary folder for one test, deleted with everything in it at the end of its scope.
class ScratchFolder {
 public:
  ScratchFolder() {
    std::string pattern = (std::filesystem::temp_directory_path() / "kotest-XXXXXX").string();
    if (!::mkdtemp(pattern.data()))
      throw std::runtime_error("cannot create a temporary folder");
    path_ = pattern;
  }
  ~ScratchFolder() {
    std::error_code ec;
    std::filesystem::remove_all(path_, ec);
  }
  ScratchFolder(const ScratchFolder&) = delete;
  ScratchFolder& operator=(const ScratchFolder&) = delete;

  const std::filesystem::path& path() const noexcept { return path_; }
  // Writes `text` to the file at `relative` (folders made as needed); answers its path.
  std::string write(const std::string& relative, const std::string& text) const {
    const auto file = path_ / relative;
    std::filesystem::create_directories(file.parent_path());
    std::ofstream out(file, std::ios::binary | std::ios::trunc);
    out << text;
    if (!out)
      throw std::runtime_error("cannot write " + file.string());
    return file.string();
  }

 private:
  std::filesystem::path path_;
};

}  // namespace ko::test
