#include "zu/zuvalueconverter.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "ko/json.hpp"
#include "ko_test_helpers.hpp"

namespace {

using ko::AnyValue;
using ZU::ZUValue;

// A non-null object handle; nothing here ever calls through it.
ko::AnyObject fakeObject() {
  static int storage = 0;
  return ko::AnyObject(std::shared_ptr<void>(), reinterpret_cast<ko::GenericObject*>(&storage));
}

TEST(FromAnyReferenceTest, ConvertsEachKind) {
  const struct {
    AnyValue any;
    const char* dump;
    ZUValue::Type type;
  } cases[] = {
      {AnyValue::makeVoid(), "", ZUValue::TypeInvalid},
      {AnyValue::boolean(true), "true", ZUValue::TypeBool},
      {AnyValue::integer(7, 0), "true", ZUValue::TypeBool},
      {AnyValue::integer(0, 0), "false", ZUValue::TypeBool},
      {AnyValue::integer(-5, 4), "-5", ZUValue::TypeInt},
      {AnyValue::integer(0x100000005LL, 8), "5", ZUValue::TypeInt},
      {AnyValue::integer(0xFFFFFFFFLL, 8), "-1", ZUValue::TypeInt},
      {AnyValue::integer(200, 1, false), "200", ZUValue::TypeInt},
      {AnyValue::floating(0.1, 8), "0.1", ZUValue::TypeFloat},
      {AnyValue("hi"), "\"hi\"", ZUValue::TypeString},
      {AnyValue::list({1, "a", AnyValue::list({})}), "[1, \"a\", []]", ZUValue::TypeArray},
      {AnyValue::map({{AnyValue("z"), AnyValue(1)}, {AnyValue(2), AnyValue(true)}}),
       "[[\"z\", 1], [2, true]]", ZUValue::TypeArray},
      {AnyValue::tuple({1, "x"}, {"id", "name"}, "Person"), "[[\"id\", 1], [\"name\", \"x\"]]",
       ZUValue::TypeArray},
      {AnyValue::tuple({1, 2.5}), "[1, 2.5]", ZUValue::TypeArray},
      {AnyValue::dynamic(AnyValue::list({3})), "[3]", ZUValue::TypeArray},
      {AnyValue::raw({1, 2, 255}), "\\1\\2\\255", ZUValue::TypeBinary},
      {AnyValue::varArgs({1, "b"}), "[1, \"b\"]", ZUValue::TypeArray},
      {ko::fromJson(R"({"a": 1, "b": [true, null, 2.5]})"), "[[\"a\", 1], [\"b\", [true, , 2.5]]]",
       ZUValue::TypeArray},
  };
  for (const auto& c : cases) {
    const ZUValue v = ZU::fromAnyReference(c.any);
    EXPECT_EQ(v.getType(), c.type) << c.dump;
    EXPECT_EQ(v.toString(1), c.dump);
  }
  EXPECT_EQ(ZU::fromAnyReference(AnyValue::floating(0.1)).asFloat(), static_cast<double>(0.1f));
}

TEST(FromAnyReferenceTest, KindsThatDoNotConvertRaiseTheConversionError) {
  const std::pair<AnyValue, const char*> cases[] = {
      {AnyValue::none(), "NULL type"},
      {AnyValue::object(fakeObject()), "object type not handled"},
      {AnyValue::dynamic(AnyValue::object(fakeObject())), "object type not handled"},
      {AnyValue::pointerToObject(fakeObject()), "object type not handled"},
      {AnyValue::pointerTo(AnyValue(1)), "pointer type not handled"},
      {AnyValue::opaque(ko::Kind::Iterator), "iterator type not handled"},
      {AnyValue::opaque(ko::Kind::Unknown), "unknown type not handled"},
      {AnyValue::opaque(ko::Kind::Function), "Signal and Property not handled"},
      {AnyValue::opaque(ko::Kind::Signal), "Signal and Property not handled"},
      {AnyValue::opaque(ko::Kind::Property), "Signal and Property not handled"},
      {AnyValue::tuple({1, 2}, {"only"}),
       "Mismatch struct size. size(variableName) != size(value)"},
      {AnyValue::list({1, AnyValue::none()}), "NULL type"},
  };
  for (const auto& [any, description] : cases) {
    EXPECT_EQ(ko::test::errorOf([&] { (void)ZU::fromAnyReference(any); }),
              std::string("\tZUValue::conversion\n\t") + description);
  }
}

TEST(ToAnyReferenceTest, ConvertsEachTypeAndBack) {
  ZUValue bytes;
  bytes.binaryRef() = {0, 9};
  EXPECT_TRUE(ZU::toAnyReference(ZUValue()).isVoid());
  EXPECT_TRUE(ZU::toAnyReference(ZUValue::makeObject({'x'})).isVoid());
  EXPECT_EQ(ZU::toAnyReference(ZUValue::makeBool(true)), AnyValue::boolean(true));
  EXPECT_EQ(ZU::toAnyReference(ZUValue(-3)), AnyValue::integer(-3, 4, true));
  EXPECT_EQ(ZU::toAnyReference(ZUValue(0.5f)), AnyValue::floating(0.5, 4));
  EXPECT_EQ(ZU::toAnyReference(ZUValue("s")), AnyValue("s"));
  EXPECT_EQ(ZU::toAnyReference(bytes), AnyValue::raw({0, 9}));
  EXPECT_EQ(ZU::toAnyReference(ZUValue::makeArray({1, ZUValue::makeArray({"a"}), ZUValue()})),
            AnyValue::list({AnyValue::integer(1, 4), AnyValue::list({"a"}), AnyValue()}));

  const ZUValue v = ZUValue::makeArray({ZUValue::makeArray({"bodyLanguageMode", "random"}),
                                        ZUValue::makeBool(false), 1.25f, bytes, ZUValue()});
  EXPECT_EQ(ZU::fromAnyReference(ZU::toAnyReference(v)).toString(1), v.toString(1));
}

}  // namespace
