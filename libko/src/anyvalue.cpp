#include "ko/anyvalue.hpp"

#include <cstdio>
#include <sstream>

namespace ko {

namespace {

template <class... F>
struct Overloaded : F... {
  using F::operator()...;
};
template <class... F>
Overloaded(F...) -> Overloaded<F...>;

std::string intSignature(const AnyValue::Int& i) {
  if (i.size == 0)
    return "b";
  const char* pair = i.size == 1 ? "cC" : i.size == 2 ? "wW" : i.size == 4 ? "iI" : "lL";
  return std::string(1, pair[i.isSigned ? 0 : 1]);
}

// The signature shared by every element, or "m" when they differ or there are none.
template <class Range, class Sig>
std::string commonSignature(const Range& range, Sig sig) {
  std::string common;
  bool first = true;
  for (const auto& e : range) {
    std::string s = sig(e);
    if (first) {
      common = std::move(s);
      first = false;
    } else if (s != common) {
      return "m";
    }
  }
  return first ? "m" : common;
}

void appendQuoted(std::string& out, const std::string& s) {
  out += '"';
  for (char c : s) {
    if (c == '"' || c == '\\')
      out += '\\';
    out += c;
  }
  out += '"';
}

}  // namespace

const char* kindName(Kind kind) noexcept {
  switch (kind) {
    case Kind::None:
      return "None";
    case Kind::Void:
      return "Void";
    case Kind::Int:
      return "Int";
    case Kind::Float:
      return "Float";
    case Kind::String:
      return "String";
    case Kind::List:
      return "List";
    case Kind::Map:
      return "Map";
    case Kind::Tuple:
      return "Tuple";
    case Kind::Dynamic:
      return "Dynamic";
    case Kind::Raw:
      return "Raw";
    case Kind::Object:
      return "Object";
    case Kind::Pointer:
      return "Pointer";
    case Kind::VarArgs:
      return "VarArgs";
    case Kind::Iterator:
      return "Iterator";
    case Kind::Unknown:
      return "Unknown";
    case Kind::Function:
      return "Function";
    case Kind::Signal:
      return "Signal";
    case Kind::Property:
      return "Property";
  }
  return "Unknown";
}

AnyValue AnyValue::none() {
  return AnyValue(Storage(Opaque{Kind::None}));
}
AnyValue AnyValue::boolean(bool b) {
  return AnyValue(Storage(Int{b ? 1 : 0, 0, false}));
}
AnyValue AnyValue::integer(std::int64_t v, std::uint8_t size, bool isSigned) {
  return AnyValue(Storage(Int{v, size, isSigned}));
}
AnyValue AnyValue::floating(double v, std::uint8_t size) {
  return AnyValue(Storage(Float{size == 4 ? static_cast<double>(static_cast<float>(v)) : v, size}));
}
AnyValue AnyValue::list(List items) {
  return AnyValue(Storage(std::move(items)));
}
AnyValue AnyValue::map(Map entries) {
  return AnyValue(Storage(detail::Box<Map>(std::move(entries))));
}
AnyValue AnyValue::tuple(std::vector<AnyValue> members, std::vector<std::string> names,
                         std::string name) {
  return AnyValue(
      Storage(detail::Box<Tuple>(Tuple{std::move(name), std::move(members), std::move(names)})));
}
AnyValue AnyValue::dynamic(AnyValue inner) {
  return AnyValue(Storage(detail::Box<AnyValue>(std::move(inner))));
}
AnyValue AnyValue::raw(std::vector<std::uint8_t> bytes) {
  return AnyValue(Storage(Raw{std::move(bytes)}));
}
AnyValue AnyValue::object(AnyObject obj) {
  return AnyValue(Storage(std::move(obj)));
}
AnyValue AnyValue::pointerToObject(AnyObject obj) {
  return AnyValue(Storage(detail::Box<Pointer>(Pointer{std::move(obj), nullptr})));
}
AnyValue AnyValue::pointerTo(AnyValue pointee) {
  return AnyValue(Storage(detail::Box<Pointer>(
      Pointer{nullptr, std::make_shared<const AnyValue>(std::move(pointee))})));
}
AnyValue AnyValue::varArgs(List args) {
  return AnyValue(Storage(detail::Box<List>(std::move(args))));
}
AnyValue AnyValue::opaque(Kind kind) {
  switch (kind) {
    case Kind::Iterator:
    case Kind::Unknown:
    case Kind::Function:
    case Kind::Signal:
    case Kind::Property:
    case Kind::None:
      return AnyValue(Storage(Opaque{kind}));
    default:
      throw ConversionError(std::string("AnyValue::opaque: ") + kindName(kind) +
                            " is a kind with content");
  }
}

Kind AnyValue::kind() const noexcept {
  return std::visit(Overloaded{
                        [](const std::monostate&) { return Kind::Void; },
                        [](const Int&) { return Kind::Int; },
                        [](const Float&) { return Kind::Float; },
                        [](const std::string&) { return Kind::String; },
                        [](const List&) { return Kind::List; },
                        [](const detail::Box<Map>&) { return Kind::Map; },
                        [](const detail::Box<Tuple>&) { return Kind::Tuple; },
                        [](const detail::Box<AnyValue>&) { return Kind::Dynamic; },
                        [](const Raw&) { return Kind::Raw; },
                        [](const AnyObject&) { return Kind::Object; },
                        [](const detail::Box<Pointer>&) { return Kind::Pointer; },
                        [](const detail::Box<List>&) { return Kind::VarArgs; },
                        [](const Opaque& o) { return o.kind; },
                    },
                    data_);
}

std::string AnyValue::signature() const {
  auto sig = [](const AnyValue& v) { return v.signature(); };
  return std::visit(
      Overloaded{
          [](const std::monostate&) -> std::string { return "v"; },
          [](const Int& i) { return intSignature(i); },
          [](const Float& f) -> std::string { return f.size == 4 ? "f" : "d"; },
          [](const std::string&) -> std::string { return "s"; },
          [&](const List& l) { return "[" + commonSignature(l, sig) + "]"; },
          [&](const detail::Box<Map>& m) {
            return "{" + commonSignature(*m, [](const auto& e) { return e.first.signature(); }) +
                   commonSignature(*m, [](const auto& e) { return e.second.signature(); }) + "}";
          },
          [](const detail::Box<Tuple>& t) {
            std::string s = "(";
            for (const auto& m : t->members)
              s += m.signature();
            s += ")";
            if (!t->name.empty())
              s += "<" + t->name + ">";
            return s;
          },
          [](const detail::Box<AnyValue>&) -> std::string { return "m"; },
          [](const Raw&) -> std::string { return "r"; },
          [](const AnyObject&) -> std::string { return "o"; },
          [](const detail::Box<Pointer>& p) {
            return (p->object    ? std::string("o")
                    : p->pointee ? p->pointee->signature()
                                 : "v") +
                   "*";
          },
          [](const detail::Box<List>&) -> std::string { return "#m"; },
          [](const Opaque& o) -> std::string {
            switch (o.kind) {
              case Kind::None:
                return "_";
              case Kind::Iterator:
                return "&";
              case Kind::Function:
                return "@";
              case Kind::Signal:
                return "~";
              case Kind::Property:
                return "^";
              default:
                return "X";
            }
          },
      },
      data_);
}

void AnyValue::throwKind(Kind wanted) const {
  throw ConversionError(std::string("ko::AnyValue: expected a ") + kindName(wanted) +
                        " but the value is a " + kindName(kind()));
}

const AnyValue::Int& AnyValue::asInt() const {
  if (auto* p = std::get_if<Int>(&data_))
    return *p;
  throwKind(Kind::Int);
}
const AnyValue::Float& AnyValue::asFloat() const {
  if (auto* p = std::get_if<Float>(&data_))
    return *p;
  throwKind(Kind::Float);
}
const std::string& AnyValue::asString() const {
  if (auto* p = std::get_if<std::string>(&data_))
    return *p;
  throwKind(Kind::String);
}
std::string& AnyValue::asString() {
  if (auto* p = std::get_if<std::string>(&data_))
    return *p;
  throwKind(Kind::String);
}
const AnyValue::List& AnyValue::asList() const {
  if (auto* p = std::get_if<List>(&data_))
    return *p;
  throwKind(Kind::List);
}
AnyValue::List& AnyValue::asList() {
  if (auto* p = std::get_if<List>(&data_))
    return *p;
  throwKind(Kind::List);
}
const AnyValue::Map& AnyValue::asMap() const {
  if (auto* p = std::get_if<detail::Box<Map>>(&data_))
    return **p;
  throwKind(Kind::Map);
}
const AnyValue::Tuple& AnyValue::asTuple() const {
  if (auto* p = std::get_if<detail::Box<Tuple>>(&data_))
    return **p;
  throwKind(Kind::Tuple);
}
const AnyValue& AnyValue::asDynamic() const {
  if (auto* p = std::get_if<detail::Box<AnyValue>>(&data_))
    return **p;
  throwKind(Kind::Dynamic);
}
const AnyValue::Raw& AnyValue::asRaw() const {
  if (auto* p = std::get_if<Raw>(&data_))
    return *p;
  throwKind(Kind::Raw);
}
const AnyObject& AnyValue::asObject() const {
  if (auto* p = std::get_if<AnyObject>(&data_))
    return *p;
  throwKind(Kind::Object);
}
const AnyValue::Pointer& AnyValue::asPointer() const {
  if (auto* p = std::get_if<detail::Box<Pointer>>(&data_))
    return **p;
  throwKind(Kind::Pointer);
}
const AnyValue::List& AnyValue::asVarArgs() const {
  if (auto* p = std::get_if<detail::Box<List>>(&data_))
    return **p;
  throwKind(Kind::VarArgs);
}

const AnyValue& AnyValue::unwrapped() const {
  const AnyValue* v = this;
  while (auto* p = std::get_if<detail::Box<AnyValue>>(&v->data_))
    v = &**p;
  return *v;
}

void throwConversion(const AnyValue& from, const std::string& targetSignature) {
  throw ConversionError("Unable to convert from " + from.signature() + " to " + targetSignature +
                        " (value: " + from.toString() + ")");
}

std::string AnyValue::toString() const {
  std::string out;
  std::visit(Overloaded{
                 [&](const std::monostate&) { out = "void"; },
                 [&](const Int& i) {
                   if (i.size == 0)
                     out = i.value ? "true" : "false";
                   else if (!i.isSigned && i.size == 8)
                     out = std::to_string(static_cast<std::uint64_t>(i.value));
                   else
                     out = std::to_string(i.value);
                 },
                 [&](const Float& f) {
                   char buf[32];
                   std::snprintf(buf, sizeof buf, "%.*g", f.size == 4 ? 7 : 15, f.value);
                   out = buf;
                 },
                 [&](const std::string& s) { appendQuoted(out, s); },
                 [&](const List& l) {
                   out = "[";
                   for (std::size_t k = 0; k < l.size(); ++k) {
                     if (k)
                       out += ", ";
                     out += l[k].toString();
                   }
                   out += "]";
                 },
                 [&](const detail::Box<Map>& m) {
                   out = "{";
                   bool first = true;
                   for (const auto& [k, v] : *m) {
                     if (!first)
                       out += ", ";
                     first = false;
                     out += k.toString() + ": " + v.toString();
                   }
                   out += "}";
                 },
                 [&](const detail::Box<Tuple>& t) {
                   out = t->name + "(";
                   for (std::size_t k = 0; k < t->members.size(); ++k) {
                     if (k)
                       out += ", ";
                     if (k < t->memberNames.size() && !t->memberNames[k].empty())
                       out += t->memberNames[k] + "=";
                     out += t->members[k].toString();
                   }
                   out += ")";
                 },
                 [&](const detail::Box<AnyValue>& d) { out = d->toString(); },
                 [&](const Raw& r) { out = "<raw " + std::to_string(r.bytes.size()) + " bytes>"; },
                 [&](const AnyObject& o) { out = o ? "<object>" : "<null object>"; },
                 [&](const detail::Box<Pointer>& p) {
                   out = p->object
                             ? "<pointer to object>"
                             : "<pointer to " + (p->pointee ? p->pointee->toString() : "") + ">";
                 },
                 [&](const detail::Box<List>& l) {
                   out = "#(";
                   for (std::size_t k = 0; k < l->size(); ++k) {
                     if (k)
                       out += ", ";
                     out += (*l)[k].toString();
                   }
                   out += ")";
                 },
                 [&](const Opaque& o) { out = std::string("<") + kindName(o.kind) + ">"; },
             },
             data_);
  return out;
}

bool operator==(const AnyValue& a, const AnyValue& b) {
  if (a.kind() != b.kind())
    return false;
  switch (a.kind()) {
    case Kind::Void:
    case Kind::None:
    case Kind::Iterator:
    case Kind::Unknown:
    case Kind::Function:
    case Kind::Signal:
    case Kind::Property:
      return true;
    case Kind::Int:
      return a.asInt().value == b.asInt().value && (a.asInt().size == 0) == (b.asInt().size == 0);
    case Kind::Float:
      return a.asFloat().value == b.asFloat().value;
    case Kind::String:
      return a.asString() == b.asString();
    case Kind::List:
      return a.asList() == b.asList();
    case Kind::Map:
      return a.asMap() == b.asMap();
    case Kind::Tuple:
      return a.asTuple().members == b.asTuple().members &&
             a.asTuple().memberNames == b.asTuple().memberNames;
    case Kind::Dynamic:
      return a.asDynamic() == b.asDynamic();
    case Kind::Raw:
      return a.asRaw().bytes == b.asRaw().bytes;
    case Kind::Object:
      return a.asObject() == b.asObject();
    case Kind::Pointer:
      return a.asPointer().object == b.asPointer().object &&
             ((!a.asPointer().pointee && !b.asPointer().pointee) ||
              (a.asPointer().pointee && b.asPointer().pointee &&
               *a.asPointer().pointee == *b.asPointer().pointee));
    case Kind::VarArgs:
      return a.asVarArgs() == b.asVarArgs();
  }
  return false;
}

}  // namespace ko
