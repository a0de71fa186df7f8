#include "ko/signal.hpp"

#include <algorithm>
#include <atomic>

#include "ko/log.hpp"
#include "ko/metaobject.hpp"

namespace ko {

namespace detail {

namespace {
// The subscribers that the calling thread is running, innermost last.
thread_local std::vector<const SlotGuard*> tlRunningSlots;
}  // namespace

SignalLink nextSignalLink() noexcept {
  static std::atomic<SignalLink> next{1};
  return next.fetch_add(1, std::memory_order_relaxed);
}

bool SlotGuard::enter() {
  {
    std::lock_guard lock(mutex_);
    if (!active_)
      return false;
    ++running_;
  }
  tlRunningSlots.push_back(this);
  return true;
}

void SlotGuard::leave() {
  tlRunningSlots.pop_back();
  std::lock_guard lock(mutex_);
  --running_;
  cv_.notify_all();
}

void SlotGuard::deactivate() {
  // Calls of this subscriber that the calling thread itself is inside cannot end while
  // we wait: only the others are waited for.
  const auto own = std::count(tlRunningSlots.begin(), tlRunningSlots.end(), this);
  std::unique_lock lock(mutex_);
  active_ = false;
  cv_.wait(lock, [&] { return running_ <= own; });
}

void reportSubscriberError(const std::string& signature, const char* what) noexcept {
  try {
    KO_LOG_ERROR("ko.signal") << "Subscriber of signal " << signature << " threw: " << what;
  } catch (...) {
  }
}

}  // namespace detail

DynamicSignal::DynamicSignal(std::string parametersSignature)
    : signature_(signature::normalizeParameters(parametersSignature)),
      arity_(signature::arity(signature_)) {}

void DynamicSignal::triggerAny(const std::vector<AnyValue>& args) {
  if (args.size() != arity_)
    throw Error("Signal " + signature_ + " takes " + std::to_string(arity_) + " argument(s), got " +
                std::to_string(args.size()));
  signal_(args);
}

}  // namespace ko
