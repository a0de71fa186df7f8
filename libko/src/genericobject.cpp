#include "ko/genericobject.hpp"

namespace ko {

namespace {

// The type of a parameter without its variadic mark and annotation.
std::string_view bareType(std::string_view type) {
  while (!type.empty() && type.front() == '#')
    type.remove_prefix(1);
  if (!type.empty() && type.back() == '>') {
    const auto open = type.rfind('<');
    if (open != std::string_view::npos)
      type = type.substr(0, open);
  }
  return type;
}

// Whether `value` can be read as a value of the ko type `type` (one type, "[s]", "{si}").
bool accepts(std::string_view type, const AnyValue& value) {
  type = bareType(type);
  if (type.empty())
    return false;
  if (type == "m")
    return true;
  if (value.kind() == Kind::Dynamic)
    return accepts(type, value.asDynamic());
  const Kind k = value.kind();
  switch (type.front()) {
    case 'b':
    case 'c':
    case 'C':
    case 'w':
    case 'W':
    case 'i':
    case 'I':
    case 'l':
    case 'L':
      return k == Kind::Int;
    case 'f':
    case 'd':
      return k == Kind::Int || k == Kind::Float;
    case 's':
    case 'r':
      return k == Kind::String || k == Kind::Raw;
    case 'o':
      return k == Kind::Object || (k == Kind::Pointer && value.asPointer().object);
    case 'v':
      return k == Kind::Void;
    case '[': {
      const std::string_view element = type.substr(1, type.size() - 2);
      const AnyValue::List* items = k == Kind::List      ? &value.asList()
                                    : k == Kind::VarArgs ? &value.asVarArgs()
                                    : k == Kind::Tuple   ? &value.asTuple().members
                                                         : nullptr;
      if (!items)
        return false;
      for (const auto& e : *items)
        if (!accepts(element, e))
          return false;
      return true;
    }
    case '{': {
      if (k != Kind::Map)
        return false;
      const auto kv = signature::split(type.substr(1, type.size() - 2));
      if (kv.size() != 2)
        return false;
      for (const auto& [key, v] : value.asMap())
        if (!accepts(kv[0], key) || !accepts(kv[1], v))
          return false;
      return true;
    }
    case '(': {
      const auto members = signature::split(type);
      const AnyValue::List* items = k == Kind::Tuple  ? &value.asTuple().members
                                    : k == Kind::List ? &value.asList()
                                                      : nullptr;
      if (!items || items->size() != members.size())
        return false;
      for (std::size_t i = 0; i < members.size(); ++i)
        if (!accepts(members[i], (*items)[i]))
          return false;
      return true;
    }
    default:
      return false;
  }
}

bool acceptsAll(const MetaMethod& m, const std::vector<AnyValue>& args) {
  const auto types = signature::split(m.parametersSignature);
  if (types.size() != args.size())
    return false;
  for (std::size_t i = 0; i < args.size(); ++i)
    if (!accepts(types[i], args[i]))
      return false;
  return true;
}

std::string argumentsSignature(const std::vector<AnyValue>& args) {
  std::string s = "(";
  for (const auto& a : args)
    s += a.signature();
  return s + ")";
}

}  // namespace

GenericObject::GenericObject(Key, std::shared_ptr<DynamicObject> strong,
                             std::weak_ptr<DynamicObject> weak, std::string label)
    : strong_(std::move(strong)), weak_(std::move(weak)), label_(std::move(label)) {}

namespace {
std::string defaultLabel(const std::shared_ptr<DynamicObject>& object, std::string label) {
  if (!label.empty())
    return label;
  const std::string& description = object->metaObject().description();
  return description.empty() ? "object" : description;
}
}  // namespace

AnyObject GenericObject::makeStrong(std::shared_ptr<DynamicObject> object, std::string label) {
  if (!object)
    throw Error("Cannot make an object handle from an empty pointer");
  label = defaultLabel(object, std::move(label));
  std::weak_ptr<DynamicObject> weak = object;
  return std::make_shared<GenericObject>(Key{}, std::move(object), std::move(weak),
                                         std::move(label));
}

AnyObject GenericObject::makeWeak(const std::shared_ptr<DynamicObject>& object, std::string label) {
  if (!object)
    throw Error("Cannot make an object handle from an empty pointer");
  return std::make_shared<GenericObject>(Key{}, nullptr, object,
                                         defaultLabel(object, std::move(label)));
}

bool GenericObject::isValid() const noexcept {
  return strong_ || !weak_.expired();
}

std::shared_ptr<DynamicObject> GenericObject::dynamicObject() const {
  return strong_ ? strong_ : weak_.lock();
}

void GenericObject::throwGone() const {
  throw Error("Object is gone: " + label_);
}

GenericObject::Pin GenericObject::checked() const {
  if (strong_)
    return {nullptr, strong_.get()};
  auto held = weak_.lock();
  if (!held)
    throwGone();
  DynamicObject* raw = held.get();
  return {std::move(held), raw};
}

MetaObject GenericObject::metaObject() const {
  return checked()->metaObject();
}

std::vector<MetaMethod> GenericObject::findMethod(std::string_view name) const {
  const Pin obj = checked();
  std::vector<MetaMethod> out;
  for (const MetaMethod* m : obj->metaObject().findMethod(name))
    out.push_back(*m);
  return out;
}

unsigned GenericObject::resolveMethod(std::string_view name,
                                      const std::vector<AnyValue>& args) const {
  const Pin obj = checked();
  const MetaObject& meta = obj->metaObject();
  const std::vector<unsigned>* ids = meta.methodIds(name);
  if (!ids)
    throw Error("Cannot find method '" + std::string(name) + "' on " + label_);
  if (ids->size() == 1) {
    // A single method of that name: it takes the arguments unless their number differs
    // (their conversion is checked by the call itself).
    const MetaMethod* m = meta.method(ids->front());
    if (m->arity == args.size())
      return m->id;
  } else {
    const std::string sig = argumentsSignature(args);
    for (unsigned id : *ids)
      if (meta.method(id)->parametersSignature == sig)
        return id;
    const MetaMethod* match = nullptr;
    int matches = 0;
    for (unsigned id : *ids) {
      const MetaMethod* m = meta.method(id);
      if (acceptsAll(*m, args)) {
        match = m;
        ++matches;
      }
    }
    if (matches == 1)
      return match->id;
  }
  std::vector<std::string> candidates;
  std::string list;
  for (unsigned id : *ids) {
    candidates.push_back(meta.method(id)->toString());
    list += (list.empty() ? "" : ", ") + candidates.back();
  }
  const std::string sig = argumentsSignature(args);
  throw OverloadError("No single method '" + std::string(name) + "' of " + label_ +
                          " matches the arguments " + sig + "; candidate(s): " + list,
                      std::string(name), sig, std::move(candidates));
}

Future<AnyValue> GenericObject::asyncCall(std::string_view name, std::vector<AnyValue> args) const {
  unsigned id = 0;
  try {
    id = resolveMethod(name, args);
  } catch (...) {
    return makeFutureError<AnyValue>(detail::currentExceptionText());
  }
  return asyncCallById(id, std::move(args));
}

Future<AnyValue> GenericObject::asyncCallById(unsigned methodId, std::vector<AnyValue> args) const {
  std::shared_ptr<DynamicObject> obj = dynamicObject();
  if (!obj)
    return makeFutureError<AnyValue>("Object is gone: " + label_);
  if (obj->isRemote())
    return obj->metaCall(methodId, args, MetaCallType::Direct);
  auto loop = obj->eventLoop();
  return loop->async([obj = std::move(obj), methodId, args = std::move(args)] {
    return obj->metaCall(methodId, args, MetaCallType::Direct).value();
  });
}

void GenericObject::post(std::string_view signalName, const std::vector<AnyValue>& args) const {
  const Pin obj = checked();
  const MetaSignal* s = obj->metaObject().findSignal(signalName);
  if (!s)
    throw Error("Cannot find signal '" + std::string(signalName) + "' on " + label_);
  obj->metaPost(s->id, args);
}

SignalLink GenericObject::connectAny(std::string_view signalName,
                                     SignalSubscriber subscriber) const {
  const Pin obj = checked();
  const MetaSignal* s = obj->metaObject().findSignal(signalName);
  if (!s)
    throw Error("Cannot find signal '" + std::string(signalName) + "' on " + label_);
  return obj->metaConnect(s->id, std::move(subscriber)).value();
}

void GenericObject::disconnect(SignalLink link) const {
  checked()->metaDisconnect(link).value();
}

Future<AnyValue> GenericObject::property(std::string_view name) const {
  try {
    const Pin obj = checked();
    const MetaProperty* p = obj->metaObject().findProperty(name);
    if (!p)
      throw Error("Cannot find property '" + std::string(name) + "' on " + label_);
    return obj->metaProperty(p->id);
  } catch (...) {
    return makeFutureError<AnyValue>(detail::currentExceptionText());
  }
}

Future<void> GenericObject::setProperty(std::string_view name, AnyValue value) const {
  try {
    const Pin obj = checked();
    const MetaProperty* p = obj->metaObject().findProperty(name);
    if (!p)
      throw Error("Cannot find property '" + std::string(name) + "' on " + label_);
    return obj->metaSetProperty(p->id, std::move(value));
  } catch (...) {
    return makeFutureError<void>(detail::currentExceptionText());
  }
}

}  // namespace ko
