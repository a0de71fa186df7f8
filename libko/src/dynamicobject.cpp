#include "ko/dynamicobject.hpp"

#include "ko/genericobject.hpp"

namespace ko {

// One published version of the object's members. Never modified once published.
struct DynamicObject::Table {
  MetaObject meta;
  // By member id - MetaObject::kFirstMemberId; empty for the members of the other kind.
  std::vector<std::shared_ptr<const MethodFunction>> functions;
  std::vector<std::shared_ptr<SignalBase>> signals;

  const MethodFunction* function(unsigned id) const noexcept {
    const std::size_t i = id - MetaObject::kFirstMemberId;
    return id >= MetaObject::kFirstMemberId && i < functions.size() ? functions[i].get() : nullptr;
  }
  SignalBase* signal(unsigned id) const noexcept {
    const std::size_t i = id - MetaObject::kFirstMemberId;
    return id >= MetaObject::kFirstMemberId && i < signals.size() ? signals[i].get() : nullptr;
  }
  void place(unsigned id) {
    const std::size_t size = id - MetaObject::kFirstMemberId + 1;
    functions.resize(size);
    signals.resize(size);
  }
};

namespace {

// Runs a method in this thread; every failure becomes the future's error.
Future<AnyValue> runMethod(const MetaMethod& method, const MethodFunction& function,
                           const std::vector<AnyValue>& args) {
  try {
    return Future<AnyValue>::fromValue(function(args));
  } catch (const ArgumentError& e) {
    return makeFutureError<AnyValue>("Cannot convert argument " + std::to_string(e.index() + 1) +
                                     " of " + method.toString() + ": " + e.what());
  } catch (...) {
    return makeFutureError<AnyValue>(detail::currentExceptionText());
  }
}

}  // namespace

DynamicObject::DynamicObject() {
  tables_.push_back(std::make_unique<const Table>());
  table_.store(tables_.back().get(), std::memory_order_release);
}

DynamicObject::~DynamicObject() = default;

template <class Edit>
unsigned DynamicObject::publish(Edit edit) {
  std::lock_guard lock(mutex_);
  auto next = std::make_unique<Table>(table());
  const unsigned id = edit(*next);
  table_.store(next.get(), std::memory_order_release);
  tables_.push_back(std::move(next));
  return id;
}

const MetaObject& DynamicObject::metaObject() const {
  return table().meta;
}

Future<AnyValue> DynamicObject::metaCall(unsigned methodId, const std::vector<AnyValue>& args,
                                         MetaCallType callType) {
  const Table& t = table();
  const MetaMethod* method = t.meta.method(methodId);
  if (!method)
    return makeFutureError<AnyValue>("No method with id " + std::to_string(methodId));
  if (args.size() != method->arity)
    return makeFutureError<AnyValue>("Method " + method->toString() + " takes " +
                                     std::to_string(method->arity) + " argument(s), got " +
                                     std::to_string(args.size()));
  const MethodFunction& function = *t.function(methodId);
  if (callType != MetaCallType::Queued)
    return runMethod(*method, function, args);
  return eventLoop()->async(
      [method, &function, args] { return runMethod(*method, function, args).value(); });
}

void DynamicObject::metaPost(unsigned signalId, const std::vector<AnyValue>& args) {
  SignalBase* s = table().signal(signalId);
  if (!s)
    throw Error("No signal with id " + std::to_string(signalId));
  s->triggerAny(args);
}

Future<SignalLink> DynamicObject::metaConnect(unsigned signalId, SignalSubscriber subscriber) {
  SignalBase* s = table().signal(signalId);
  if (!s)
    return makeFutureError<SignalLink>("No signal with id " + std::to_string(signalId));
  try {
    const SignalLink link = s->connectAny(std::move(subscriber));
    std::lock_guard lock(mutex_);
    links_.emplace(link, signalId);
    return Future<SignalLink>::fromValue(link);
  } catch (...) {
    return makeFutureError<SignalLink>(detail::currentExceptionText());
  }
}

Future<void> DynamicObject::metaDisconnect(SignalLink link) {
  unsigned signalId = 0;
  {
    std::lock_guard lock(mutex_);
    const auto it = links_.find(link);
    if (it == links_.end())
      return makeFutureError<void>("No subscription with link " + std::to_string(link));
    signalId = it->second;
    links_.erase(it);
  }
  // Outside the lock: this waits for running calls of the subscriber.
  if (SignalBase* s = table().signal(signalId))
    s->disconnect(link);
  return makeFutureValue();
}

Future<AnyValue> DynamicObject::metaProperty(unsigned propertyId) {
  std::lock_guard lock(mutex_);
  const auto it = properties_.find(propertyId);
  if (it == properties_.end())
    return makeFutureError<AnyValue>("No property with id " + std::to_string(propertyId));
  return Future<AnyValue>::fromValue(it->second);
}

Future<void> DynamicObject::metaSetProperty(unsigned propertyId, AnyValue value) {
  std::lock_guard lock(mutex_);
  const auto it = properties_.find(propertyId);
  if (it == properties_.end())
    return makeFutureError<void>("No property with id " + std::to_string(propertyId));
  it->second = std::move(value);
  return makeFutureValue();
}

unsigned DynamicObject::advertiseMethod(std::string name, MethodBinding binding,
                                        std::string description,
                                        std::vector<MetaParameter> parameters,
                                        MetaParameter returnValue) {
  return advertiseMethod(std::move(name), std::move(binding.parametersSignature),
                         std::move(binding.returnSignature), std::move(binding.function),
                         std::move(description), std::move(parameters), std::move(returnValue));
}

unsigned DynamicObject::advertiseMethod(std::string name, std::string parametersSignature,
                                        std::string returnSignature, MethodFunction function,
                                        std::string description,
                                        std::vector<MetaParameter> parameters,
                                        MetaParameter returnValue) {
  if (!function)
    throw Error("Method '" + name + "' has no function");
  MetaMethod m;
  m.name = std::move(name);
  m.parametersSignature = std::move(parametersSignature);
  m.returnSignature = std::move(returnSignature);
  m.description = std::move(description);
  m.parameters = std::move(parameters);
  m.returnValue = std::move(returnValue);
  auto fn = std::make_shared<const MethodFunction>(std::move(function));
  return publish([&](Table& t) {
    const unsigned id = t.meta.addMethod(std::move(m));
    t.place(id);
    t.functions[id - MetaObject::kFirstMemberId] = std::move(fn);
    return id;
  });
}

unsigned DynamicObject::advertiseSignal(std::string name, std::shared_ptr<SignalBase> signal) {
  if (!signal)
    throw Error("Signal '" + name + "' is empty");
  return publish([&](Table& t) {
    const unsigned id = t.meta.addSignal({0, std::move(name), signal->signature()});
    t.place(id);
    t.signals[id - MetaObject::kFirstMemberId] = std::move(signal);
    return id;
  });
}

unsigned DynamicObject::advertiseProperty(std::string name, AnyValue initialValue) {
  const std::string sig = initialValue.signature();
  const unsigned id = publish([&](Table& t) {
    const unsigned newId = t.meta.addProperty({0, std::move(name), sig});
    t.place(newId);
    return newId;
  });
  std::lock_guard lock(mutex_);
  properties_.emplace(id, std::move(initialValue));
  return id;
}

void DynamicObject::setDescription(std::string description) {
  publish([&](Table& t) {
    t.meta.setDescription(std::move(description));
    return 0u;
  });
}

SignalBase* DynamicObject::signal(unsigned signalId) const {
  return table().signal(signalId);
}

SignalBase* DynamicObject::signal(std::string_view name) const {
  const Table& t = table();
  const MetaSignal* s = t.meta.findSignal(name);
  return s ? t.signal(s->id) : nullptr;
}

void DynamicObject::setEventLoop(std::shared_ptr<EventLoop> loop) {
  std::lock_guard lock(mutex_);
  loop_ = std::move(loop);
}

std::shared_ptr<EventLoop> DynamicObject::ownEventLoop() const {
  std::lock_guard lock(mutex_);
  return loop_;
}

std::shared_ptr<EventLoop> DynamicObject::eventLoop() const {
  {
    std::lock_guard lock(mutex_);
    if (loop_)
      return loop_;
  }
  return getEventLoop();
}

DynamicObjectBuilder::DynamicObjectBuilder() : object_(std::make_shared<DynamicObject>()) {}

DynamicObjectBuilder::DynamicObjectBuilder(std::shared_ptr<DynamicObject> object)
    : object_(std::move(object)) {
  if (!object_)
    throw Error("DynamicObjectBuilder needs an object");
}

AnyObject DynamicObjectBuilder::object() {
  if (!handle_)
    handle_ = GenericObject::makeStrong(object_);
  return handle_;
}

}  // namespace ko
