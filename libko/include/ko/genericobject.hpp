#pragma once
// A handle on a DynamicObject, through which services call each other's methods by name,
// trigger their signals and subscribe to them. Held as an AnyObject (a shared pointer).
//
// The handle holds its object strongly (keeps it alive) or weakly (a call on an object
// that is gone raises ko::Error "Object is gone: <label>"). A handle never changes after
// construction, so it is used from any number of threads at once without a lock. Within
// one process, arguments and results are passed in memory, never serialised.

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/dynamicobject.hpp"
#include "ko/error.hpp"
#include "ko/future.hpp"
#include "ko/metaobject.hpp"
#include "ko/signal.hpp"

namespace ko {

namespace detail {
template <class A>
AnyValue toAnyValue(A&& a) {
  using T = std::remove_cvref_t<A>;
  if constexpr (std::is_same_v<T, AnyValue> ||
                (std::is_same_v<T, std::string> && !std::is_lvalue_reference_v<A>))
    return std::forward<A>(a);
  else
    return AnyValue::from(a);
}

// The arguments of a call, each converted once (a braced list would copy them again).
template <class... A>
std::vector<AnyValue> argumentList(A&&... args) {
  std::vector<AnyValue> list;
  list.reserve(sizeof...(A));
  (list.push_back(toAnyValue(std::forward<A>(args))), ...);
  return list;
}

template <class... A>
inline constexpr bool isSingleArgVector =
    sizeof...(A) == 1 && (std::is_same_v<std::remove_cvref_t<A>, std::vector<AnyValue>> && ...);

// Reads a call's result as R; ResultConversionError when it does not fit.
template <class R>
R convertResult(AnyValue&& result) {
  if constexpr (std::is_void_v<R>) {
    (void)result;
  } else if constexpr (std::is_same_v<std::remove_cvref_t<R>, AnyValue>) {
    return std::move(result);
  } else {
    try {
      if constexpr (std::is_same_v<R, std::string>) {
        if (result.kind() == Kind::String)
          return std::move(result.asString());
      }
      return result.template to<R>();
    } catch (const ConversionError&) {
      throw ResultConversionError(result.signature(), signatureOf<R>());
    }
  }
}

template <class R>
Future<R> convertFuture(Future<AnyValue> f) {
  if constexpr (std::is_same_v<R, AnyValue>) {
    return f;
  } else {
    return f.andThen([](AnyValue v) { return convertResult<R>(std::move(v)); });
  }
}

template <class Args>
inline constexpr bool isAnyValueListArgs = false;
template <class A>
inline constexpr bool isAnyValueListArgs<TypeList<A>> =
    std::is_same_v<std::remove_cvref_t<A>, std::vector<AnyValue>>;

template <class F, class... A>
SignalSubscriber makeSubscriber(F f, TypeList<A...>) {
  return [fn = std::move(f)](const std::vector<AnyValue>& args) mutable {
    if (args.size() != sizeof...(A))
      throw Error("Subscriber takes " + std::to_string(sizeof...(A)) + " argument(s), got " +
                  std::to_string(args.size()));
    invokeWithArgs<void, decltype(fn), A...>(fn, args, std::index_sequence_for<A...>{});
  };
}
}  // namespace detail

class GenericObject {
  struct Key {};

 public:
  // Raise ko::Error on an empty pointer. `label` names the object in errors; by default
  // its description, or "object".
  static AnyObject makeStrong(std::shared_ptr<DynamicObject> object, std::string label = "");
  static AnyObject makeWeak(const std::shared_ptr<DynamicObject>& object, std::string label = "");

  GenericObject(Key, std::shared_ptr<DynamicObject> strong, std::weak_ptr<DynamicObject> weak,
                std::string label);
  GenericObject(const GenericObject&) = delete;
  GenericObject& operator=(const GenericObject&) = delete;

  // Whether the object is still alive (always true for a strong handle).
  bool isValid() const noexcept;
  bool isWeak() const noexcept { return !strong_; }
  const std::string& label() const noexcept { return label_; }
  // The object; nullptr when it is gone.
  std::shared_ptr<DynamicObject> dynamicObject() const;
  // A copy of the object's member table.
  MetaObject metaObject() const;
  // The overloads of that name; empty when none.
  std::vector<MetaMethod> findMethod(std::string_view name) const;

  // The id of the method that a call of `name` with these arguments runs: the overload
  // whose parameter signature is exactly that of the arguments, otherwise the single one
  // of the right arity whose parameters accept them. No method of that name raises
  // ko::Error; no single match raises ko::OverloadError listing the candidates.
  unsigned resolveMethod(std::string_view name, const std::vector<AnyValue>& args) const;

  // Calls a method in this thread and reads the result as R (ResultConversionError when
  // it does not fit). The method's failure raises ko::FutureError with its text.
  // A single std::vector<AnyValue> argument is the argument list itself; a method that
  // takes one list is called with AnyValue::list(...) or with a one-element vector.
  template <class R = AnyValue, class... A>
  requires(!detail::isSingleArgVector<A...>) R call(std::string_view name, A&&... args)
  const { return call<R>(name, detail::argumentList(std::forward<A>(args)...)); }
  template <class R = AnyValue>
  R call(std::string_view name, const std::vector<AnyValue>& args) const {
    return callById<R>(resolveMethod(name, args), args);
  }
  template <class R = AnyValue>
  R callById(unsigned methodId, const std::vector<AnyValue>& args) const {
    return detail::convertResult<R>(
        checked()->metaCall(methodId, args, MetaCallType::Direct).value());
  }

  // Runs a method on the object's event loop. Every failure (unknown method, gone object
  // included) comes back as the future's error.
  template <class R = AnyValue, class... A>
  requires(!detail::isSingleArgVector<A...>) Future<R> async(std::string_view name, A&&... args)
  const { return async<R>(name, detail::argumentList(std::forward<A>(args)...)); }
  template <class R = AnyValue>
  Future<R> async(std::string_view name, std::vector<AnyValue> args) const {
    return detail::convertFuture<R>(asyncCall(name, std::move(args)));
  }
  template <class R = AnyValue>
  Future<R> asyncById(unsigned methodId, std::vector<AnyValue> args) const {
    return detail::convertFuture<R>(asyncCallById(methodId, std::move(args)));
  }

  // Triggers a signal of the object in this thread.
  template <class... A>
  requires(!detail::isSingleArgVector<A...>) void post(std::string_view signalName,
                                                       A&&... args) const {
    post(signalName, detail::argumentList(std::forward<A>(args)...));
  }
  void post(std::string_view signalName, const std::vector<AnyValue>& args) const;

  // Subscribes to a signal; `callback` takes the AnyValue list or typed parameters (a
  // subscriber whose parameters do not fit the signal's arguments is skipped and logged).
  template <class F>
  SignalLink connect(std::string_view signalName, F&& callback) const {
    using Traits = detail::CallableTraits<std::decay_t<F>>;
    if constexpr (detail::isAnyValueListArgs<typename Traits::Args>) {
      return connectAny(signalName, SignalSubscriber(std::forward<F>(callback)));
    } else {
      return connectAny(signalName,
                        detail::makeSubscriber(std::decay_t<F>(std::forward<F>(callback)),
                                               typename Traits::Args{}));
    }
  }
  SignalLink connectAny(std::string_view signalName, SignalSubscriber subscriber) const;
  // Raises ko::Error for a link that is not a subscription to this object.
  void disconnect(SignalLink link) const;

  Future<AnyValue> property(std::string_view name) const;
  Future<void> setProperty(std::string_view name, AnyValue value) const;

 private:
  // The object, kept alive for the duration of a call.
  struct Pin {
    std::shared_ptr<DynamicObject> held;  // set for weak handles only
    DynamicObject* object;
    DynamicObject* operator->() const noexcept { return object; }
  };
  Pin checked() const;
  [[noreturn]] void throwGone() const;
  Future<AnyValue> asyncCall(std::string_view name, std::vector<AnyValue> args) const;
  Future<AnyValue> asyncCallById(unsigned methodId, std::vector<AnyValue> args) const;

  const std::shared_ptr<DynamicObject> strong_;
  const std::weak_ptr<DynamicObject> weak_;
  const std::string label_;
};

}  // namespace ko
