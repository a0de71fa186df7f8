#pragma once
// The wire format of the ko framework between processes: ko::AnyValue in MessagePack, and
// the header of every message of the protocol (docs/protocol.md describes both).
//
// Values use MessagePack's own types wherever one says exactly what the value is (nil,
// booleans, 32-bit signed integers, 32- and 64-bit floats, strings, binaries, arrays, maps
// with keys of any kind in their order) and extension types for the rest (integers of
// other sizes, tuples, dynamic values, variadic lists, the none value, the kinds without
// content), so that a value decodes to exactly the value encoded: same kind, same
// signature. Objects and pointers cannot travel.
//
// Pure functions: any thread, no state.

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/error.hpp"
#include "ko/metaobject.hpp"

namespace ko::wire {

// A value or a message that does not decode; what() says why.
class DecodeError : public Error {
 public:
  using Error::Error;
};

// Containers nested deeper than this (extension payloads included) do not decode.
inline constexpr int kMaxDepth = 64;

// The MessagePack extension types of the format.
enum ExtensionType : std::int8_t {
  kExtInteger = 1,  // a ko signature letter (cCwWiIlL), then the value big-endian
  kExtNone = 2,     // empty: the value with no type at all
  kExtTuple = 3,    // MessagePack [name, [member names], [members]]
  kExtDynamic = 4,  // the MessagePack of the value inside
  kExtVarArgs = 5,  // the MessagePack array of the arguments
  kExtOpaque = 6,   // one byte: the ko::Kind of a kind without content
};

// Appends the MessagePack of `value`; raises ko::Error for an object or a pointer.
void appendValue(std::string& out, const AnyValue& value);
std::string encodeValue(const AnyValue& value);
// What encodeValue(AnyValue::list(items)) answers, without the copy of the items.
std::string encodeList(const AnyValue::List& items);
// Exactly one value taking every byte; raises DecodeError otherwise.
AnyValue decodeValue(std::string_view bytes);

// ---- messages -----------------------------------------------------------------------------

inline constexpr int kProtocolVersion = 1;

enum class MessageKind {
  Hello,
  Welcome,
  Bye,
  Ping,
  Reset,
  Register,
  Unregister,
  Lookup,
  List,
  Call,
  Reply,
  Error,
  Post,
  Subscribe,
  Unsubscribe,
  Signal,
  Property,
  SetProperty,
  Service,
  PeerGone,
};

// "hello", "call", "peer-gone", ...
const char* messageKindName(MessageKind kind) noexcept;

// The first frame of a message: [kind, id, to, from, fields...].
struct Header {
  MessageKind kind = MessageKind::Ping;
  std::uint64_t id = 0;    // the request that a reply or an error answers, or 0
  std::uint32_t to = 0;    // the peer it goes to; 0: the listening process
  std::uint32_t from = 0;  // the peer it comes from
  std::vector<AnyValue> fields;

  // Typed reads of the fields that decodeHeader checked.
  const std::string& text(std::size_t i) const { return fields.at(i).asString(); }
  std::int64_t number(std::size_t i) const { return fields.at(i).asInt().value; }
  bool isNumber(std::size_t i) const { return fields.at(i).kind() == Kind::Int; }
};

std::string encodeHeader(const Header& header);
// Raises DecodeError when the bytes are no header, the kind is unknown or its fields are
// not those of the kind.
Header decodeHeader(std::string_view bytes);
// Whether a message of that kind carries a second frame (arguments, a result, a value).
bool hasBody(MessageKind kind) noexcept;

// A message as it arrives: the header and, for the kinds that have one, the body.
struct Message {
  Header header;
  AnyValue body;  // void when the kind has none
};

// Decodes every frame of an incoming message (routing frames removed) and checks the body
// of the kinds whose body has a fixed shape: the arguments of a call, post or signal are a
// list; a register carries a member table. Raises DecodeError, with the header when it
// could be read (so that a request can still be answered with its id).
class MessageError : public DecodeError {
 public:
  MessageError(const std::string& what, std::optional<Header> header)
      : DecodeError(what), header_(std::move(header)) {}
  const std::optional<Header>& header() const noexcept { return header_; }

 private:
  std::optional<Header> header_;
};
Message decodeMessage(const std::vector<std::string_view>& frames);

// A member table as a value: a list of members in id order, each
// ["m", id, name, parameters signature, return signature, description,
//  [[parameter name, description]...], [return name, description]],
// ["s", id, name, parameters signature] or ["p", id, name, signature]; and the
// description: [description, members].
AnyValue metaObjectToValue(const MetaObject& meta);
// Raises DecodeError when the value is no member table (ids out of order included).
MetaObject metaObjectFromValue(const AnyValue& value);

}  // namespace ko::wire
