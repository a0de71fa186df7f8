#include "ko/eventloop.hpp"

#include <algorithm>
#include <charconv>
#include <exception>
#include <mutex>
#include <shared_mutex>

#include <boost/asio/post.hpp>
#include <boost/asio/steady_timer.hpp>

#include "eventloop_impl.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"

namespace ko {

namespace {

thread_local const EventLoop::Impl* tlCurrentLoop = nullptr;

// Runs one job; an exception is logged and dropped so that the pool's thread survives.
void runJob(const EventLoop::Impl& impl, std::function<void()>& job) {
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

EventLoop::EventLoop(std::string name, std::size_t threadCount)
    : impl_(std::make_shared<Impl>(std::move(name))) {
  if (threadCount == 0)
    threadCount = std::max(2u, std::thread::hardware_concurrency());
  impl_->work.emplace(impl_->io.get_executor());
  impl_->threads.reserve(threadCount);
  for (std::size_t i = 0; i < threadCount; ++i) {
    impl_->threads.emplace_back([impl = impl_] {
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
      boost::asio::post(impl_->io, [impl = impl_.get(), job = std::move(job)]() mutable {
        if (!impl->stopped.load())
          runJob(*impl, job);
      });
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
        if (!ec && !impl->stopped.load())
          runJob(*impl, job);
      });
}

void EventLoop::stop() {
  std::unordered_map<std::uint64_t, std::function<void()>> listeners;
  {
    std::unique_lock postLock(impl_->postMutex);
    std::lock_guard lock(impl_->mutex);
    if (impl_->stopped.exchange(true))
      return;
    listeners.swap(impl_->stopListeners);
  }
  for (auto& [token, listener] : listeners)
    listener();
  // The threads drain what is queued (skipping the jobs) and leave when no work is left.
  impl_->work.reset();
  const auto self = std::this_thread::get_id();
  for (auto& t : impl_->threads) {
    if (t.get_id() == self || isInThisLoop())
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
