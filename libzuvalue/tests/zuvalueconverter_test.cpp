#include "zu/zuvalueconverter.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "ko/json.hpp"
#include "zu/zuerror.h"

namespace {

using ko::AnyValue;
using ZU::ZUValue;

ZUValue binary(std::vector<unsigned char> bytes) {
  ZUValue v;
  v.binaryRef() = std::move(bytes);
  return v;
}

// A non-null object handle; nothing here ever calls through it.
ko::AnyObject fakeObject() {
  static int storage = 0;
  return ko::AnyObject(std::shared_ptr<void>(), reinterpret_cast<ko::GenericObject*>(&storage));
}

struct FromCase {
  const char* name;
  AnyValue any;
  const char* dump;
  ZUValue::Type type;
};

class FromAnyReferenceTest : public ::testing::TestWithParam<FromCase> {};

TEST_P(FromAnyReferenceTest, ConvertsEachKind) {
  const FromCase& c = GetParam();
  const ZUValue v = ZU::fromAnyReference(c.any);
  EXPECT_EQ(v.getType(), c.type);
  EXPECT_EQ(v.toString(1), c.dump);
}

INSTANTIATE_TEST_SUITE_P(
    Kinds, FromAnyReferenceTest,
    ::testing::Values(
        FromCase{"void", AnyValue::makeVoid(), "", ZUValue::TypeInvalid},
        FromCase{"boolean", AnyValue::boolean(true), "true", ZUValue::TypeBool},
        FromCase{"booleanFromNonZero", AnyValue::integer(7, 0), "true", ZUValue::TypeBool},
        FromCase{"booleanFalse", AnyValue::integer(0, 0), "false", ZUValue::TypeBool},
        FromCase{"int", AnyValue::integer(-5, 4), "-5", ZUValue::TypeInt},
        FromCase{"int64LowBits", AnyValue::integer(0x100000005LL, 8), "5", ZUValue::TypeInt},
        FromCase{"int64Negative", AnyValue::integer(0xFFFFFFFFLL, 8), "-1", ZUValue::TypeInt},
        FromCase{"byte", AnyValue::integer(200, 1, false), "200", ZUValue::TypeInt},
        FromCase{"double", AnyValue::floating(0.1, 8), "0.1", ZUValue::TypeFloat},
        FromCase{"string", AnyValue("hi"), "\"hi\"", ZUValue::TypeString},
        FromCase{"list", AnyValue::list({1, "a", AnyValue::list({})}), "[1, \"a\", []]",
                 ZUValue::TypeArray},
        FromCase{"map", AnyValue::map({{AnyValue("a"), AnyValue(1)}}), "[[\"a\", 1]]",
                 ZUValue::TypeArray},
        FromCase{"mapKeepsOrder",
                 AnyValue::map({{AnyValue("z"), AnyValue(1)}, {AnyValue(2), AnyValue(true)}}),
                 "[[\"z\", 1], [2, true]]", ZUValue::TypeArray},
        FromCase{"namedTuple", AnyValue::tuple({1, "x"}, {"id", "name"}, "Person"),
                 "[[\"id\", 1], [\"name\", \"x\"]]", ZUValue::TypeArray},
        FromCase{"anonymousTuple", AnyValue::tuple({1, 2.5}), "[1, 2.5]", ZUValue::TypeArray},
        FromCase{"dynamic", AnyValue::dynamic(AnyValue::list({3})), "[3]", ZUValue::TypeArray},
        FromCase{"raw", AnyValue::raw({1, 2, 255}), "\\1\\2\\255", ZUValue::TypeBinary},
        FromCase{"varArgs", AnyValue::varArgs({1, "b"}), "[1, \"b\"]", ZUValue::TypeArray}),
    [](const ::testing::TestParamInfo<FromCase>& p) { return p.param.name; });

TEST(FromAnyReferenceValueTest, FloatIsNarrowedToSinglePrecision) {
  const ZUValue v = ZU::fromAnyReference(AnyValue::floating(0.1));
  EXPECT_EQ(v.asFloat(), static_cast<double>(0.1f));
}

struct ErrorCase {
  const char* name;
  AnyValue any;
  const char* description;
};

class FromAnyReferenceErrorTest : public ::testing::TestWithParam<ErrorCase> {};

TEST_P(FromAnyReferenceErrorTest, RaisesTheConversionError) {
  const ErrorCase& c = GetParam();
  try {
    (void)ZU::fromAnyReference(c.any);
    FAIL() << "nothing thrown";
  } catch (const ZU::ZUError& e) {
    EXPECT_EQ(e.moduleName(), "ZUValue");
    EXPECT_EQ(e.methodName(), "conversion");
    EXPECT_EQ(e.description(), c.description);
    EXPECT_EQ(std::string(e.what()), std::string("\tZUValue::conversion\n\t") + c.description);
  }
}

INSTANTIATE_TEST_SUITE_P(
    Kinds, FromAnyReferenceErrorTest,
    ::testing::Values(
        ErrorCase{"none", AnyValue::none(), "NULL type"},
        ErrorCase{"object", AnyValue::object(fakeObject()), "object type not handled"},
        ErrorCase{"dynamicObject", AnyValue::dynamic(AnyValue::object(fakeObject())),
                  "object type not handled"},
        ErrorCase{"pointerToObject", AnyValue::pointerToObject(fakeObject()),
                  "object type not handled"},
        ErrorCase{"pointerToValue", AnyValue::pointerTo(AnyValue(1)), "pointer type not handled"},
        ErrorCase{"iterator", AnyValue::opaque(ko::Kind::Iterator), "iterator type not handled"},
        ErrorCase{"unknown", AnyValue::opaque(ko::Kind::Unknown), "unknown type not handled"},
        ErrorCase{"function", AnyValue::opaque(ko::Kind::Function),
                  "Signal and Property not handled"},
        ErrorCase{"signal", AnyValue::opaque(ko::Kind::Signal), "Signal and Property not handled"},
        ErrorCase{"property", AnyValue::opaque(ko::Kind::Property),
                  "Signal and Property not handled"},
        ErrorCase{"tupleNameCountMismatch", AnyValue::tuple({1, 2}, {"only"}),
                  "Mismatch struct size. size(variableName) != size(value)"},
        ErrorCase{"nestedInList", AnyValue::list({1, AnyValue::none()}), "NULL type"}),
    [](const ::testing::TestParamInfo<ErrorCase>& p) { return p.param.name; });

TEST(ToAnyReferenceTest, ConvertsEachType) {
  EXPECT_TRUE(ZU::toAnyReference(ZUValue()).isVoid());
  EXPECT_TRUE(ZU::toAnyReference(ZUValue::makeObject({'x'})).isVoid());
  EXPECT_EQ(ZU::toAnyReference(ZUValue::makeBool(true)), AnyValue::boolean(true));
  EXPECT_EQ(ZU::toAnyReference(ZUValue(-3)), AnyValue::integer(-3, 4, true));
  EXPECT_EQ(ZU::toAnyReference(ZUValue(0.5f)), AnyValue::floating(0.5, 4));
  EXPECT_EQ(ZU::toAnyReference(ZUValue("s")), AnyValue("s"));
  EXPECT_EQ(ZU::toAnyReference(binary({0, 9})), AnyValue::raw({0, 9}));
  EXPECT_EQ(ZU::toAnyReference(ZUValue::makeArray({1, ZUValue::makeArray({"a"}), ZUValue()})),
            AnyValue::list({AnyValue::integer(1, 4), AnyValue::list({"a"}), AnyValue()}));
}

TEST(ToAnyReferenceTest, RoundTripKeepsTheValue) {
  const ZUValue v = ZUValue::makeArray({ZUValue::makeArray({"bodyLanguageMode", "random"}),
                                        ZUValue::makeBool(false), 1.25f, binary({3}), ZUValue()});
  EXPECT_EQ(ZU::fromAnyReference(ZU::toAnyReference(v)).toString(1), v.toString(1));
}

TEST(FromAnyReferenceValueTest, JsonObjectBecomesPairs) {
  const ZUValue v = ZU::fromAnyReference(ko::fromJson(R"({"a": 1, "b": [true, null, 2.5]})"));
  EXPECT_EQ(v.toString(1), "[[\"a\", 1], [\"b\", [true, , 2.5]]]");
}

}  // namespace
