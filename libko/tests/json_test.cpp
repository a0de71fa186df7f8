#include <gtest/gtest.h>

#include "ko/json.hpp"

namespace {

using ko::AnyValue;

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

TEST(Json, MalformedTextIsAClearError) {
  EXPECT_THROW(ko::fromJson("[1, "), ko::JsonError);
  EXPECT_THROW(ko::fromJson(""), ko::JsonError);
  EXPECT_THROW(ko::fromJson("[\"a\"] trailing"), ko::JsonError);
}

TEST(Json, DeepNestingIsRefusedNotACrash) {
  const std::string deep(100000, '[');
  EXPECT_THROW(ko::fromJson(deep + std::string(100000, ']')), ko::JsonError);
  const int ok = ko::kMaxJsonDepth - 1;
  EXPECT_NO_THROW(ko::fromJson(std::string(ok, '[') + std::string(ok, ']')));
}

TEST(Json, EncodesBack) {
  const std::string text = R"(["a",1,2.5,true,null,{"k":[1,2]}])";
  EXPECT_EQ(ko::toJson(ko::fromJson(text)).dump(), text);
  EXPECT_EQ(ko::toJson(AnyValue::raw({1, 255})).dump(), "[1,255]");
}

}  // namespace
