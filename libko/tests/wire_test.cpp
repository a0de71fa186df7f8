// The wire format: every kind of value comes back exactly (kind, signature, content), and
// bytes that are no value or no header are refused with a reason.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>
#include <string>
#include <vector>

#include "ko/wire.hpp"
#include "ko_test_helpers.hpp"

namespace ko::wire {
namespace {

struct RoundTrip {
  const char* name;
  AnyValue value;
};

std::vector<RoundTrip> roundTrips() {
  using L = AnyValue::List;
  return {
      {"void", AnyValue()},
      {"none", AnyValue::none()},
      {"true", AnyValue(true)},
      {"false", AnyValue(false)},
      {"int", AnyValue(42)},
      {"negative int", AnyValue(-7)},
      {"int64 small", AnyValue::integer(5, 8, true)},
      {"int64 large", AnyValue::integer(std::int64_t{1} << 40, 8, true)},
      {"int64 min", AnyValue::integer(std::numeric_limits<std::int64_t>::min(), 8, true)},
      {"uint64 small", AnyValue::integer(3, 8, false)},
      {"uint64 max", AnyValue::integer(-1, 8, false)},
      {"int8", AnyValue::integer(-128, 1, true)},
      {"uint8", AnyValue::integer(255, 1, false)},
      {"int16", AnyValue::integer(-300, 2, true)},
      {"uint32", AnyValue::integer(4000000000, 4, false)},
      {"float", AnyValue(0.1F)},
      {"double", AnyValue(0.1)},
      {"double exact in float", AnyValue(0.5)},
      {"string", AnyValue("héllo")},
      {"string with zero", AnyValue(std::string("a\0b", 3))},
      {"raw", AnyValue::raw({0, 1, 255})},
      {"empty raw", AnyValue::raw({})},
      {"empty list", AnyValue::list({})},
      {"empty map", AnyValue::map({})},
      {"list", AnyValue::list(L{1, "two", 3.0, AnyValue::list({})})},
      {"map with non-string keys in order",
       AnyValue::map({{AnyValue(2), AnyValue("b")}, {AnyValue("a"), AnyValue(1)}})},
      {"tuple", AnyValue::tuple({AnyValue(1), AnyValue("x")})},
      {"named tuple", AnyValue::tuple({AnyValue(1), AnyValue(2.5F)}, {"a", "b"}, "Point")},
      {"dynamic", AnyValue::dynamic(AnyValue::integer(9, 2, false))},
      {"varargs", AnyValue::varArgs({AnyValue(1), AnyValue("a")})},
      {"opaque", AnyValue::opaque(Kind::Signal)},
  };
}

TEST(Wire, EveryKindComesBackExactly) {
  for (const auto& [name, value] : roundTrips()) {
    SCOPED_TRACE(name);
    const AnyValue back = decodeValue(encodeValue(value));
    EXPECT_EQ(back.kind(), value.kind());
    EXPECT_EQ(back.signature(), value.signature());
    EXPECT_EQ(back.toString(), value.toString());
    EXPECT_TRUE(back == value);
  }
}

TEST(Wire, AnIntegerIsTypedByItsValueNotByItsFormat) {
  // A positive value in the int64 format; a small one in the uint64 format.
  EXPECT_EQ(decodeValue(std::string("\xd3\x00\xe0\x60\x00\x00\x00\x00\x97", 9)).signature(), "l");
  EXPECT_EQ(decodeValue(std::string("\xcf\x00\x00\x00\x00\x00\x00\x00\x05", 9)).signature(), "i");
}

TEST(Wire, MalformedValuesAreRefused) {
  std::string deep(kMaxDepth + 1, '\x91');
  deep += '\xc0';
  const struct {
    const char* name;
    std::string bytes;
  } cases[] = {
      {"empty", ""},
      {"truncated string",
       "\xa5"
       "ab"},
      {"array longer than its bytes", "\xdd\xff\xff\xff\xff\x01"},
      {"trailing bytes", std::string("\x01\x02")},
      {"reserved byte", "\xc1"},
      {"too deep", deep},
      {"unknown extension", "\xd4\x09\x00"},
      {"short integer extension",
       "\xd5\x01"
       "l\x01"},
      {"bad integer letter",
       "\xd5\x01"
       "zz"},
      {"tuple that is no triple", "\xd4\x03\xc0"},
      {"opaque of a kind with content", "\xd4\x06\x01"},
  };
  for (const auto& c : cases)
    EXPECT_THROW(decodeValue(c.bytes), DecodeError) << c.name;
}

TEST(Wire, HeadersCarryTheirKindsFields) {
  Header call;
  call.kind = MessageKind::Call;
  call.id = 77;
  call.to = 3;
  call.from = 5;
  call.fields = {AnyValue("ZUMokuto"), AnyValue("say"), AnyValue(0)};
  const Header back = decodeHeader(encodeHeader(call));
  EXPECT_EQ(back.kind, MessageKind::Call);
  EXPECT_EQ(back.id, 77U);
  EXPECT_EQ(back.to, 3U);
  EXPECT_EQ(back.from, 5U);
  EXPECT_EQ(back.text(1), "say");
  EXPECT_TRUE(hasBody(MessageKind::Call));
  EXPECT_FALSE(hasBody(MessageKind::Lookup));

  const auto header = [](AnyValue::List items) { return encodeValue(AnyValue::list(items)); };
  const struct {
    const char* name;
    std::string bytes;
    const char* reason;
  } bad[] = {
      {"not an array", encodeValue(AnyValue("call")), "A header is an array"},
      {"unknown kind", header({"shout", 0, 0, 0}), "Unknown message kind 'shout'"},
      {"negative id", header({"ping", -1, 0, 0}), "id is negative"},
      {"missing field", header({"lookup", 1, 0, 0}), "has 1 field(s), not 0"},
      {"field of the wrong type", header({"lookup", 1, 0, 0, 5}), "is not a string"},
  };
  for (const auto& c : bad) {
    EXPECT_THAT(test::errorOf<DecodeError>([&] { decodeHeader(c.bytes); }),
                ::testing::HasSubstr(c.reason))
        << c.name;
  }
}

}  // namespace
}  // namespace ko::wire
