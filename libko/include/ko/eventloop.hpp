#pragma once
// A pool of threads that runs jobs: posted functions, asynchronous calls with a future of
// their result, and delayed jobs. Built on a Boost.Asio io_context kept alive by a work
// guard and run by every thread of the pool. Its threads are framework threads (see
// reaper.hpp): an object made with ko::makeShared that dies in one of its jobs is
// destroyed on the reaper instead.
//
// All member functions are thread-safe, from any thread, the loop's own included.
// stop() (and the destructor, which calls it) returns only once no job of the loop runs
// any more, except, when called from inside a job of this loop, the caller's own job (and
// those of other jobs that are stopping the loop from inside at the same time). A job
// still queued is dropped: its future finishes with "Promise broken". A stop from outside
// joins the threads; a stop from one of the loop's threads lets them leave once the
// caller's job returns, so a loop may be stopped, or its owner destroyed, in one of its
// own jobs. Since a stop waits for the running jobs, it must not be called from a thread
// that one of them waits for: a job stopping its own loop while another job waits for
// it, or a callback that a job of the loop is blocked on.

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>

#include "ko/future.hpp"

namespace ko {

class EventLoop {
 public:
  enum class Scheduling {
    Normal,
    // The threads of a loop on a latency-critical path (the delivery of events) run at
    // the framework's real-time priority (os.hpp, RealtimeScope).
    Realtime,
  };

  // `threadCount` 0 picks the machine's hardware concurrency, at least 2.
  explicit EventLoop(std::string name = "EventLoop", std::size_t threadCount = 0,
                     Scheduling scheduling = Scheduling::Normal);
  ~EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  const std::string& name() const noexcept;
  std::size_t threadCount() const noexcept;
  // Whether the calling thread is one of this loop's threads.
  bool isInThisLoop() const noexcept;

  // Queues `job`; an exception that escapes it is logged and dropped.
  void post(std::function<void()> job);
  // Queues `job` to run once `delay` has passed.
  void postDelayed(std::function<void()> job, std::chrono::steady_clock::duration delay);

  // Runs f() on the loop; the future carries its result, or the text of what it threw.
  template <class F>
  auto async(F&& f) -> Future<std::invoke_result_t<std::decay_t<F>>> {
    return asyncDelay(std::forward<F>(f), std::chrono::steady_clock::duration::zero());
  }
  // Runs f() on the loop once `delay` has passed.
  template <class F, class Rep, class Period>
  auto asyncDelay(F&& f, std::chrono::duration<Rep, Period> delay)
      -> Future<std::invoke_result_t<std::decay_t<F>>> {
    using R = std::invoke_result_t<std::decay_t<F>>;
    Promise<R> promise;
    Future<R> result = promise.future();
    auto job = [promise = std::move(promise), fn = std::decay_t<F>(std::forward<F>(f))]() mutable {
      detail::setPromiseFrom(promise, fn);
    };
    const auto d = std::chrono::duration_cast<std::chrono::steady_clock::duration>(delay);
    if (d <= std::chrono::steady_clock::duration::zero())
      post(std::move(job));
    else
      postDelayed(std::move(job), d);
    return result;
  }

  // Stops the loop: queued and later jobs are dropped, running ones are waited for (see
  // above). Idempotent; concurrent calls all wait.
  void stop();

  // Internal: the loop's io_context, for the framework's own timers.
  struct Impl;
  Impl& impl() noexcept { return *impl_; }

 private:
  std::shared_ptr<Impl> impl_;
};

// The process-wide loop, created on first use with ZEFOKO_EVENTLOOP_THREADS threads
// (4 when unset or not a positive number).
std::shared_ptr<EventLoop> getEventLoop();

}  // namespace ko
