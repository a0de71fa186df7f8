#pragma once
// The description of an object's members: its methods (with overloads), signals and
// properties, each with a numeric id unique within the object.
//
// A MetaObject is a plain value. The copy that an object publishes is never modified
// afterwards, so it may be read from any thread without a lock.

#include <cstddef>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace ko {

// How metaCall runs a method: Direct in the caller's thread, Queued on the object's event
// loop; Auto is Direct for objects that have no thread affinity (all of ours).
enum class MetaCallType { Auto, Direct, Queued };

struct MetaParameter {
  std::string name;
  std::string description;
};

struct MetaMethod {
  unsigned id = 0;
  std::string name;
  std::string parametersSignature;  // "(is)"
  std::string returnSignature;      // "s"; "v" for a void method
  std::string description;
  // Names and descriptions of the parameters, in order (may be fewer than the arity).
  std::vector<MetaParameter> parameters;
  MetaParameter returnValue;
  std::size_t arity = 0;

  // "name::(is)"
  std::string toString() const { return name + "::" + parametersSignature; }
};

struct MetaSignal {
  unsigned id = 0;
  std::string name;
  std::string parametersSignature;
  std::string toString() const { return name + "::" + parametersSignature; }
};

struct MetaProperty {
  unsigned id = 0;
  std::string name;
  std::string signature;
};

namespace detail {
struct StringHash {
  using is_transparent = void;
  std::size_t operator()(std::string_view s) const noexcept {
    return std::hash<std::string_view>{}(s);
  }
};
}  // namespace detail

class MetaObject {
 public:
  // Ids are handed out from here on, methods, signals and properties sharing one range.
  static constexpr unsigned kFirstMemberId = 100;

  const std::string& description() const noexcept { return description_; }
  void setDescription(std::string description) { description_ = std::move(description); }

  // In id order.
  const std::vector<MetaMethod>& methods() const noexcept { return methods_; }
  const std::vector<MetaSignal>& signals() const noexcept { return signals_; }
  const std::vector<MetaProperty>& properties() const noexcept { return properties_; }

  // nullptr when no member of that kind has the id.
  const MetaMethod* method(unsigned id) const noexcept;
  const MetaSignal* signal(unsigned id) const noexcept;
  const MetaProperty* property(unsigned id) const noexcept;

  // The ids of the methods of that name (the overloads, in id order); nullptr when none.
  const std::vector<unsigned>* methodIds(std::string_view name) const noexcept;
  // The methods of that name; empty when none.
  std::vector<const MetaMethod*> findMethod(std::string_view name) const;
  const MetaSignal* findSignal(std::string_view name) const noexcept;
  const MetaProperty* findProperty(std::string_view name) const noexcept;

  // Each answers the new member's id (`id` fields are ignored). A method of the same name
  // and parameter signature as an existing one, or a signal or property whose name is
  // taken, raises ko::Error; so does a malformed signature.
  unsigned addMethod(MetaMethod method);
  unsigned addSignal(MetaSignal signal);
  unsigned addProperty(MetaProperty property);

 private:
  enum class MemberKind : unsigned char { Method, Signal, Property };
  struct Slot {
    MemberKind kind;
    std::size_t index;
  };
  const Slot* slot(unsigned id) const noexcept;
  unsigned nextId() const noexcept { return kFirstMemberId + static_cast<unsigned>(slots_.size()); }
  void checkNameFree(const std::string& name, MemberKind kind) const;

  std::string description_;
  std::vector<MetaMethod> methods_;
  std::vector<MetaSignal> signals_;
  std::vector<MetaProperty> properties_;
  std::vector<Slot> slots_;  // by id - kFirstMemberId
  std::unordered_map<std::string, std::vector<unsigned>, detail::StringHash, std::equal_to<>>
      methodsByName_;
};

namespace signature {
// The number of types in a parameter signature ("(is[m])" or "is[m]" → 3); raises
// ko::Error when the signature is malformed.
std::size_t arity(std::string_view parametersSignature);
// "(is)" from "(is)" or "is"; raises ko::Error when malformed.
std::string normalizeParameters(std::string_view parametersSignature);
// The top-level types of a parameter signature: "(i[s])" → {"i", "[s]"}.
std::vector<std::string> split(std::string_view parametersSignature);
}  // namespace signature

}  // namespace ko
