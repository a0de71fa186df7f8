#include "ko/periodictask.hpp"

#include <atomic>
#include <condition_variable>
#include <exception>
#include <mutex>
#include <thread>

#include <boost/asio/steady_timer.hpp>

#include "eventloop_impl.hpp"
#include "ko/error.hpp"
#include "ko/log.hpp"

namespace ko {

// The task's state, shared with the timer handlers (which may outlive the PeriodicTask).
// Everything but `period` is guarded by `mutex`; the timer is only touched under it.
struct PeriodicTask::Impl : std::enable_shared_from_this<PeriodicTask::Impl> {
  enum class State { Stopped, Scheduled, Running, Stopping };

  explicit Impl(std::shared_ptr<EventLoop> l)
      : loop(std::move(l)), timer(loop->impl().io), name("PeriodicTask") {}

  void schedule(std::chrono::microseconds delay);
  void fire(std::uint64_t gen, const boost::system::error_code& ec);
  void onLoopStopped();
  bool inCallback() const { return callbackThread == std::this_thread::get_id(); }

  const std::shared_ptr<EventLoop> loop;
  std::uint64_t stopListener = 0;

  mutable std::mutex mutex;
  std::condition_variable cv;
  boost::asio::steady_timer timer;
  State state = State::Stopped;
  // The pending stop was asked for from outside the callback (another thread, or the
  // owner's destruction): a restart from inside the callback does not cancel it.
  bool outsideStop = false;
  std::uint64_t generation = 0;  // bumped on each start and stop; stale handlers do nothing
  std::thread::id callbackThread;
  std::function<void()> callback;
  std::string name;
  std::atomic<std::int64_t> period{0};
};

void PeriodicTask::Impl::schedule(std::chrono::microseconds delay) {
  timer.expires_after(delay);
  timer.async_wait([self = shared_from_this(), gen = generation](
                       const boost::system::error_code& ec) { self->fire(gen, ec); });
}

void PeriodicTask::Impl::fire(std::uint64_t gen, const boost::system::error_code& ec) {
  // Counted as a job of the loop, so that stopping the loop waits for the callback.
  const EventLoop::Impl::JobScope job(loop->impl());
  std::function<void()> cb;
  std::string taskName;
  {
    std::lock_guard lock(mutex);
    if (gen != generation || state != State::Scheduled)
      return;
    if (ec || !job.entered()) {  // the loop was stopped under the task
      state = State::Stopped;
      cv.notify_all();
      return;
    }
    state = State::Running;
    callbackThread = std::this_thread::get_id();
    cb = callback;
    taskName = name;
  }
  try {
    cb();
  } catch (const std::exception& e) {
    KO_LOG_ERROR("ko.periodictask")
        << "Callback of periodic task '" << taskName << "' threw: " << e.what();
  } catch (...) {
    KO_LOG_ERROR("ko.periodictask")
        << "Callback of periodic task '" << taskName << "' threw an unknown exception";
  }
  std::lock_guard lock(mutex);
  callbackThread = {};
  if (state == State::Running && !loop->impl().stopped.load()) {
    try {
      state = State::Scheduled;
      schedule(std::chrono::microseconds(period.load()));
    } catch (const std::exception& e) {
      KO_LOG_ERROR("ko.periodictask")
          << "Periodic task '" << taskName << "' cannot be scheduled again: " << e.what();
      state = State::Stopped;
    }
  } else {
    state = State::Stopped;
  }
  if (state == State::Stopped)
    outsideStop = false;
  cv.notify_all();
}

void PeriodicTask::Impl::onLoopStopped() {
  std::lock_guard lock(mutex);
  if (state == State::Scheduled) {
    ++generation;
    timer.cancel();
    state = State::Stopped;
    cv.notify_all();
  }
}

PeriodicTask::PeriodicTask() : PeriodicTask(getEventLoop()) {}

PeriodicTask::PeriodicTask(std::shared_ptr<EventLoop> loop) {
  if (!loop)
    throw Error("PeriodicTask needs an event loop");
  impl_ = std::make_shared<Impl>(std::move(loop));
  std::weak_ptr<Impl> weak = impl_;
  impl_->stopListener = impl_->loop->impl().addStopListener([weak] {
    if (auto self = weak.lock())
      self->onLoopStopped();
  });
}

PeriodicTask::~PeriodicTask() {
  stop();
  impl_->loop->impl().removeStopListener(impl_->stopListener);
}

void PeriodicTask::setName(std::string name) {
  std::lock_guard lock(impl_->mutex);
  impl_->name = std::move(name);
}

std::string PeriodicTask::name() const {
  std::lock_guard lock(impl_->mutex);
  return impl_->name;
}

void PeriodicTask::setCallback(std::function<void()> callback) {
  std::lock_guard lock(impl_->mutex);
  impl_->callback = std::move(callback);
}

void PeriodicTask::setUsPeriod(std::int64_t usPeriod) {
  if (usPeriod < 0)
    throw Error("Periodic task '" + name() + "': the period must not be negative (" +
                std::to_string(usPeriod) + " us)");
  impl_->period.store(usPeriod);
}

std::int64_t PeriodicTask::usPeriod() const {
  return impl_->period.load();
}

void PeriodicTask::start(bool immediate) {
  std::unique_lock lock(impl_->mutex);
  if (!impl_->callback)
    throw Error("Periodic task '" + impl_->name + "' has no callback");
  if (impl_->state == Impl::State::Stopping) {
    if (impl_->inCallback()) {
      // The callback may take back a stop of its own, never one asked from outside.
      if (!impl_->outsideStop)
        impl_->state = Impl::State::Running;
      return;
    }
    impl_->cv.wait(lock, [this] { return impl_->state != Impl::State::Stopping; });
  }
  if (impl_->state != Impl::State::Stopped)
    return;
  if (impl_->loop->impl().stopped.load())
    throw Error("Periodic task '" + impl_->name + "': its event loop is stopped");
  ++impl_->generation;
  impl_->state = Impl::State::Scheduled;
  try {
    impl_->schedule(std::chrono::microseconds(immediate ? 0 : impl_->period.load()));
  } catch (...) {
    impl_->state = Impl::State::Stopped;
    throw;
  }
}

void PeriodicTask::stop() {
  std::unique_lock lock(impl_->mutex);
  switch (impl_->state) {
    case Impl::State::Stopped:
      return;
    case Impl::State::Scheduled:
      ++impl_->generation;
      impl_->timer.cancel();
      impl_->state = Impl::State::Stopped;
      impl_->cv.notify_all();
      return;
    case Impl::State::Running:
    case Impl::State::Stopping:
      impl_->state = Impl::State::Stopping;
      if (impl_->inCallback())
        return;
      impl_->outsideStop = true;
      impl_->cv.wait(lock, [this] { return impl_->state != Impl::State::Stopping; });
      return;
  }
}

void PeriodicTask::asyncStop() {
  std::lock_guard lock(impl_->mutex);
  if (impl_->state == Impl::State::Scheduled) {
    ++impl_->generation;
    impl_->timer.cancel();
    impl_->state = Impl::State::Stopped;
    impl_->cv.notify_all();
  } else if (impl_->state == Impl::State::Running || impl_->state == Impl::State::Stopping) {
    impl_->state = Impl::State::Stopping;
    if (!impl_->inCallback())
      impl_->outsideStop = true;
  }
}

bool PeriodicTask::isRunning() const {
  std::lock_guard lock(impl_->mutex);
  return impl_->state != Impl::State::Stopped;
}

bool PeriodicTask::isStopping() const {
  std::lock_guard lock(impl_->mutex);
  return impl_->state == Impl::State::Stopping;
}

}  // namespace ko
