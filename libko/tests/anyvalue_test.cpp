#include <gtest/gtest.h>

#include <cstdint>
#include <limits>

#include "ko/anyvalue.hpp"
#include "ko/json.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::AnyValue;
using ko::Kind;

TEST(AnyValue, KindsAndSignaturesOfValuesAndTypes) {
  const struct {
    AnyValue value;
    Kind kind;
    const char* signature;
  } cases[] = {
      {AnyValue(), Kind::Void, "v"},
      {AnyValue::none(), Kind::None, "_"},
      {AnyValue(true), Kind::Int, "b"},
      {AnyValue(1), Kind::Int, "i"},
      {AnyValue(std::int16_t{3}), Kind::Int, "w"},
      {AnyValue(std::uint64_t{1}), Kind::Int, "L"},
      {AnyValue(2.5f), Kind::Float, "f"},
      {AnyValue(1.0), Kind::Float, "d"},
      {AnyValue("abc"), Kind::String, "s"},
      {AnyValue(AnyValue::List{1, 2}), Kind::List, "[i]"},
      {AnyValue(AnyValue::List{1, "x"}), Kind::List, "[m]"},
      {AnyValue::map({{"a", 1}}), Kind::Map, "{si}"},
      {AnyValue::tuple({1, "a"}), Kind::Tuple, "(is)"},
      {AnyValue::dynamic(1), Kind::Dynamic, "m"},
      {AnyValue::raw({1, 2}), Kind::Raw, "r"},
      {AnyValue::varArgs({1}), Kind::VarArgs, "#m"},
      {AnyValue::pointerTo(1), Kind::Pointer, "i*"},
      {AnyValue::opaque(Kind::Signal), Kind::Signal, "~"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(c.value.kind(), c.kind) << c.signature;
    EXPECT_EQ(c.value.signature(), c.signature);
  }
  EXPECT_EQ(AnyValue(true).asInt().size, 0);
  EXPECT_EQ(AnyValue(2.5f).asFloat().size, 4);
  EXPECT_THROW(AnyValue::opaque(Kind::Int), ko::ConversionError);
  EXPECT_EQ(ko::signatureOf<std::vector<std::string>>(), "[s]");
  EXPECT_EQ((ko::signatureOf<std::map<std::string, int>>()), "{si}");
  EXPECT_EQ(ko::signatureOf<unsigned>(), "I");
  EXPECT_EQ(ko::signatureOf<void>(), "v");
}

TEST(AnyValue, FailedConversionsNameBothSignatures) {
  EXPECT_NE(ko::test::errorOf<ko::ConversionError>([] {
              (void)AnyValue("abc").to<int>();
            }).find("from s to i"),
            std::string::npos);
  EXPECT_THROW((void)AnyValue(300).to<std::uint8_t>(), ko::ConversionError);
  EXPECT_THROW((void)AnyValue(-1).to<unsigned>(), ko::ConversionError);
  EXPECT_THROW((void)AnyValue(1e300).to<int>(), ko::ConversionError);
  EXPECT_THROW((void)AnyValue(AnyValue::List{1, "a"}).to<std::vector<int>>(), ko::ConversionError);
  EXPECT_THROW((void)AnyValue().asString(), ko::ConversionError);
}

TEST(AnyValue, NumbersAtTheEdgesOfSixtyFourBits) {
  // Doubles from 2^63 up have no int64 form: refused, not converted.
  EXPECT_THROW((void)AnyValue(9.25e18).to<std::int64_t>(), ko::ConversionError);
  EXPECT_THROW((void)AnyValue(9223372036854775808.0).to<std::int64_t>(), ko::ConversionError);
  EXPECT_THROW((void)AnyValue(-9.25e18).to<std::int64_t>(), ko::ConversionError);
  EXPECT_EQ(AnyValue(-9223372036854775808.0).to<std::int64_t>(),
            std::numeric_limits<std::int64_t>::min());
  EXPECT_EQ(AnyValue(9.25e18).to<std::uint64_t>(), 9250000000000000000ULL);
  EXPECT_THROW((void)AnyValue(1.9e19).to<std::uint64_t>(), ko::ConversionError);

  const std::uint64_t big = std::numeric_limits<std::uint64_t>::max();
  EXPECT_EQ(AnyValue(big).to<std::uint64_t>(), big);
  EXPECT_THROW((void)AnyValue(big).to<std::int64_t>(), ko::ConversionError);
  EXPECT_THROW((void)AnyValue(big).to<std::uint32_t>(), ko::ConversionError);
}

TEST(AnyValue, MovedFromValueIsVoidAndUsable) {
  for (AnyValue source : {AnyValue::map({{"k", 1}}), AnyValue::tuple({1}), AnyValue::dynamic(1),
                          AnyValue::varArgs({1}), AnyValue::pointerTo(1)}) {
    AnyValue moved(std::move(source));
    EXPECT_TRUE(source.isVoid()) << moved.toString();  // NOLINT(bugprone-use-after-move)
    const AnyValue copy = source;
    EXPECT_EQ(copy.toString(), "void");
    AnyValue assigned;
    assigned = std::move(moved);
    EXPECT_TRUE(moved.isVoid());  // NOLINT(bugprone-use-after-move)
    EXPECT_FALSE(assigned.isVoid());
  }
}

TEST(AnyValue, AssigningAnOwnElementIsSafe) {
  AnyValue a = AnyValue::list({AnyValue::list({1, 2}), "x"});
  a = a.asList()[0];
  EXPECT_EQ(a.toString(), "[1, 2]");
  AnyValue l = AnyValue::list({AnyValue::list({AnyValue::map({{"j", 3}})}), 4});
  l = std::move(l.asList()[0]);
  EXPECT_EQ(l.toString(), "[{\"j\": 3}]");
  AnyValue d = AnyValue::dynamic(AnyValue::list({5}));
  d = d.asDynamic();
  EXPECT_EQ(d.toString(), "[5]");
}

TEST(AnyValue, CopiesAreDeepAndCompareByContent) {
  AnyValue a = AnyValue::list({1, AnyValue::map({{"k", AnyValue::list({"v"})}})});
  AnyValue b = a;
  EXPECT_EQ(a, b);
  b.asList()[0] = 2;
  EXPECT_NE(a, b);
  EXPECT_EQ(a.asList()[0], AnyValue(1));
  EXPECT_EQ(AnyValue(1), AnyValue(std::int64_t{1}));
  EXPECT_NE(AnyValue(1), AnyValue(true));
  EXPECT_EQ(AnyValue::floating(0.1, 4).asFloat().value, static_cast<double>(0.1f));
  EXPECT_EQ(AnyValue::list({1, "a\"b", true, AnyValue::map({{"k", 0.5}})}).toString(),
            "[1, \"a\\\"b\", true, {\"k\": 0.5}]");
}

TEST(Json, DecodesEveryKind) {
  const AnyValue v =
      ko::fromJson(R"(["hello", 2, 2.5, true, null, {"b": 1, "a": [1]}, 5000000000, -2147483648])");
  const auto& l = v.asList();
  ASSERT_EQ(l.size(), 8u);
  EXPECT_EQ(l[0], AnyValue("hello"));
  EXPECT_EQ(l[1].asInt().size, 4);
  EXPECT_EQ(l[2].asFloat().value, 2.5);
  EXPECT_EQ(l[3].asInt().size, 0);
  EXPECT_TRUE(l[4].isVoid());
  // Object keys keep their document order.
  EXPECT_EQ(l[5].asMap()[0].first, AnyValue("b"));
  EXPECT_EQ(l[6].asInt().size, 8);
  EXPECT_EQ(l[7].asInt().size, 4);
}

// Deep nesting is refused too, not a crash.
TEST(Json, MalformedTextIsAClearError) {
  for (const std::string& text :
       {std::string("[1, "), std::string(), std::string("[\"a\"] trailing"),
        std::string(100000, '[') + std::string(100000, ']')})
    EXPECT_THROW(ko::fromJson(text), ko::JsonError) << text.substr(0, 20);
  const int ok = ko::kMaxJsonDepth - 1;
  EXPECT_NO_THROW(ko::fromJson(std::string(ok, '[') + std::string(ok, ']')));
}

TEST(Json, EncodesBack) {
  const std::string text = R"(["a",1,2.5,true,null,{"k":[1,2]}])";
  EXPECT_EQ(ko::toJson(ko::fromJson(text)).dump(), text);
  EXPECT_EQ(ko::toJson(AnyValue::raw({1, 255})).dump(), "[1,255]");
}

}  // namespace
