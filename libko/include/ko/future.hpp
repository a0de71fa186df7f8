#pragma once
// Futures and promises: the result of an asynchronous operation (a posted call, an
// event-loop job, a service lookup).
//
// A Promise and every Future taken from it share one state; copies of a Future or a
// Promise may be used from any thread at once. The state is guarded by a mutex and a
// condition variable. A future may also be created already holding its value, without a
// shared state (no allocation): the direct calls of the framework answer that way.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <variant>
#include <vector>

#include "ko/error.hpp"

namespace ko {

enum class FutureState {
  None,  // an invalid future (default-constructed)
  Running,
  FinishedWithValue,
  FinishedWithError,
  Canceled,
  Timeout,  // only as the answer of a wait that ran out of time
};

const char* futureStateName(FutureState state) noexcept;

// Time-outs of wait(), in milliseconds.
inline constexpr int FutureTimeout_Infinite = -1;
inline constexpr int FutureTimeout_None = 0;

inline constexpr const char* kPromiseBrokenText = "Promise broken";

template <class T>
class Future;
template <class T>
class Promise;

namespace detail {

// A timed wait longer than this is a wait without limit (the deadline would overflow).
inline constexpr double kLongestTimedWaitSeconds = 100.0 * 365 * 24 * 3600;

template <class T>
using StoredType = std::conditional_t<std::is_void_v<T>, std::monostate, T>;

template <class T>
class FutureSharedState {
 public:
  using Stored = StoredType<T>;

  FutureState state() const {
    std::lock_guard lock(mutex_);
    return state_;
  }

  // Waits at most `msecs` (negative: no limit); answers the state, Timeout when the
  // state is still Running after the wait.
  FutureState wait(int msecs) const {
    if (msecs < 0)
      return waitUntil(std::nullopt);
    return waitFor(std::chrono::milliseconds(msecs));
  }
  FutureState waitFor(std::chrono::steady_clock::duration timeout) const {
    return waitUntil(std::chrono::steady_clock::now() + timeout);
  }
  // std::nullopt: no limit.
  FutureState waitUntil(std::optional<std::chrono::steady_clock::time_point> deadline) const {
    std::unique_lock lock(mutex_);
    auto done = [this] { return state_ != FutureState::Running; };
    if (!deadline) {
      cv_.wait(lock, done);
    } else if (!cv_.wait_until(lock, *deadline, done)) {
      return FutureState::Timeout;
    }
    return state_;
  }

  // Copies of the outcome, taken under the lock.
  std::optional<Stored> value() const {
    std::lock_guard lock(mutex_);
    return value_;
  }
  std::string error() const {
    std::lock_guard lock(mutex_);
    return error_;
  }

  bool finish(FutureState state, std::optional<Stored> value, std::string error) {
    std::vector<std::function<void()>> callbacks;
    {
      std::lock_guard lock(mutex_);
      if (state_ != FutureState::Running)
        return false;
      state_ = state;
      value_ = std::move(value);
      error_ = std::move(error);
      callbacks.swap(callbacks_);
    }
    cv_.notify_all();
    for (auto& cb : callbacks)
      cb();
    return true;
  }

  // As finish(), unless continuations are attached (they would run in this thread):
  // answers false then, or when the state has finished, and leaves the arguments.
  bool finishWithoutContinuations(FutureState state, std::optional<Stored>& value,
                                  std::string& error) {
    {
      std::lock_guard lock(mutex_);
      if (state_ != FutureState::Running || !callbacks_.empty())
        return false;
      state_ = state;
      value_ = std::move(value);
      error_ = std::move(error);
    }
    cv_.notify_all();
    return true;
  }

  // Runs `cb` when the state finishes, at once (in this thread) if it already has.
  void onFinished(std::function<void()> cb) {
    {
      std::lock_guard lock(mutex_);
      if (state_ == FutureState::Running) {
        callbacks_.push_back(std::move(cb));
        return;
      }
    }
    cb();
  }

  void addPromise() noexcept { promises_.fetch_add(1, std::memory_order_relaxed); }
  void releasePromise() {
    if (promises_.fetch_sub(1, std::memory_order_acq_rel) == 1)
      finish(FutureState::FinishedWithError, std::nullopt, kPromiseBrokenText);
  }

 private:
  mutable std::mutex mutex_;
  mutable std::condition_variable cv_;
  FutureState state_ = FutureState::Running;
  std::optional<Stored> value_;
  std::string error_;
  std::vector<std::function<void()>> callbacks_;
  std::atomic<int> promises_{0};
};

std::string currentExceptionText();

}  // namespace detail

template <class T>
class Future {
 public:
  using ValueType = T;
  using Stored = detail::StoredType<T>;

  // An invalid future: it reads as an error "Invalid future".
  Future() = default;

  // A future that already holds its value.
  static Future fromValue(Stored value) {
    Future f;
    f.ready_.emplace(std::move(value));
    return f;
  }
  static Future fromValue() requires std::is_void_v<T> { return fromValue(Stored{}); }
  // A future that already holds an error.
  static Future fromError(std::string error) {
    Promise<T> p;
    p.setError(std::move(error));
    return p.future();
  }

  bool isValid() const noexcept { return state_ || ready_; }

  // Waits at most `msecs` milliseconds (FutureTimeout_Infinite: no limit).
  FutureState wait(int msecs = FutureTimeout_Infinite) const {
    if (ready_)
      return FutureState::FinishedWithValue;
    if (!state_)
      return FutureState::None;
    return state_->wait(msecs);
  }
  // Waits at most `timeout`, to the clock's resolution: a zero or negative one does not
  // wait, one beyond a century waits without limit.
  template <class Rep, class Period>
  FutureState wait(std::chrono::duration<Rep, Period> timeout) const {
    if (ready_)
      return FutureState::FinishedWithValue;
    if (!state_)
      return FutureState::None;
    if (timeout <= timeout.zero())
      return state_->waitFor(std::chrono::steady_clock::duration::zero());
    if (std::chrono::duration<double>(timeout).count() >= detail::kLongestTimedWaitSeconds)
      return state_->waitUntil(std::nullopt);
    return state_->waitFor(std::chrono::ceil<std::chrono::steady_clock::duration>(timeout));
  }

  // The value, after waiting at most `msecs`; throws FutureError with the error text on
  // an error, "Future canceled", "Future timeout" or "Invalid future".
  T value(int msecs = FutureTimeout_Infinite) const& {
    if constexpr (std::is_void_v<T>) {
      if (!ready_)
        throwUnlessValue(wait(msecs));
    } else {
      if (ready_)
        return *ready_;
      throwUnlessValue(wait(msecs));
      return *state_->value();
    }
  }
  T value(int msecs = FutureTimeout_Infinite) && {
    if constexpr (std::is_void_v<T>) {
      if (!ready_)
        throwUnlessValue(wait(msecs));
    } else {
      if (ready_)
        return std::move(*ready_);
      throwUnlessValue(wait(msecs));
      return std::move(*state_->value());
    }
  }

  bool isFinished() const { return state() != FutureState::Running; }
  bool isRunning() const { return state() == FutureState::Running; }
  bool isCanceled() const { return state() == FutureState::Canceled; }
  // These wait at most `msecs` first.
  bool hasValue(int msecs = FutureTimeout_Infinite) const {
    return wait(msecs) == FutureState::FinishedWithValue;
  }
  bool hasError(int msecs = FutureTimeout_Infinite) const {
    const FutureState s = wait(msecs);
    return s == FutureState::FinishedWithError || s == FutureState::None;
  }
  // The error text, after waiting at most `msecs`; "" when the future has no error.
  std::string error(int msecs = FutureTimeout_Infinite) const {
    const FutureState s = wait(msecs);
    if (s == FutureState::None)
      return "Invalid future";
    if (s != FutureState::FinishedWithError)
      return {};
    return state_->error();
  }
  // The state now, without waiting.
  FutureState state() const {
    if (ready_)
      return FutureState::FinishedWithValue;
    if (!state_)
      return FutureState::None;
    return state_->state();
  }

  // Calls f(Future<T>) when this future finishes: in the thread that finishes it, or at
  // once in this thread if it already has. Answers a future of f's result (or of the
  // text of what f threw).
  template <class F>
  auto then(F&& f) const -> Future<std::invoke_result_t<std::decay_t<F>, Future<T>>>;

  // Calls f(value) when this future finishes with a value; an error (or a cancelation,
  // as the error "Future canceled") is passed on to the answered future without calling f.
  template <class F>
  auto andThen(F&& f) const;

 private:
  template <class U>
  friend class Promise;
  explicit Future(std::shared_ptr<detail::FutureSharedState<T>> state) : state_(std::move(state)) {}

  void throwUnlessValue(FutureState s) const {
    switch (s) {
      case FutureState::FinishedWithValue:
        return;
      case FutureState::FinishedWithError:
        throw FutureError(state_->error());
      case FutureState::Canceled:
        throw FutureError("Future canceled");
      case FutureState::Timeout:
        throw FutureError("Future timeout");
      case FutureState::None:
      case FutureState::Running:
        break;
    }
    throw FutureError("Invalid future");
  }

  std::shared_ptr<detail::FutureSharedState<T>> state_;
  std::optional<Stored> ready_;
};

// The writing side of a future. Copies share the state; when the last copy is destroyed
// before a value or an error was set, the future finishes with the error "Promise broken".
template <class T>
class Promise {
 public:
  using Stored = detail::StoredType<T>;

  Promise() : state_(std::make_shared<detail::FutureSharedState<T>>()) { state_->addPromise(); }
  Promise(const Promise& o) : state_(o.state_) {
    if (state_)
      state_->addPromise();
  }
  Promise(Promise&& o) noexcept : state_(std::move(o.state_)) {}
  Promise& operator=(const Promise& o) {
    if (this != &o) {
      release();
      state_ = o.state_;
      if (state_)
        state_->addPromise();
    }
    return *this;
  }
  Promise& operator=(Promise&& o) noexcept {
    if (this != &o) {
      release();
      state_ = std::move(o.state_);
    }
    return *this;
  }
  ~Promise() { release(); }

  Future<T> future() const { return Future<T>(state_); }

  // Each throws FutureError "Promise already satisfied" when the future has finished.
  void setValue(Stored value) { check(trySetValue(std::move(value))); }
  void setValue() requires std::is_void_v<T> { setValue(Stored{}); }
  void setError(std::string error) { check(trySetError(std::move(error))); }
  void setCanceled() { check(state_ && state_->finish(FutureState::Canceled, std::nullopt, {})); }

  // Settle the future in this thread unless continuations are attached to it (which would
  // run in this thread): answer false then (or when it has finished) and leave the
  // argument, for the caller to settle it in another thread.
  bool trySetValueWithoutContinuations(std::optional<Stored>& value) {
    std::string none;
    return state_ &&
           state_->finishWithoutContinuations(FutureState::FinishedWithValue, value, none);
  }
  bool trySetErrorWithoutContinuations(std::string& error) {
    std::optional<Stored> none;
    return state_ &&
           state_->finishWithoutContinuations(FutureState::FinishedWithError, none, error);
  }

  // Like the above, but answer false instead of throwing.
  bool trySetValue(Stored value) {
    return state_ && state_->finish(FutureState::FinishedWithValue, std::move(value), {});
  }
  bool trySetValue() requires std::is_void_v<T> { return trySetValue(Stored{}); }
  bool trySetError(std::string error) {
    return state_ && state_->finish(FutureState::FinishedWithError, std::nullopt, std::move(error));
  }

 private:
  void release() {
    if (state_)
      state_->releasePromise();
    state_.reset();
  }
  static void check(bool ok) {
    if (!ok)
      throw FutureError("Promise already satisfied");
  }
  std::shared_ptr<detail::FutureSharedState<T>> state_;
};

template <class T>
Future<std::decay_t<T>> makeFutureValue(T&& value) {
  return Future<std::decay_t<T>>::fromValue(std::forward<T>(value));
}
inline Future<void> makeFutureValue() {
  return Future<void>::fromValue();
}
template <class T>
Future<T> makeFutureError(std::string error) {
  return Future<T>::fromError(std::move(error));
}

namespace detail {
// Runs f(args...) and sets the promise with its result, or with the text of what it threw.
template <class R, class F, class... A>
void setPromiseFrom(Promise<R>& promise, F& f, A&&... args) {
  try {
    if constexpr (std::is_void_v<R>) {
      std::invoke(f, std::forward<A>(args)...);
      promise.trySetValue();
    } else {
      promise.trySetValue(std::invoke(f, std::forward<A>(args)...));
    }
  } catch (...) {
    promise.trySetError(currentExceptionText());
  }
}
}  // namespace detail

template <class T>
template <class F>
auto Future<T>::then(F&& f) const -> Future<std::invoke_result_t<std::decay_t<F>, Future<T>>> {
  using R = std::invoke_result_t<std::decay_t<F>, Future<T>>;
  Promise<R> promise;
  Future<R> result = promise.future();
  if (!state_) {
    detail::setPromiseFrom(promise, f, *this);
    return result;
  }
  state_->onFinished([promise, self = *this, fn = std::decay_t<F>(std::forward<F>(f))]() mutable {
    detail::setPromiseFrom(promise, fn, self);
  });
  return result;
}

template <class T>
template <class F>
auto Future<T>::andThen(F&& f) const {
  if constexpr (std::is_void_v<T>) {
    using R = std::invoke_result_t<std::decay_t<F>>;
    return then([fn = std::decay_t<F>(std::forward<F>(f))](const Future<T>& done) mutable -> R {
      done.value();
      return fn();
    });
  } else {
    using R = std::invoke_result_t<std::decay_t<F>, T>;
    return then([fn = std::decay_t<F>(std::forward<F>(f))](const Future<T>& done) mutable -> R {
      return fn(done.value());
    });
  }
}

}  // namespace ko
