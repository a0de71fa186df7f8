#include "ko/wire.hpp"

#include <algorithm>
#include <array>
#include <cstring>
#include <limits>
#include <optional>
#include <utility>

#include <msgpack.hpp>

namespace ko::wire {

namespace {

// ---- encoding ----------------------------------------------------------------------------

struct StringWriter {
  std::string& out;
  void write(const char* data, std::size_t size) { out.append(data, size); }
};
using Packer = msgpack::packer<StringWriter>;

constexpr std::int64_t kInt32Min = std::numeric_limits<std::int32_t>::min();
constexpr std::int64_t kInt32Max = std::numeric_limits<std::int32_t>::max();

// The byte count of the integer types by signature letter.
std::size_t integerSize(char letter) {
  switch (letter) {
    case 'c':
    case 'C':
      return 1;
    case 'w':
    case 'W':
      return 2;
    case 'i':
    case 'I':
      return 4;
    default:
      return 8;
  }
}

// The packer writes a float that holds an integer as an integer: floats are written here,
// always as float 32 (0xca) or float 64 (0xcb), big-endian.
template <class F, class Bits>
void packFloat(std::string& out, unsigned char marker, F value) {
  Bits bits = 0;
  static_assert(sizeof bits == sizeof value);
  std::memcpy(&bits, &value, sizeof bits);
  out.push_back(static_cast<char>(marker));
  for (int k = static_cast<int>(sizeof bits) - 1; k >= 0; --k)
    out.push_back(static_cast<char>((bits >> (8 * k)) & 0xFF));
}

void packString(Packer& p, std::string_view s) {
  if (s.size() > std::numeric_limits<std::uint32_t>::max())
    throw Error("A string of " + std::to_string(s.size()) + " bytes cannot be sent");
  const auto n = static_cast<std::uint32_t>(s.size());
  p.pack_str(n);
  p.pack_str_body(s.data(), n);
}

void packExtension(Packer& p, ExtensionType type, std::string_view payload) {
  p.pack_ext(payload.size(), type);
  p.pack_ext_body(payload.data(), static_cast<std::uint32_t>(payload.size()));
}

void packList(std::string& out, Packer& p, const AnyValue::List& items) {
  p.pack_array(static_cast<std::uint32_t>(items.size()));
  for (const auto& e : items)
    appendValue(out, e);
}

void packInteger(Packer& p, const AnyValue& value) {
  const AnyValue::Int& i = value.asInt();
  if (i.size == 0) {
    i.value ? p.pack_true() : p.pack_false();
    return;
  }
  const char letter = value.signature().front();
  // A plain MessagePack integer decodes as "i" when it fits, else "l", else "L": those
  // that decode back to their own type go plain.
  const bool inInt32 = i.value >= kInt32Min && i.value <= kInt32Max;
  if (letter == 'i' || (letter == 'l' && !inInt32)) {
    p.pack_int64(i.value);
    return;
  }
  if (letter == 'L' && i.value < 0) {
    p.pack_uint64(static_cast<std::uint64_t>(i.value));
    return;
  }
  const std::size_t size = integerSize(letter);
  std::string payload(1 + size, '\0');
  payload[0] = letter;
  auto bits = static_cast<std::uint64_t>(i.value);
  for (std::size_t k = 0; k < size; ++k)
    payload[size - k] = static_cast<char>((bits >> (8 * k)) & 0xFF);
  packExtension(p, kExtInteger, payload);
}

}  // namespace

void appendValue(std::string& out, const AnyValue& value) {
  StringWriter writer{out};
  Packer p(writer);
  switch (value.kind()) {
    case Kind::Void:
      p.pack_nil();
      return;
    case Kind::None:
      packExtension(p, kExtNone, {});
      return;
    case Kind::Int:
      packInteger(p, value);
      return;
    case Kind::Float:
      if (value.signature() == "f")
        packFloat<float, std::uint32_t>(out, 0xca, static_cast<float>(value.asFloat().value));
      else
        packFloat<double, std::uint64_t>(out, 0xcb, value.asFloat().value);
      return;
    case Kind::String:
      packString(p, value.asString());
      return;
    case Kind::Raw: {
      const auto& bytes = value.asRaw().bytes;
      const auto n = static_cast<std::uint32_t>(bytes.size());
      p.pack_bin(n);
      p.pack_bin_body(reinterpret_cast<const char*>(bytes.data()), n);
      return;
    }
    case Kind::List:
      packList(out, p, value.asList());
      return;
    case Kind::Map: {
      const auto& entries = value.asMap();
      p.pack_map(static_cast<std::uint32_t>(entries.size()));
      for (const auto& [k, v] : entries) {
        appendValue(out, k);
        appendValue(out, v);
      }
      return;
    }
    case Kind::Tuple: {
      const auto& t = value.asTuple();
      std::string payload;
      StringWriter pw{payload};
      Packer inner(pw);
      inner.pack_array(3);
      packString(inner, t.name);
      inner.pack_array(static_cast<std::uint32_t>(t.memberNames.size()));
      for (const auto& name : t.memberNames)
        packString(inner, name);
      packList(payload, inner, t.members);
      packExtension(p, kExtTuple, payload);
      return;
    }
    case Kind::Dynamic:
      packExtension(p, kExtDynamic, encodeValue(value.asDynamic()));
      return;
    case Kind::VarArgs: {
      std::string payload;
      StringWriter pw{payload};
      Packer inner(pw);
      packList(payload, inner, value.asVarArgs());
      packExtension(p, kExtVarArgs, payload);
      return;
    }
    case Kind::Iterator:
    case Kind::Unknown:
    case Kind::Function:
    case Kind::Signal:
    case Kind::Property: {
      const char kind = static_cast<char>(static_cast<int>(value.kind()));
      packExtension(p, kExtOpaque, std::string_view(&kind, 1));
      return;
    }
    case Kind::Object:
    case Kind::Pointer:
      break;
  }
  throw Error(std::string("A value of kind ") + kindName(value.kind()) +
              " cannot be sent to another process");
}

std::string encodeValue(const AnyValue& value) {
  std::string out;
  appendValue(out, value);
  return out;
}

std::string encodeList(const AnyValue::List& items) {
  std::string out;
  StringWriter writer{out};
  Packer p(writer);
  packList(out, p, items);
  return out;
}

// ---- decoding ----------------------------------------------------------------------------

namespace {

AnyValue decodeNested(std::string_view bytes, int depthLeft);

AnyValue decodeInteger(std::string_view payload) {
  if (payload.empty())
    throw DecodeError("An integer extension is empty");
  const char letter = payload.front();
  static constexpr std::string_view kLetters = "cCwWiIlL";
  if (kLetters.find(letter) == std::string_view::npos)
    throw DecodeError(std::string("An integer extension has the unknown type '") + letter + "'");
  const std::size_t size = integerSize(letter);
  if (payload.size() != 1 + size)
    throw DecodeError(std::string("An integer extension of type '") + letter + "' has " +
                      std::to_string(payload.size() - 1) + " value bytes, not " +
                      std::to_string(size));
  std::uint64_t bits = 0;
  for (std::size_t k = 1; k <= size; ++k)
    bits = (bits << 8) | static_cast<unsigned char>(payload[k]);
  const bool isSigned = letter >= 'a';
  std::int64_t v = 0;
  if (isSigned && size < 8 && (bits >> (8 * size - 1)) & 1U)
    v = static_cast<std::int64_t>(bits | (~std::uint64_t{0} << (8 * size)));  // sign-extend
  else
    v = static_cast<std::int64_t>(bits);
  return AnyValue::integer(v, static_cast<std::uint8_t>(size), isSigned);
}

AnyValue decodeExtension(std::int8_t type, std::string_view payload, int depthLeft) {
  switch (type) {
    case kExtInteger:
      return decodeInteger(payload);
    case kExtNone:
      if (!payload.empty())
        throw DecodeError("A none extension carries bytes");
      return AnyValue::none();
    case kExtTuple: {
      AnyValue parts = decodeNested(payload, depthLeft);
      if (parts.kind() != Kind::List || parts.asList().size() != 3)
        throw DecodeError("A tuple extension is not [name, member names, members]");
      auto& items = parts.asList();
      if (items[0].kind() != Kind::String || items[1].kind() != Kind::List ||
          items[2].kind() != Kind::List)
        throw DecodeError("A tuple extension is not [name, member names, members]");
      std::vector<std::string> names;
      for (const auto& n : items[1].asList()) {
        if (n.kind() != Kind::String)
          throw DecodeError("A tuple's member name is not a string");
        names.push_back(n.asString());
      }
      if (!names.empty() && names.size() != items[2].asList().size())
        throw DecodeError("A tuple has " + std::to_string(names.size()) + " member names for " +
                          std::to_string(items[2].asList().size()) + " members");
      return AnyValue::tuple(std::move(items[2].asList()), std::move(names), items[0].asString());
    }
    case kExtDynamic:
      return AnyValue::dynamic(decodeNested(payload, depthLeft));
    case kExtVarArgs: {
      AnyValue list = decodeNested(payload, depthLeft);
      if (list.kind() != Kind::List)
        throw DecodeError("A variadic extension is not an array");
      return AnyValue::varArgs(std::move(list.asList()));
    }
    case kExtOpaque: {
      if (payload.size() != 1)
        throw DecodeError("An opaque extension is not one byte");
      const auto kind = static_cast<Kind>(static_cast<unsigned char>(payload[0]));
      switch (kind) {
        case Kind::Iterator:
        case Kind::Unknown:
        case Kind::Function:
        case Kind::Signal:
        case Kind::Property:
          return AnyValue::opaque(kind);
        default:
          throw DecodeError("An opaque extension names the kind " +
                            std::to_string(static_cast<int>(kind)));
      }
    }
    default:
      throw DecodeError("Unknown extension type " + std::to_string(type));
  }
}

// Builds the value as the MessagePack parser walks it (no recursion: the parser keeps its
// own stack, and this one is bounded by the depth left).
class Builder {
 public:
  Builder(std::size_t size, int depthLeft) : bytes_(size), depthLeft_(depthLeft) {}

  std::optional<AnyValue>& result() { return result_; }
  const std::string& error() const { return error_; }

  bool visit_nil() { return emit(AnyValue()); }
  bool visit_boolean(bool v) { return emit(AnyValue::boolean(v)); }
  bool visit_positive_integer(std::uint64_t v) {
    if (v <= static_cast<std::uint64_t>(kInt32Max))
      return emit(AnyValue::integer(static_cast<std::int64_t>(v), 4, true));
    if (v <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()))
      return emit(AnyValue::integer(static_cast<std::int64_t>(v), 8, true));
    return emit(AnyValue::integer(static_cast<std::int64_t>(v), 8, false));
  }
  // The int64 format may carry a value of any sign.
  bool visit_negative_integer(std::int64_t v) {
    return emit(AnyValue::integer(v, v >= kInt32Min && v <= kInt32Max ? 4 : 8, true));
  }
  bool visit_float32(float v) { return emit(AnyValue::floating(v, 4)); }
  bool visit_float64(double v) { return emit(AnyValue::floating(v, 8)); }
  bool visit_str(const char* v, std::uint32_t size) {
    return emit(AnyValue(std::string(v ? v : "", size)));
  }
  bool visit_bin(const char* v, std::uint32_t size) {
    const auto* b = reinterpret_cast<const std::uint8_t*>(v);
    return emit(
        AnyValue::raw(size ? std::vector<std::uint8_t>(b, b + size) : std::vector<std::uint8_t>()));
  }
  bool visit_ext(const char* v, std::uint32_t size) {
    if (!v || size == 0)
      return fail("An extension has no type");
    try {
      return emit(decodeExtension(static_cast<std::int8_t>(v[0]), std::string_view(v + 1, size - 1),
                                  depthLeft_ - static_cast<int>(stack_.size()) - 1));
    } catch (const DecodeError& e) {
      return fail(e.what());
    }
  }
  bool start_array(std::uint32_t n) { return open(false, n); }
  bool start_array_item() { return true; }
  bool end_array_item() { return true; }
  bool end_array() { return close(); }
  bool start_map(std::uint32_t n) { return open(true, n); }
  bool start_map_key() { return true; }
  bool end_map_key() { return true; }
  bool start_map_value() { return true; }
  bool end_map_value() { return true; }
  bool end_map() { return close(); }
  void parse_error(std::size_t parsed, std::size_t at) {
    fail("Malformed MessagePack at byte " + std::to_string(at) + " (" + std::to_string(parsed) +
         " parsed)");
  }
  void insufficient_bytes(std::size_t parsed, std::size_t) {
    fail("The value ends early, after " + std::to_string(parsed) + " bytes");
  }
  bool referenced() const { return false; }
  void set_referenced(bool) {}

 private:
  struct Frame {
    bool isMap = false;
    AnyValue::List items;
    AnyValue::Map entries;
    std::optional<AnyValue> key;
  };

  bool fail(std::string text) {
    if (error_.empty())
      error_ = std::move(text);
    return false;
  }
  bool open(bool isMap, std::uint32_t n) {
    if (static_cast<int>(stack_.size()) >= depthLeft_)
      return fail("The value is nested deeper than " + std::to_string(kMaxDepth) + " levels");
    Frame f;
    f.isMap = isMap;
    // Never trust a count: every element takes at least one byte.
    const std::size_t reserve = std::min<std::size_t>(n, bytes_);
    if (isMap)
      f.entries.reserve(reserve / 2);
    else
      f.items.reserve(reserve);
    stack_.push_back(std::move(f));
    return true;
  }
  bool close() {
    Frame f = std::move(stack_.back());
    stack_.pop_back();
    return emit(f.isMap ? AnyValue::map(std::move(f.entries)) : AnyValue::list(std::move(f.items)));
  }
  bool emit(AnyValue v) {
    if (stack_.empty()) {
      result_ = std::move(v);
      return true;
    }
    Frame& top = stack_.back();
    if (!top.isMap) {
      top.items.push_back(std::move(v));
    } else if (!top.key) {
      top.key = std::move(v);
    } else {
      top.entries.emplace_back(std::move(*top.key), std::move(v));
      top.key.reset();
    }
    return true;
  }

  const std::size_t bytes_;
  const int depthLeft_;
  std::vector<Frame> stack_;
  std::optional<AnyValue> result_;
  std::string error_;
};

AnyValue decodeNested(std::string_view bytes, int depthLeft) {
  if (depthLeft <= 0)
    throw DecodeError("The value is nested deeper than " + std::to_string(kMaxDepth) + " levels");
  if (bytes.empty())
    throw DecodeError("No value: the bytes are empty");
  Builder builder(bytes.size(), depthLeft);
  std::size_t offset = 0;
  bool ok = false;
  try {
    ok = msgpack::parse(bytes.data(), bytes.size(), offset, builder);
  } catch (const std::exception& e) {
    throw DecodeError(std::string("Malformed MessagePack: ") + e.what());
  }
  if (!ok || !builder.result())
    throw DecodeError(builder.error().empty() ? "Malformed MessagePack" : builder.error());
  if (offset != bytes.size())
    throw DecodeError(std::to_string(bytes.size() - offset) + " bytes follow the value");
  return std::move(*builder.result());
}

// ---- headers -----------------------------------------------------------------------------

struct KindInfo {
  MessageKind kind;
  const char* name;
  // One letter per field: s a string, n an integer, x a string or an integer.
  const char* fields;
  bool body;
};

constexpr std::array<KindInfo, 20> kKinds{{
    {MessageKind::Hello, "hello", "nsnn", false},
    {MessageKind::Welcome, "welcome", "nnsnn", false},
    {MessageKind::Bye, "bye", "", false},
    {MessageKind::Ping, "ping", "", false},
    {MessageKind::Reset, "reset", "s", false},
    {MessageKind::Register, "register", "s", true},
    {MessageKind::Unregister, "unregister", "s", false},
    {MessageKind::Lookup, "lookup", "s", false},
    {MessageKind::List, "list", "", false},
    {MessageKind::Call, "call", "sxn", true},
    {MessageKind::Reply, "reply", "", true},
    {MessageKind::Error, "error", "s", false},
    {MessageKind::Post, "post", "ss", true},
    {MessageKind::Subscribe, "subscribe", "ss", false},
    {MessageKind::Unsubscribe, "unsubscribe", "ss", false},
    {MessageKind::Signal, "signal", "ss", true},
    {MessageKind::Property, "property", "ss", false},
    {MessageKind::SetProperty, "setproperty", "ss", true},
    {MessageKind::Service, "service", "ssn", false},
    {MessageKind::PeerGone, "peer-gone", "ns", false},
}};

const KindInfo& info(MessageKind kind) {
  return kKinds[static_cast<std::size_t>(kind)];
}

std::uint64_t readUnsigned(const AnyValue& v, const char* what, std::uint64_t max) {
  if (v.kind() != Kind::Int || v.asInt().size == 0)
    throw DecodeError(std::string("The header's ") + what + " is not an integer");
  const auto& i = v.asInt();
  if (i.isSigned && i.value < 0)
    throw DecodeError(std::string("The header's ") + what + " is negative");
  const auto u = static_cast<std::uint64_t>(i.value);
  if (u > max)
    throw DecodeError(std::string("The header's ") + what + " is too large");
  return u;
}

}  // namespace

AnyValue decodeValue(std::string_view bytes) {
  return decodeNested(bytes, kMaxDepth);
}

const char* messageKindName(MessageKind kind) noexcept {
  return info(kind).name;
}

bool hasBody(MessageKind kind) noexcept {
  return info(kind).body;
}

std::string encodeHeader(const Header& header) {
  AnyValue::List items;
  items.reserve(4 + header.fields.size());
  items.emplace_back(messageKindName(header.kind));
  items.emplace_back(AnyValue::integer(static_cast<std::int64_t>(header.id), 8, false));
  items.emplace_back(AnyValue::integer(header.to, 4, true));
  items.emplace_back(AnyValue::integer(header.from, 4, true));
  for (const auto& f : header.fields)
    items.push_back(f);
  return encodeValue(AnyValue::list(std::move(items)));
}

Header decodeHeader(std::string_view bytes) {
  AnyValue value = decodeValue(bytes);
  if (value.kind() != Kind::List || value.asList().size() < 4)
    throw DecodeError("A header is an array [kind, id, to, from, fields...]");
  auto& items = value.asList();
  if (items[0].kind() != Kind::String)
    throw DecodeError("The header's kind is not a string");
  const std::string& name = items[0].asString();
  const auto found =
      std::find_if(kKinds.begin(), kKinds.end(), [&](const KindInfo& k) { return name == k.name; });
  if (found == kKinds.end())
    throw DecodeError("Unknown message kind '" + name + "'");
  Header h;
  h.kind = found->kind;
  h.id = readUnsigned(items[1], "id", std::numeric_limits<std::uint64_t>::max());
  h.to = static_cast<std::uint32_t>(
      readUnsigned(items[2], "destination", std::numeric_limits<std::uint32_t>::max()));
  h.from = static_cast<std::uint32_t>(
      readUnsigned(items[3], "source", std::numeric_limits<std::uint32_t>::max()));
  const std::string_view fields = found->fields;
  if (items.size() - 4 != fields.size())
    throw DecodeError(std::string("A ") + found->name + " message has " +
                      std::to_string(fields.size()) + " field(s), not " +
                      std::to_string(items.size() - 4));
  for (std::size_t k = 0; k < fields.size(); ++k) {
    const AnyValue& f = items[4 + k];
    const bool isText = f.kind() == Kind::String;
    const bool isNumber = f.kind() == Kind::Int && f.asInt().size != 0;
    const bool ok = fields[k] == 's' ? isText : fields[k] == 'n' ? isNumber : isText || isNumber;
    if (!ok)
      throw DecodeError(std::string("Field ") + std::to_string(k + 1) + " of a " + found->name +
                        " message is not " + (fields[k] == 's' ? "a string" : "an integer"));
    h.fields.push_back(f);
  }
  return h;
}

Message decodeMessage(const std::vector<std::string_view>& frames) {
  if (frames.empty())
    throw MessageError("A message has no frame", std::nullopt);
  Message m;
  m.header = decodeHeader(frames[0]);
  const bool body = hasBody(m.header.kind);
  const std::size_t expected = body ? 2 : 1;
  if (frames.size() != expected)
    throw MessageError(std::string("A ") + messageKindName(m.header.kind) + " message has " +
                           std::to_string(expected) + " frame(s), not " +
                           std::to_string(frames.size()),
                       m.header);
  if (!body)
    return m;
  try {
    m.body = decodeValue(frames[1]);
    switch (m.header.kind) {
      case MessageKind::Call:
      case MessageKind::Post:
      case MessageKind::Signal:
        if (m.body.kind() != Kind::List)
          throw DecodeError("The arguments of a " + std::string(messageKindName(m.header.kind)) +
                            " message are not a list");
        break;
      case MessageKind::Register:
        (void)metaObjectFromValue(m.body);
        break;
      default:
        break;
    }
  } catch (const DecodeError& e) {
    throw MessageError(e.what(), m.header);
  }
  return m;
}

namespace {
AnyValue pairValue(const std::string& a, const std::string& b) {
  return AnyValue::list({AnyValue(a), AnyValue(b)});
}
const std::string& textAt(const AnyValue::List& items, std::size_t i) {
  if (i >= items.size() || items[i].kind() != Kind::String)
    throw DecodeError("A member's field " + std::to_string(i + 1) + " is not a string");
  return items[i].asString();
}
// Signatures are parsed recursively: a member table from another process keeps them short.
const std::string& signatureAt(const AnyValue::List& items, std::size_t i) {
  const std::string& s = textAt(items, i);
  constexpr std::size_t kMaxSignature = 512;
  constexpr int kMaxNesting = 16;
  int depth = 0;
  for (char c : s) {
    depth += (c == '[' || c == '{' || c == '(') ? 1 : (c == ']' || c == '}' || c == ')') ? -1 : 0;
    if (depth > kMaxNesting)
      throw DecodeError("A signature is nested deeper than " + std::to_string(kMaxNesting));
  }
  if (s.size() > kMaxSignature)
    throw DecodeError("A signature is longer than " + std::to_string(kMaxSignature) + " bytes");
  return s;
}

std::pair<std::string, std::string> pairAt(const AnyValue& v) {
  if (v.kind() != Kind::List || v.asList().size() != 2)
    throw DecodeError("A parameter is not [name, description]");
  return {textAt(v.asList(), 0), textAt(v.asList(), 1)};
}
}  // namespace

AnyValue metaObjectToValue(const MetaObject& meta) {
  std::vector<std::pair<unsigned, AnyValue>> members;
  for (const auto& m : meta.methods()) {
    AnyValue::List params;
    for (const auto& p : m.parameters)
      params.push_back(pairValue(p.name, p.description));
    members.emplace_back(
        m.id, AnyValue::list({"m", AnyValue(m.id), m.name, m.parametersSignature, m.returnSignature,
                              m.description, AnyValue::list(std::move(params)),
                              pairValue(m.returnValue.name, m.returnValue.description)}));
  }
  for (const auto& s : meta.signals())
    members.emplace_back(s.id,
                         AnyValue::list({"s", AnyValue(s.id), s.name, s.parametersSignature}));
  for (const auto& p : meta.properties())
    members.emplace_back(p.id, AnyValue::list({"p", AnyValue(p.id), p.name, p.signature}));
  std::sort(members.begin(), members.end(),
            [](const auto& a, const auto& b) { return a.first < b.first; });
  AnyValue::List list;
  list.reserve(members.size());
  for (auto& [id, v] : members)
    list.push_back(std::move(v));
  return AnyValue::list({AnyValue(meta.description()), AnyValue::list(std::move(list))});
}

MetaObject metaObjectFromValue(const AnyValue& value) {
  if (value.kind() != Kind::List || value.asList().size() != 2 ||
      value.asList()[0].kind() != Kind::String || value.asList()[1].kind() != Kind::List)
    throw DecodeError("A member table is not [description, members]");
  MetaObject meta;
  meta.setDescription(value.asList()[0].asString());
  for (const AnyValue& member : value.asList()[1].asList()) {
    if (member.kind() != Kind::List || member.asList().size() < 4)
      throw DecodeError("A member is not a list [kind, id, name, ...]");
    const auto& f = member.asList();
    const std::string& kind = textAt(f, 0);
    if (f[1].kind() != Kind::Int)
      throw DecodeError("A member's id is not an integer");
    const std::int64_t id = f[1].asInt().value;
    unsigned got = 0;
    try {
      if (kind == "m" && f.size() == 8) {
        MetaMethod m;
        m.name = textAt(f, 2);
        m.parametersSignature = signatureAt(f, 3);
        m.returnSignature = signatureAt(f, 4);
        m.description = textAt(f, 5);
        if (f[6].kind() != Kind::List)
          throw DecodeError("A method's parameters are not a list");
        for (const auto& p : f[6].asList()) {
          auto [n, d] = pairAt(p);
          m.parameters.push_back({std::move(n), std::move(d)});
        }
        auto [rn, rd] = pairAt(f[7]);
        m.returnValue = {std::move(rn), std::move(rd)};
        got = meta.addMethod(std::move(m));
      } else if (kind == "s" && f.size() == 4) {
        got = meta.addSignal({0, textAt(f, 2), signatureAt(f, 3)});
      } else if (kind == "p" && f.size() == 4) {
        got = meta.addProperty({0, textAt(f, 2), signatureAt(f, 3)});
      } else {
        throw DecodeError("Unknown member kind '" + kind + "' or wrong field count");
      }
    } catch (const DecodeError&) {
      throw;
    } catch (const Error& e) {
      throw DecodeError(std::string("A member does not fit the table: ") + e.what());
    }
    if (static_cast<std::int64_t>(got) != id)
      throw DecodeError("A member's id is " + std::to_string(id) + ", not " + std::to_string(got) +
                        ": the members are not in id order");
  }
  return meta;
}

}  // namespace ko::wire
