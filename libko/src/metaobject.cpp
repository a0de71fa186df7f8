#include "ko/metaobject.hpp"

#include "ko/error.hpp"

namespace ko {

namespace signature {

namespace {

[[noreturn]] void malformed(std::string_view sig) {
  throw Error("Malformed signature '" + std::string(sig) + "'");
}

// The end of the type that starts at `i` (one character, or a bracketed composite
// followed by an optional "<...>" annotation; '#' marks variadic arguments of a type).
std::size_t typeEnd(std::string_view sig, std::size_t i, std::string_view whole) {
  if (i >= sig.size())
    malformed(whole);
  const char c = sig[i];
  std::size_t end = 0;
  switch (c) {
    case '#':
      return typeEnd(sig, i + 1, whole);
    case '[': {
      end = typeEnd(sig, i + 1, whole);
      if (end >= sig.size() || sig[end] != ']')
        malformed(whole);
      ++end;
      break;
    }
    case '{': {
      end = typeEnd(sig, typeEnd(sig, i + 1, whole), whole);
      if (end >= sig.size() || sig[end] != '}')
        malformed(whole);
      ++end;
      break;
    }
    case '(': {
      end = i + 1;
      while (end < sig.size() && sig[end] != ')')
        end = typeEnd(sig, end, whole);
      if (end >= sig.size())
        malformed(whole);
      ++end;
      break;
    }
    case ']':
    case '}':
    case ')':
    case '<':
    case '>':
    case ',':
      malformed(whole);
    default:
      end = i + 1;
  }
  if (end < sig.size() && sig[end] == '<') {
    const auto close = sig.find('>', end);
    if (close == std::string_view::npos)
      malformed(whole);
    end = close + 1;
  }
  return end;
}

// The inside of a parameter signature: "is" from "(is)" or "is".
std::string_view inner(std::string_view sig) {
  if (!sig.empty() && sig.front() == '(') {
    if (typeEnd(sig, 0, sig) != sig.size())
      malformed(sig);
    const auto close = sig.rfind(')');
    return sig.substr(1, close - 1);
  }
  return sig;
}

}  // namespace

std::vector<std::string> split(std::string_view parametersSignature) {
  const std::string_view in = inner(parametersSignature);
  std::vector<std::string> out;
  for (std::size_t i = 0; i < in.size();) {
    const std::size_t end = typeEnd(in, i, parametersSignature);
    out.emplace_back(in.substr(i, end - i));
    i = end;
  }
  return out;
}

std::size_t arity(std::string_view parametersSignature) {
  return split(parametersSignature).size();
}

std::string normalizeParameters(std::string_view parametersSignature) {
  std::string out = "(";
  for (const auto& t : split(parametersSignature))
    out += t;
  return out + ")";
}

}  // namespace signature

const MetaObject::Slot* MetaObject::slot(unsigned id) const noexcept {
  if (id < kFirstMemberId)
    return nullptr;
  const std::size_t i = id - kFirstMemberId;
  return i < slots_.size() ? &slots_[i] : nullptr;
}

const MetaMethod* MetaObject::method(unsigned id) const noexcept {
  const Slot* s = slot(id);
  return s && s->kind == MemberKind::Method ? &methods_[s->index] : nullptr;
}

const MetaSignal* MetaObject::signal(unsigned id) const noexcept {
  const Slot* s = slot(id);
  return s && s->kind == MemberKind::Signal ? &signals_[s->index] : nullptr;
}

const MetaProperty* MetaObject::property(unsigned id) const noexcept {
  const Slot* s = slot(id);
  return s && s->kind == MemberKind::Property ? &properties_[s->index] : nullptr;
}

const std::vector<unsigned>* MetaObject::methodIds(std::string_view name) const noexcept {
  const auto it = methodsByName_.find(name);
  return it == methodsByName_.end() ? nullptr : &it->second;
}

std::vector<const MetaMethod*> MetaObject::findMethod(std::string_view name) const {
  std::vector<const MetaMethod*> out;
  if (const auto* ids = methodIds(name))
    for (unsigned id : *ids)
      out.push_back(method(id));
  return out;
}

const MetaSignal* MetaObject::findSignal(std::string_view name) const noexcept {
  for (const auto& s : signals_)
    if (s.name == name)
      return &s;
  return nullptr;
}

const MetaProperty* MetaObject::findProperty(std::string_view name) const noexcept {
  for (const auto& p : properties_)
    if (p.name == name)
      return &p;
  return nullptr;
}

void MetaObject::checkNameFree(const std::string& name, MemberKind kind) const {
  if (name.empty())
    throw Error("A member name must not be empty");
  if (kind != MemberKind::Signal && findSignal(name))
    throw Error("'" + name + "' is already a signal of this object");
  if (kind != MemberKind::Property && findProperty(name))
    throw Error("'" + name + "' is already a property of this object");
  if (kind != MemberKind::Method && methodIds(name))
    throw Error("'" + name + "' is already a method of this object");
}

unsigned MetaObject::addMethod(MetaMethod m) {
  checkNameFree(m.name, MemberKind::Method);
  m.parametersSignature = signature::normalizeParameters(m.parametersSignature);
  m.arity = signature::arity(m.parametersSignature);
  if (m.returnSignature.empty())
    m.returnSignature = "v";
  if (signature::split("(" + m.returnSignature + ")").size() != 1)
    throw Error("Malformed return signature '" + m.returnSignature + "'");
  for (const MetaMethod* other : findMethod(m.name))
    if (other->parametersSignature == m.parametersSignature)
      throw Error("Method " + m.toString() + " is already published");
  m.id = nextId();
  methodsByName_[m.name].push_back(m.id);
  slots_.push_back({MemberKind::Method, methods_.size()});
  methods_.push_back(std::move(m));
  return methods_.back().id;
}

unsigned MetaObject::addSignal(MetaSignal s) {
  checkNameFree(s.name, MemberKind::Signal);
  if (findSignal(s.name))
    throw Error("Signal '" + s.name + "' is already published");
  s.parametersSignature = signature::normalizeParameters(s.parametersSignature);
  s.id = nextId();
  slots_.push_back({MemberKind::Signal, signals_.size()});
  signals_.push_back(std::move(s));
  return signals_.back().id;
}

unsigned MetaObject::addProperty(MetaProperty p) {
  checkNameFree(p.name, MemberKind::Property);
  if (findProperty(p.name))
    throw Error("Property '" + p.name + "' is already published");
  p.id = nextId();
  slots_.push_back({MemberKind::Property, properties_.size()});
  properties_.push_back(std::move(p));
  return properties_.back().id;
}

}  // namespace ko
