#pragma once
// The inside of an EventLoop, shared with the framework's own timers (periodic tasks).

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <shared_mutex>
#include <string>
#include <thread>
#include <unordered_map>
#include <vector>

#include <boost/asio/executor_work_guard.hpp>
#include <boost/asio/io_context.hpp>

#include "ko/eventloop.hpp"

namespace ko {

// Owned by the EventLoop and by each of its threads (the last one out destroys it).
// `io` is run by the pool; the listeners are told when the loop stops so that they
// cancel their timers.
struct EventLoop::Impl : std::enable_shared_from_this<EventLoop::Impl> {
  using WorkGuard = boost::asio::executor_work_guard<boost::asio::io_context::executor_type>;

  // Counts one job of the loop (a posted or delayed job, a periodic task's run) for the
  // stop, which waits until no job runs. A job that begins after the stop is not run:
  // `entered()` is false.
  class JobScope {
   public:
    explicit JobScope(Impl& impl) noexcept;
    ~JobScope();
    JobScope(const JobScope&) = delete;
    JobScope& operator=(const JobScope&) = delete;
    bool entered() const noexcept { return entered_; }

   private:
    Impl& impl_;
    const Impl* previous_;
    bool entered_;
  };

  explicit Impl(std::string loopName) : name(std::move(loopName)) {}

  // Answers a token for removeStopListener; a listener added after the stop runs at once.
  std::uint64_t addStopListener(std::function<void()> listener);
  void removeStopListener(std::uint64_t token);

  const std::string name;
  boost::asio::io_context io;
  std::optional<WorkGuard> work;
  std::vector<std::thread> threads;
  std::atomic<bool> stopped{false};

  // Shared by the posts, exclusive for the stop: a job is queued before the stop (and the
  // draining threads drop it) or not at all, never after the threads have left.
  std::shared_mutex postMutex;
  std::mutex mutex;  // listeners, stop
  std::unordered_map<std::uint64_t, std::function<void()>> stopListeners;
  std::uint64_t nextToken = 1;

  // The jobs running now; once the loop is stopped, each end notifies `idle` (with `mutex`).
  std::atomic<int> running{0};
  std::condition_variable idle;
  int stoppingJobs = 0;  // under `mutex`: jobs waiting in stop()
};

}  // namespace ko
