#pragma once
// Objects whose methods, signals and properties are published at run time, and the
// builder that publishes them.
//
// A DynamicObject is meant to be subclassed (the module layer derives from it) or filled
// through a DynamicObjectBuilder, then shared as an AnyObject (see genericobject.hpp).
// Members may be added at any time, from any thread: each addition publishes a new,
// immutable member table, and the tables already handed out stay valid for the object's
// life, so calls never take a lock. Methods may be called from many threads at once; a
// method is responsible for its own synchronisation.

#include <atomic>
#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <unordered_map>
#include <utility>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/error.hpp"
#include "ko/eventloop.hpp"
#include "ko/future.hpp"
#include "ko/metaobject.hpp"
#include "ko/signal.hpp"

namespace ko {

// A method as the object runs it: the arguments in, the result out (a void value for a
// void method). The number of arguments is checked before the call.
using MethodFunction = std::function<AnyValue(const std::vector<AnyValue>&)>;

// A C++ callable turned into a MethodFunction with its ko signatures.
struct MethodBinding {
  std::string parametersSignature;  // "(is)"
  std::string returnSignature;      // "s", "v"
  MethodFunction function;
};

// Raised by a binding when an argument cannot be read as its parameter's C++ type.
class ArgumentError : public Error {
 public:
  ArgumentError(std::size_t index, const std::string& reason) : Error(reason), index_(index) {}
  // 0-based.
  std::size_t index() const noexcept { return index_; }

 private:
  std::size_t index_;
};

namespace detail {

template <class... A>
struct TypeList {};

template <class F>
struct CallableTraits : CallableTraits<decltype(&F::operator())> {};
template <class R, class... A>
struct CallableTraits<R (*)(A...)> {
  using Result = R;
  using Args = TypeList<A...>;
};
template <class R, class... A>
struct CallableTraits<R (*)(A...) noexcept> : CallableTraits<R (*)(A...)> {};
template <class R, class... A>
struct CallableTraits<std::function<R(A...)>> : CallableTraits<R (*)(A...)> {};
template <class C, class R, class... A>
struct CallableTraits<R (C::*)(A...)> : CallableTraits<R (*)(A...)> {
  using Class = C;
};
template <class C, class R, class... A>
struct CallableTraits<R (C::*)(A...) const> : CallableTraits<R (C::*)(A...)> {};
template <class C, class R, class... A>
struct CallableTraits<R (C::*)(A...) noexcept> : CallableTraits<R (C::*)(A...)> {};
template <class C, class R, class... A>
struct CallableTraits<R (C::*)(A...) const noexcept> : CallableTraits<R (C::*)(A...)> {};

template <class... A>
std::string parametersSignatureOf() {
  return "(" + (std::string() + ... + signatureOf<A>()) + ")";
}

template <class A>
std::remove_cvref_t<A> readArgument(const std::vector<AnyValue>& args, std::size_t i) {
  try {
    return args[i].template to<std::remove_cvref_t<A>>();
  } catch (const ConversionError& e) {
    throw ArgumentError(i, e.what());
  }
}

template <class R, class F, class... A, std::size_t... I>
AnyValue invokeWithArgs(F& f, const std::vector<AnyValue>& args, std::index_sequence<I...>) {
  // Braced initialisation converts the arguments in order.
  std::tuple<std::remove_cvref_t<A>...> values{readArgument<A>(args, I)...};
  if constexpr (std::is_void_v<R>) {
    std::invoke(f, std::forward<A>(std::get<I>(values))...);
    return AnyValue();
  } else if constexpr (std::is_same_v<std::remove_cvref_t<R>, AnyValue> ||
                       std::is_same_v<R, std::string>) {
    return std::invoke(f, std::forward<A>(std::get<I>(values))...);  // moved in
  } else {
    return AnyValue::from(std::invoke(f, std::forward<A>(std::get<I>(values))...));
  }
}

template <class R, class F, class... A>
MethodBinding makeBinding(F f, TypeList<A...>) {
  MethodBinding b;
  b.parametersSignature = parametersSignatureOf<A...>();
  b.returnSignature = signatureOf<R>();
  b.function = [fn = std::move(f)](const std::vector<AnyValue>& args) mutable -> AnyValue {
    if (args.size() != sizeof...(A))
      throw Error("Expected " + std::to_string(sizeof...(A)) + " argument(s), got " +
                  std::to_string(args.size()));
    return invokeWithArgs<R, decltype(fn), A...>(fn, args, std::index_sequence_for<A...>{});
  };
  return b;
}

}  // namespace detail

// Binds a lambda, std::function or function pointer (not a generic lambda).
template <class F>
MethodBinding bindMethod(F f) {
  using Traits = detail::CallableTraits<std::decay_t<F>>;
  return detail::makeBinding<typename Traits::Result>(std::move(f), typename Traits::Args{});
}

// Binds a member function of `object`; the object must outlive the binding.
template <class O, class M>
requires std::is_member_function_pointer_v<M> MethodBinding bindMethod(O* object, M method) {
  using Traits = detail::CallableTraits<M>;
  auto call = [object, method](auto&&... a) -> decltype(auto) {
    return (object->*method)(std::forward<decltype(a)>(a)...);
  };
  return detail::makeBinding<typename Traits::Result>(std::move(call), typename Traits::Args{});
}

class DynamicObject {
 public:
  DynamicObject();
  virtual ~DynamicObject();
  DynamicObject(const DynamicObject&) = delete;
  DynamicObject& operator=(const DynamicObject&) = delete;

  // ---- the object's interface, for callers and for subclasses to override ----

  // Whether the object stands for a service of another process: its calls answer futures
  // that finish when the answer comes, and never need a thread of an event loop.
  virtual bool isRemote() const { return false; }

  // 1: the member table published last; the reference stays valid for the object's life.
  virtual const MetaObject& metaObject() const;
  // 2: calls a method by id. Direct (and Auto) run it in the calling thread and answer a
  // future that already holds the result; Queued runs it on the object's event loop (the
  // caller keeps the object alive until the future finishes). An unknown id, a wrong
  // number of arguments or an argument that cannot be converted gives a future error;
  // so does an exception from the method (its what() text).
  virtual Future<AnyValue> metaCall(unsigned methodId, const std::vector<AnyValue>& args,
                                    MetaCallType callType = MetaCallType::Auto);
  // 3: triggers a signal in the calling thread; raises ko::Error for an unknown id or
  // arguments that do not fit.
  virtual void metaPost(unsigned signalId, const std::vector<AnyValue>& args);
  // 4: subscribes to a signal.
  virtual Future<SignalLink> metaConnect(unsigned signalId, SignalSubscriber subscriber);
  // 5: drops a subscription made through metaConnect; an unknown link is an error.
  virtual Future<void> metaDisconnect(SignalLink link);
  // 6, 7: properties, kept as AnyValue.
  virtual Future<AnyValue> metaProperty(unsigned propertyId);
  virtual Future<void> metaSetProperty(unsigned propertyId, AnyValue value);

  // ---- publishing ----

  // Each answers the new member's id; a duplicate (same method name and parameter
  // signature, or same signal or property name) raises ko::Error.
  template <class F>
  requires(!std::is_same_v<std::remove_cvref_t<F>, MethodBinding>) unsigned advertiseMethod(
      std::string name, F&& callable, std::string description = "") {
    return advertiseMethod(std::move(name), bindMethod(std::forward<F>(callable)),
                           std::move(description));
  }
  template <class O, class M>
  requires std::is_member_function_pointer_v<M>
  unsigned advertiseMethod(std::string name, O* object, M method, std::string description = "") {
    return advertiseMethod(std::move(name), bindMethod(object, method), std::move(description));
  }
  unsigned advertiseMethod(std::string name, MethodBinding binding, std::string description = "",
                           std::vector<MetaParameter> parameters = {},
                           MetaParameter returnValue = {});
  // The raw form, for methods bound at run time.
  unsigned advertiseMethod(std::string name, std::string parametersSignature,
                           std::string returnSignature, MethodFunction function,
                           std::string description = "", std::vector<MetaParameter> parameters = {},
                           MetaParameter returnValue = {});

  template <class... T>
  unsigned advertiseSignal(std::string name) {
    return advertiseSignal(std::move(name), std::make_shared<Signal<T...>>());
  }
  unsigned advertiseSignal(std::string name, std::shared_ptr<SignalBase> signal);
  unsigned advertiseProperty(std::string name, AnyValue initialValue);

  void setDescription(std::string description);

  // The signal published under that id or name; nullptr when none.
  SignalBase* signal(unsigned signalId) const;
  SignalBase* signal(std::string_view name) const;
  // The typed signal published under that name; nullptr when none or of other types.
  template <class... T>
  Signal<T...>* signal(std::string_view name) const {
    return dynamic_cast<Signal<T...>*>(signal(name));
  }

  // The loop of queued calls: the process-wide one unless set.
  void setEventLoop(std::shared_ptr<EventLoop> loop);
  std::shared_ptr<EventLoop> eventLoop() const;
  // The loop set with setEventLoop; nullptr when the object uses the process-wide one.
  std::shared_ptr<EventLoop> ownEventLoop() const;

  struct Table;

 private:
  const Table& table() const noexcept { return *table_.load(std::memory_order_acquire); }
  template <class Edit>
  unsigned publish(Edit edit);

  std::atomic<const Table*> table_;
  mutable std::mutex mutex_;  // writers of the table, links, properties, loop
  std::vector<std::unique_ptr<const Table>> tables_;  // every table published, kept
  std::unordered_map<SignalLink, unsigned> links_;    // link -> signal id
  std::unordered_map<unsigned, AnyValue> properties_;
  std::shared_ptr<EventLoop> loop_;
};

// Builds a plain DynamicObject and hands it out as an AnyObject.
class DynamicObjectBuilder {
 public:
  DynamicObjectBuilder();
  // Publishes into an existing object (for example a subclass of DynamicObject).
  explicit DynamicObjectBuilder(std::shared_ptr<DynamicObject> object);

  template <class F>
  unsigned advertiseMethod(std::string name, F&& callable, std::string description = "") {
    return object_->advertiseMethod(std::move(name), std::forward<F>(callable),
                                    std::move(description));
  }
  template <class O, class M>
  requires std::is_member_function_pointer_v<M>
  unsigned advertiseMethod(std::string name, O* object, M method, std::string description = "") {
    return object_->advertiseMethod(std::move(name), object, method, std::move(description));
  }
  unsigned advertiseMethod(std::string name, std::string parametersSignature,
                           std::string returnSignature, MethodFunction function,
                           std::string description = "", std::vector<MetaParameter> parameters = {},
                           MetaParameter returnValue = {}) {
    return object_->advertiseMethod(
        std::move(name), std::move(parametersSignature), std::move(returnSignature),
        std::move(function), std::move(description), std::move(parameters), std::move(returnValue));
  }
  template <class... T>
  unsigned advertiseSignal(std::string name) {
    return object_->advertiseSignal<T...>(std::move(name));
  }
  unsigned advertiseProperty(std::string name, AnyValue initialValue) {
    return object_->advertiseProperty(std::move(name), std::move(initialValue));
  }
  void setDescription(std::string description) { object_->setDescription(std::move(description)); }

  const std::shared_ptr<DynamicObject>& dynamicObject() const noexcept { return object_; }
  // A strong handle on the object; every call answers a handle on the same object.
  AnyObject object();

 private:
  std::shared_ptr<DynamicObject> object_;
  AnyObject handle_;
};

}  // namespace ko
