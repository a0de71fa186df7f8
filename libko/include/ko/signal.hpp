#pragma once
// Signals: a list of subscribers called with the signal's arguments when it is triggered.
//
// `Signal<T...>` is typed and built on Boost.Signals2; `SignalBase` is its type-erased face,
// with arguments carried as AnyValue, through which objects expose their signals by name;
// `DynamicSignal` is a signal that only has that face (a run-time signature).
//
// Subscribers run in the thread that triggers the signal. Every function is thread-safe.
// disconnect() waits for running calls of that subscriber in other threads to end, so that
// once it returns the subscriber is never running and will never be called again; called
// from inside the subscriber itself it does not wait for that call.

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <tuple>
#include <type_traits>
#include <unordered_map>
#include <utility>
#include <vector>

#include <boost/signals2/signal.hpp>

#include "ko/anyvalue.hpp"
#include "ko/error.hpp"

namespace ko {

// Identifies one subscription; unique within the process, never 0.
using SignalLink = std::uint64_t;
inline constexpr SignalLink kInvalidSignalLink = 0;

// A subscriber of the type-erased face.
using SignalSubscriber = std::function<void(const std::vector<AnyValue>&)>;

namespace detail {

SignalLink nextSignalLink() noexcept;

// Tracks the running calls of one subscriber so that disconnect can wait for them.
class SlotGuard {
 public:
  // Answers false when the subscriber was disconnected (the call must be skipped).
  bool enter();
  void leave();
  // Marks the subscriber gone and waits until no other thread runs it.
  void deactivate();

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  bool active_ = true;
  int running_ = 0;
};

// Calls enter/leave around one call of a subscriber.
class SlotCall {
 public:
  explicit SlotCall(SlotGuard& g) : guard_(g), entered_(g.enter()) {}
  ~SlotCall() {
    if (entered_)
      guard_.leave();
  }
  SlotCall(const SlotCall&) = delete;
  SlotCall& operator=(const SlotCall&) = delete;
  bool entered() const noexcept { return entered_; }

 private:
  SlotGuard& guard_;
  bool entered_;
};

// Logs a subscriber's exception: a failing subscriber never breaks the triggering thread
// nor keeps the other subscribers from being called.
void reportSubscriberError(const std::string& signature, const char* what) noexcept;

}  // namespace detail

class SignalBase {
 public:
  virtual ~SignalBase() = default;
  // The parameter signature, "(is)".
  virtual std::string signature() const = 0;
  virtual std::size_t arity() const = 0;
  // Subscribes a callback receiving the arguments as AnyValue.
  virtual SignalLink connectAny(SignalSubscriber subscriber) = 0;
  // Triggers the signal with AnyValue arguments; raises ko::Error when their number or
  // types do not fit the signal.
  virtual void triggerAny(const std::vector<AnyValue>& args) = 0;
  // Answers false for a link that is not (or no longer) one of this signal's.
  virtual bool disconnect(SignalLink link) = 0;
  virtual void disconnectAll() = 0;
  virtual std::size_t subscriberCount() const = 0;
};

template <class... T>
class Signal : public SignalBase {
 public:
  using Callback = std::function<void(T...)>;

  Signal() = default;
  Signal(const Signal&) = delete;
  Signal& operator=(const Signal&) = delete;
  ~Signal() override { disconnectAll(); }

  SignalLink connect(Callback callback) {
    if (!callback)
      throw Error("Cannot connect an empty callback to a signal");
    auto guard = std::make_shared<detail::SlotGuard>();
    const SignalLink link = detail::nextSignalLink();
    auto slot = [guard, cb = std::move(callback)](T... args) {
      detail::SlotCall call(*guard);
      if (!call.entered())
        return;
      try {
        cb(args...);
      } catch (const std::exception& e) {
        detail::reportSubscriberError(staticSignature(), e.what());
      } catch (...) {
        detail::reportSubscriberError(staticSignature(), "unknown exception");
      }
    };
    std::lock_guard lock(mutex_);
    links_.emplace(link, Entry{signal_.connect(std::move(slot)), std::move(guard)});
    return link;
  }

  template <class... U>
  void operator()(U&&... args) {
    signal_(std::forward<U>(args)...);
  }

  static std::string staticSignature() {
    return "(" + (std::string() + ... + signatureOf<T>()) + ")";
  }
  std::string signature() const override { return staticSignature(); }
  std::size_t arity() const override { return sizeof...(T); }

  SignalLink connectAny(SignalSubscriber subscriber) override {
    if (!subscriber)
      throw Error("Cannot connect an empty callback to a signal");
    return connect([sub = std::move(subscriber)](T... args) {
      sub(std::vector<AnyValue>{AnyValue::from(args)...});
    });
  }

  void triggerAny(const std::vector<AnyValue>& args) override {
    if (args.size() != sizeof...(T))
      throw Error("Signal " + signature() + " takes " + std::to_string(sizeof...(T)) +
                  " argument(s), got " + std::to_string(args.size()));
    std::tuple<std::remove_cvref_t<T>...> values;
    try {
      values = readArgs(args, std::index_sequence_for<T...>{});
    } catch (const ConversionError& e) {
      throw Error("Signal " + signature() + ": bad argument: " + e.what());
    }
    std::apply([this](auto&... v) { signal_(v...); }, values);
  }

  bool disconnect(SignalLink link) override {
    std::shared_ptr<detail::SlotGuard> guard;
    {
      std::lock_guard lock(mutex_);
      auto it = links_.find(link);
      if (it == links_.end())
        return false;
      it->second.connection.disconnect();
      guard = std::move(it->second.guard);
      links_.erase(it);
    }
    guard->deactivate();
    return true;
  }

  void disconnectAll() override {
    std::unordered_map<SignalLink, Entry> all;
    {
      std::lock_guard lock(mutex_);
      all.swap(links_);
    }
    for (auto& [link, entry] : all) {
      entry.connection.disconnect();
      entry.guard->deactivate();
    }
  }

  std::size_t subscriberCount() const override {
    std::lock_guard lock(mutex_);
    return links_.size();
  }

 private:
  template <std::size_t... I>
  static std::tuple<std::remove_cvref_t<T>...> readArgs(const std::vector<AnyValue>& args,
                                                        std::index_sequence<I...>) {
    return {args[I].template to<std::remove_cvref_t<T>>()...};
  }

  struct Entry {
    boost::signals2::connection connection;
    std::shared_ptr<detail::SlotGuard> guard;
  };
  boost::signals2::signal<void(T...)> signal_;
  mutable std::mutex mutex_;
  std::unordered_map<SignalLink, Entry> links_;
};

// A signal known only by its run-time parameter signature; its subscribers receive the
// arguments as AnyValue.
class DynamicSignal : public SignalBase {
 public:
  // `parametersSignature` as "(is)" (or "is"); raises ko::Error when malformed.
  explicit DynamicSignal(std::string parametersSignature);

  std::string signature() const override { return signature_; }
  std::size_t arity() const override { return arity_; }
  SignalLink connectAny(SignalSubscriber subscriber) override {
    return signal_.connect(std::move(subscriber));
  }
  void triggerAny(const std::vector<AnyValue>& args) override;
  bool disconnect(SignalLink link) override { return signal_.disconnect(link); }
  void disconnectAll() override { signal_.disconnectAll(); }
  std::size_t subscriberCount() const override { return signal_.subscriberCount(); }

 private:
  std::string signature_;
  std::size_t arity_;
  Signal<const std::vector<AnyValue>&> signal_;
};

}  // namespace ko
