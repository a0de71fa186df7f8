#include "ko/eventloop.hpp"

#include <algorithm>
#include <charconv>
#include <exception>
#include <mutex>
#include <optional>
#include <shared_mutex>

#include <boost/asio/post.hpp>
#include <boost/asio/steady_timer.hpp>

#include "eventloop_impl.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/reaper.hpp"

namespace ko {

namespace detail {
void startReaper();
}  // namespace detail

namespace {

thread_local const EventLoop::Impl* tlCurrentLoop = nullptr;
// The loop whose job this thread runs now.
thread_local const EventLoop::Impl* tlJobLoop = nullptr;

// Runs one job unless the loop was stopped first; an exception is logged and dropped so
// that the pool's thread survives.
void runJob(EventLoop::Impl& impl, std::function<void()>& job) {
  const EventLoop::Impl::JobScope scope(impl);
  if (!scope.entered())
    return;
  try {
    job();
  } catch (const std::exception& e) {
    KO_LOG_ERROR("ko.eventloop") << "Job of event loop '" << impl.name << "' threw: " << e.what();
  } catch (...) {
    KO_LOG_ERROR("ko.eventloop") << "Job of event loop '" << impl.name
                                 << "' threw an unknown exception";
  }
}

// A delayed job's timer, with the mutex that serialises its setup and its cancelation.
struct DelayedJob {
  explicit DelayedJob(boost::asio::io_context& io) : timer(io) {}
  std::mutex mutex;
  boost::asio::steady_timer timer;
  std::uint64_t token = 0;
};

}  // namespace

// The count is raised before the stop flag is read, and the stop sets the flag before it
// reads the count: either the stop waits for the job or the job sees the stop.
EventLoop::Impl::JobScope::JobScope(Impl& impl) noexcept
    : impl_(impl), previous_(tlJobLoop), entered_(false) {
  impl_.running.fetch_add(1);
  entered_ = !impl_.stopped.load();
  tlJobLoop = &impl_;
}

EventLoop::Impl::JobScope::~JobScope() {
  tlJobLoop = previous_;
  impl_.running.fetch_sub(1);
  if (impl_.stopped.load()) {
    std::lock_guard lock(impl_.mutex);
    impl_.idle.notify_all();
  }
}

std::uint64_t EventLoop::Impl::addStopListener(std::function<void()> listener) {
  {
    std::lock_guard lock(mutex);
    if (!stopped.load()) {
      const std::uint64_t token = nextToken++;
      stopListeners.emplace(token, std::move(listener));
      return token;
    }
  }
  listener();
  return 0;
}

void EventLoop::Impl::removeStopListener(std::uint64_t token) {
  std::lock_guard lock(mutex);
  stopListeners.erase(token);
}

EventLoop::EventLoop(std::string name, std::size_t threadCount, Scheduling scheduling)
    : impl_(std::make_shared<Impl>(std::move(name))) {
  if (threadCount == 0)
    threadCount = std::max(2u, std::thread::hardware_concurrency());
  detail::startReaper();
  impl_->work.emplace(impl_->io.get_executor());
  impl_->threads.reserve(threadCount);
  for (std::size_t i = 0; i < threadCount; ++i) {
    impl_->threads.emplace_back([impl = impl_, scheduling] {
      const FrameworkThreadScope framework;
      std::optional<os::RealtimeScope> realtime;
      if (scheduling == Scheduling::Realtime)
        realtime.emplace();
      tlCurrentLoop = impl.get();
      impl->io.run();
      tlCurrentLoop = nullptr;
    });
  }
}

EventLoop::~EventLoop() {
  stop();
}

const std::string& EventLoop::name() const noexcept {
  return impl_->name;
}

std::size_t EventLoop::threadCount() const noexcept {
  return impl_->threads.size();
}

bool EventLoop::isInThisLoop() const noexcept {
  return tlCurrentLoop == impl_.get();
}

void EventLoop::post(std::function<void()> job) {
  if (!job)
    return;
  {
    std::shared_lock lock(impl_->postMutex);
    if (!impl_->stopped.load()) {
      boost::asio::post(
          impl_->io, [impl = impl_.get(), job = std::move(job)]() mutable { runJob(*impl, job); });
      return;
    }
  }
  // A stopped loop drops the job, outside the lock: that breaks its promise, whose
  // continuations may post again.
}

void EventLoop::postDelayed(std::function<void()> job, std::chrono::steady_clock::duration delay) {
  if (!job)
    return;
  if (impl_->stopped.load())
    return;
  auto delayed = std::make_shared<DelayedJob>(impl_->io);
  std::weak_ptr<DelayedJob> weak = delayed;
  delayed->token = impl_->addStopListener([weak] {
    if (auto d = weak.lock()) {
      std::lock_guard l(d->mutex);
      d->timer.cancel();
    }
  });
  // The stop flag is set before the listeners run: either the stop finds the timer
  // waiting and cancels it, or the flag is seen here.
  std::lock_guard lock(delayed->mutex);
  if (impl_->stopped.load())
    return;
  delayed->timer.expires_after(delay);
  delayed->timer.async_wait(
      [impl = impl_, delayed, job = std::move(job)](const boost::system::error_code& ec) mutable {
        impl->removeStopListener(delayed->token);
        if (!ec)
          runJob(*impl, job);
      });
}

void EventLoop::stop() {
  // Kept here: a concurrent owner may destroy this EventLoop while the threads are joined.
  const std::shared_ptr<Impl> impl = impl_;
  std::unordered_map<std::uint64_t, std::function<void()>> listeners;
  bool first = false;
  {
    std::unique_lock postLock(impl->postMutex);
    std::lock_guard lock(impl->mutex);
    first = !impl->stopped.exchange(true);
    if (first)
      listeners.swap(impl->stopListeners);
  }
  if (first) {
    for (auto& [token, listener] : listeners)
      listener();
    // The threads drain what is queued (skipping the jobs) and leave when no work is left.
    impl->work.reset();
  }
  // Every stop, the first or a concurrent one, returns only once no job runs, but for the
  // caller's own; jobs that stop the loop from inside do not wait for each other.
  const bool fromJob = tlJobLoop == impl.get();
  {
    std::unique_lock lock(impl->mutex);
    if (fromJob) {
      ++impl->stoppingJobs;
      impl->idle.notify_all();
    }
    impl->idle.wait(lock,
                    [&] { return impl->running.load() <= (fromJob ? impl->stoppingJobs : 0); });
    if (fromJob)
      --impl->stoppingJobs;
  }
  if (!first)
    return;
  // From one of the loop's threads, the pool cannot be joined: Asio keeps every thread in
  // the loop while a handler still runs. They leave once the caller's job has returned.
  const bool inLoop = tlCurrentLoop == impl.get();
  for (auto& t : impl->threads) {
    if (inLoop)
      t.detach();
    else if (t.joinable())
      t.join();
  }
}

std::shared_ptr<EventLoop> getEventLoop() {
  static const std::shared_ptr<EventLoop> loop = [] {
    std::size_t threads = 4;
    const std::string text = os::getenv("ZEFOKO_EVENTLOOP_THREADS");
    if (!text.empty()) {
      unsigned n = 0;
      const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), n);
      if (ec == std::errc() && end == text.data() + text.size() && n > 0 && n <= 1024)
        threads = n;
      else
        KO_LOG_WARNING("ko.eventloop") << "Ignoring ZEFOKO_EVENTLOOP_THREADS='" << text
                                       << "': not a thread count; using " << threads;
    }
    return std::make_shared<EventLoop>("ko.default", threads);
  }();
  return loop;
}

}  // namespace ko
