#pragma once
// The ko framework's dynamic value: every method argument, result, event value and
// signal argument that crosses a service boundary travels as an AnyValue.
//
// An AnyValue is a plain value type (deep copies, no sharing except for object
// handles), so it may be handed between threads freely; a single instance is not
// synchronised and must not be written from two threads at once.

#include <concepts>
#include <cstdint>
#include <limits>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <utility>
#include <variant>
#include <vector>

namespace ko {

class GenericObject;
using AnyObject = std::shared_ptr<GenericObject>;

// The kinds of ko values. `None` is "no type at all", the state of a value that was
// never given one (distinct from `Void`, the empty value of a void result).
enum class Kind : int {
  None = -1,
  Void = 0,
  Int,
  Float,
  String,
  List,
  Map,
  Tuple,
  Dynamic,
  Raw,
  Object,
  Pointer,
  VarArgs,
  Iterator,
  Unknown,
  Function,
  Signal,
  Property,
};

const char* kindName(Kind kind) noexcept;

// Thrown when a value cannot be read as the requested C++ type.
class ConversionError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

namespace detail {
// Deep-copying owner of a value of a type that may still be incomplete here.
template <class T>
class Box {
 public:
  Box() : p_(std::make_unique<T>()) {}
  explicit Box(T v) : p_(std::make_unique<T>(std::move(v))) {}
  Box(const Box& o) : p_(std::make_unique<T>(*o.p_)) {}
  Box(Box&&) noexcept = default;
  Box& operator=(const Box& o) {
    if (this != &o)
      p_ = std::make_unique<T>(*o.p_);
    return *this;
  }
  Box& operator=(Box&&) noexcept = default;
  ~Box() = default;
  T& operator*() { return *p_; }
  const T& operator*() const { return *p_; }
  T* operator->() { return p_.get(); }
  const T* operator->() const { return p_.get(); }

 private:
  std::unique_ptr<T> p_;
};
}  // namespace detail

class AnyValue {
 public:
  // An integer of `size` bytes (1, 2, 4 or 8); size 0 is a boolean.
  struct Int {
    std::int64_t value = 0;
    std::uint8_t size = 4;
    bool isSigned = true;
  };
  // A float of `size` bytes (4 or 8).
  struct Float {
    double value = 0;
    std::uint8_t size = 8;
  };
  using List = std::vector<AnyValue>;
  // A map keeps its entries in insertion order; that is its iteration order.
  using Map = std::vector<std::pair<AnyValue, AnyValue>>;
  // A structure: members with optional names (empty names: an anonymous tuple).
  struct Tuple {
    std::string name;
    std::vector<AnyValue> members;
    std::vector<std::string> memberNames;
  };
  struct Raw {
    std::vector<std::uint8_t> bytes;
  };
  struct Pointer {
    AnyObject object;                         // set when it points to an object
    std::shared_ptr<const AnyValue> pointee;  // otherwise, the value pointed to
  };

  // A void value.
  AnyValue() = default;
  // A moved-from value is void. Assigning a value that lives inside the target (one of
  // its own elements) is safe.
  AnyValue(const AnyValue&) = default;
  AnyValue(AnyValue&& other) noexcept : data_(std::move(other.data_)) {
    other.data_.emplace<std::monostate>();
  }
  AnyValue& operator=(const AnyValue& other) {
    if (this != &other)
      *this = AnyValue(other);
    return *this;
  }
  AnyValue& operator=(AnyValue&& other) noexcept {
    if (this != &other) {
      Storage taken(std::move(other.data_));
      other.data_.emplace<std::monostate>();
      data_ = std::move(taken);
    }
    return *this;
  }
  ~AnyValue() = default;
  // A value with no type at all.
  static AnyValue none();
  static AnyValue makeVoid() { return AnyValue(); }
  static AnyValue boolean(bool b);
  static AnyValue integer(std::int64_t v, std::uint8_t size = 4, bool isSigned = true);
  static AnyValue floating(double v, std::uint8_t size = 8);
  static AnyValue list(List items);
  static AnyValue map(Map entries);
  static AnyValue tuple(std::vector<AnyValue> members, std::vector<std::string> names = {},
                        std::string name = {});
  static AnyValue dynamic(AnyValue inner);
  static AnyValue raw(std::vector<std::uint8_t> bytes);
  static AnyValue object(AnyObject obj);
  static AnyValue pointerToObject(AnyObject obj);
  static AnyValue pointerTo(AnyValue pointee);
  static AnyValue varArgs(List args);
  // A value of one of the kinds that carry no content here (Iterator, Unknown,
  // Function, Signal, Property).
  static AnyValue opaque(Kind kind);

  // Implicit construction from the common C++ types, so that argument lists can be
  // written inline: obj.call<int>("add", {1, 2}).
  AnyValue(bool b) : AnyValue(boolean(b)) {}
  template <std::integral T>
  requires(!std::same_as<T, bool> && !std::same_as<T, char>) AnyValue(T v)
      : AnyValue(integer(static_cast<std::int64_t>(v), sizeof(T), std::is_signed_v<T>)) {}
  AnyValue(float f) : AnyValue(floating(f, 4)) {}
  AnyValue(double d) : AnyValue(floating(d, 8)) {}
  AnyValue(const char* s) : data_(std::string(s)) {}
  AnyValue(std::string s) : data_(std::move(s)) {}
  AnyValue(std::string_view s) : data_(std::string(s)) {}
  AnyValue(List l) : data_(std::move(l)) {}
  AnyValue(AnyObject obj) : AnyValue(object(std::move(obj))) {}

  // Conversion from any supported C++ type (containers included).
  template <class T>
  static AnyValue from(const T& v);

  Kind kind() const noexcept;
  bool isVoid() const noexcept { return kind() == Kind::Void; }
  bool isNone() const noexcept { return kind() == Kind::None; }
  // The value's ko signature ("i", "s", "[m]", "{si}", "(is)", ...).
  std::string signature() const;

  // Typed access. Each throws ConversionError when the kind does not match.
  const Int& asInt() const;
  const Float& asFloat() const;
  const std::string& asString() const;
  std::string& asString();
  const List& asList() const;
  List& asList();
  const Map& asMap() const;
  const Tuple& asTuple() const;
  const AnyValue& asDynamic() const;
  const Raw& asRaw() const;
  const AnyObject& asObject() const;
  const Pointer& asPointer() const;
  const List& asVarArgs() const;

  // Conversion to a C++ type, unwrapping dynamic values; throws ConversionError with
  // the source and target signatures.
  template <class T>
  T to() const;

  // A readable one-line form, for logs and messages.
  std::string toString() const;

  friend bool operator==(const AnyValue& a, const AnyValue& b);

 private:
  struct Opaque {
    Kind kind;
  };
  using Storage = std::variant<std::monostate, Int, Float, std::string, List, detail::Box<Map>,
                               detail::Box<Tuple>, detail::Box<AnyValue>, Raw, AnyObject,
                               detail::Box<Pointer>, detail::Box<List>, Opaque>;
  explicit AnyValue(Storage s) : data_(std::move(s)) {}
  [[noreturn]] void throwKind(Kind wanted) const;
  const AnyValue& unwrapped() const;

  Storage data_;
};

// ---- signatures of C++ types -------------------------------------------------

template <class T>
struct TypeSignature;

template <class T>
std::string signatureOf() {
  return TypeSignature<std::remove_cvref_t<T>>::get();
}

template <>
struct TypeSignature<void> {
  static std::string get() { return "v"; }
};
template <>
struct TypeSignature<bool> {
  static std::string get() { return "b"; }
};
template <std::integral T>
requires(!std::same_as<T, bool>) struct TypeSignature<T> {
  static std::string get() {
    constexpr const char* s[] = {"cC", "wW", "iI", "lL"};
    constexpr int idx = sizeof(T) == 1 ? 0 : sizeof(T) == 2 ? 1 : sizeof(T) == 4 ? 2 : 3;
    return std::string(1, s[idx][std::is_signed_v<T> ? 0 : 1]);
  }
};
template <>
struct TypeSignature<float> {
  static std::string get() { return "f"; }
};
template <>
struct TypeSignature<double> {
  static std::string get() { return "d"; }
};
template <>
struct TypeSignature<std::string> {
  static std::string get() { return "s"; }
};
template <>
struct TypeSignature<AnyValue> {
  static std::string get() { return "m"; }
};
template <>
struct TypeSignature<AnyObject> {
  static std::string get() { return "o"; }
};
template <class T>
struct TypeSignature<std::vector<T>> {
  static std::string get() { return "[" + signatureOf<T>() + "]"; }
};
template <class K, class V>
struct TypeSignature<std::map<K, V>> {
  static std::string get() { return "{" + signatureOf<K>() + signatureOf<V>() + "}"; }
};
template <class A, class B>
struct TypeSignature<std::pair<A, B>> {
  static std::string get() { return "(" + signatureOf<A>() + signatureOf<B>() + ")"; }
};
template <class... T>
struct TypeSignature<std::tuple<T...>> {
  static std::string get() { return "(" + (std::string() + ... + signatureOf<T>()) + ")"; }
};

// ---- conversion from C++ -----------------------------------------------------

template <class T>
struct ValueConverter {
  static AnyValue toAny(const T& v) { return AnyValue(v); }
};
template <class T>
struct ValueConverter<std::vector<T>> {
  static AnyValue toAny(const std::vector<T>& v) {
    AnyValue::List l;
    l.reserve(v.size());
    for (const auto& e : v)
      l.push_back(AnyValue::from(e));
    return AnyValue::list(std::move(l));
  }
};
template <class K, class V>
struct ValueConverter<std::map<K, V>> {
  static AnyValue toAny(const std::map<K, V>& m) {
    AnyValue::Map out;
    out.reserve(m.size());
    for (const auto& [k, v] : m)
      out.emplace_back(AnyValue::from(k), AnyValue::from(v));
    return AnyValue::map(std::move(out));
  }
};
template <class A, class B>
struct ValueConverter<std::pair<A, B>> {
  static AnyValue toAny(const std::pair<A, B>& p) {
    return AnyValue::tuple({AnyValue::from(p.first), AnyValue::from(p.second)});
  }
};
template <class... T>
struct ValueConverter<std::tuple<T...>> {
  static AnyValue toAny(const std::tuple<T...>& t) {
    return std::apply([](const auto&... e) { return AnyValue::tuple({AnyValue::from(e)...}); }, t);
  }
};

template <class T>
AnyValue AnyValue::from(const T& v) {
  return ValueConverter<std::remove_cvref_t<T>>::toAny(v);
}

// ---- conversion to C++ -------------------------------------------------------

[[noreturn]] void throwConversion(const AnyValue& from, const std::string& targetSignature);

template <class T>
struct ValueReader;

template <>
struct ValueReader<AnyValue> {
  static AnyValue read(const AnyValue& v) { return v; }
};
template <>
struct ValueReader<bool> {
  static bool read(const AnyValue& v) {
    if (v.kind() != Kind::Int)
      throwConversion(v, "b");
    return v.asInt().value != 0;
  }
};
template <std::integral T>
requires(!std::same_as<T, bool>) struct ValueReader<T> {
  static T read(const AnyValue& v) {
    // 2^63: the first double outside the range of std::int64_t.
    constexpr double kTwoPow63 = 9223372036854775808.0;
    constexpr bool kUnsigned64 = std::is_unsigned_v<T> && sizeof(T) == 8;
    std::int64_t n = 0;
    if (v.kind() == Kind::Int) {
      const auto& i = v.asInt();
      if (!i.isSigned && i.size == 8 && i.value < 0) {
        // An unsigned 64-bit value of 2^63 or more fits only a 64-bit unsigned type.
        if constexpr (kUnsigned64)
          return static_cast<T>(static_cast<std::uint64_t>(i.value));
        throwConversion(v, signatureOf<T>());
      }
      n = i.value;
    } else if (v.kind() == Kind::Float) {
      const double d = v.asFloat().value;
      if constexpr (kUnsigned64) {
        if (d >= kTwoPow63 && d < 2 * kTwoPow63)
          return static_cast<T>(d);
      }
      if (!(d >= -kTwoPow63 && d < kTwoPow63))
        throwConversion(v, signatureOf<T>());
      n = static_cast<std::int64_t>(d);
    } else {
      throwConversion(v, signatureOf<T>());
    }
    if constexpr (std::is_signed_v<T>) {
      if (n < static_cast<std::int64_t>(std::numeric_limits<T>::min()) ||
          n > static_cast<std::int64_t>(std::numeric_limits<T>::max()))
        throwConversion(v, signatureOf<T>());
    } else {
      if (n < 0 || static_cast<std::uint64_t>(n) > std::numeric_limits<T>::max())
        throwConversion(v, signatureOf<T>());
    }
    return static_cast<T>(n);
  }
};
template <std::floating_point T>
struct ValueReader<T> {
  static T read(const AnyValue& v) {
    if (v.kind() == Kind::Float)
      return static_cast<T>(v.asFloat().value);
    if (v.kind() == Kind::Int)
      return static_cast<T>(v.asInt().value);
    throwConversion(v, signatureOf<T>());
  }
};
template <>
struct ValueReader<std::string> {
  static std::string read(const AnyValue& v) {
    if (v.kind() == Kind::String)
      return v.asString();
    if (v.kind() == Kind::Raw) {
      const auto& b = v.asRaw().bytes;
      return std::string(b.begin(), b.end());
    }
    throwConversion(v, "s");
  }
};
template <>
struct ValueReader<AnyObject> {
  static AnyObject read(const AnyValue& v) {
    if (v.kind() == Kind::Object)
      return v.asObject();
    if (v.kind() == Kind::Pointer && v.asPointer().object)
      return v.asPointer().object;
    throwConversion(v, "o");
  }
};
template <class T>
struct ValueReader<std::vector<T>> {
  static std::vector<T> read(const AnyValue& v) {
    const AnyValue::List* items = nullptr;
    if (v.kind() == Kind::List)
      items = &v.asList();
    else if (v.kind() == Kind::VarArgs)
      items = &v.asVarArgs();
    else if (v.kind() == Kind::Tuple)
      items = &v.asTuple().members;
    else
      throwConversion(v, signatureOf<std::vector<T>>());
    std::vector<T> out;
    out.reserve(items->size());
    for (const auto& e : *items)
      out.push_back(e.template to<T>());
    return out;
  }
};
template <class K, class V>
struct ValueReader<std::map<K, V>> {
  static std::map<K, V> read(const AnyValue& v) {
    if (v.kind() != Kind::Map)
      throwConversion(v, signatureOf<std::map<K, V>>());
    std::map<K, V> out;
    for (const auto& [k, e] : v.asMap())
      out.insert_or_assign(k.template to<K>(), e.template to<V>());
    return out;
  }
};
template <class A, class B>
struct ValueReader<std::pair<A, B>> {
  static std::pair<A, B> read(const AnyValue& v) {
    const AnyValue::List* items = nullptr;
    if (v.kind() == Kind::Tuple)
      items = &v.asTuple().members;
    else if (v.kind() == Kind::List)
      items = &v.asList();
    if (!items || items->size() != 2)
      throwConversion(v, signatureOf<std::pair<A, B>>());
    return {(*items)[0].template to<A>(), (*items)[1].template to<B>()};
  }
};

template <class T>
T AnyValue::to() const {
  using U = std::remove_cvref_t<T>;
  if constexpr (std::is_void_v<U>) {
    return;
  } else if constexpr (std::is_same_v<U, AnyValue>) {
    return *this;
  } else {
    return ValueReader<U>::read(unwrapped());
  }
}

}  // namespace ko
