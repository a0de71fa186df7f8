#include "zu/zuvalue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <climits>
#include <functional>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include "ko_test_helpers.hpp"
#include "zu/zuerror.h"

namespace {

using ko::test::errorOf;
using ::testing::StartsWith;
using ZU::ZUError;
using ZU::ZUValue;

ZUValue binary(std::vector<unsigned char> bytes) {
  ZUValue v;
  v.binaryRef() = std::move(bytes);
  return v;
}

TEST(ZUValueTypeTest, EachTypeHasItsNameAndArraySize) {
  const ZUValue values[] = {ZUValue(),
                            ZUValue::makeArray({1, 2}),
                            ZUValue::makeBool(true),
                            ZUValue(7),
                            ZUValue(1.5f),
                            ZUValue("abc"),
                            ZUValue::makeObject({'o', 'b'}),
                            binary({1, 2, 3, 4})};
  const char* names[] = {"Invalid", "Array", "Bool", "Int", "Float", "String", "Object", "Binary"};
  const int sizes[] = {0, 2, 0, 0, 0, 3, 2, 4};
  const char* dumps[] = {"", "[1, 2]", "true", "7", "1.5", "\"abc\"", "ob", "\\1\\2\\3\\4"};
  for (int t = 0; t < 8; ++t) {
    EXPECT_EQ(ZUValue::TypeToString(t), names[t]);
    EXPECT_EQ(values[t].getType(), t);
    EXPECT_EQ(values[t].arraySize(), sizes[t]) << names[t];
    EXPECT_EQ(values[t].toString(1), dumps[t]);
    EXPECT_EQ(values[t].toString(0), "");
  }
  EXPECT_EQ(
      ZUValue::makeArray({ZUValue::makeArray({}), ZUValue(), binary({255}), 1e-7f}).toString(),
      "[[], , \\255, 1e-07]");
  EXPECT_EQ(ZUValue("say \"hi\"").toString(1), "\"say \"hi\"\"");  // no escaping
  EXPECT_EQ(ZUValue(3.14159f).toString(1), "3.14159");             // six significant digits
}

TEST(ZUValueCopyTest, CopiesAreDeepAndSelfAssignmentIsSafe) {
  ZUValue original = ZUValue::makeArray({ZUValue::makeArray({1, "x"}), binary({9})});
  ZUValue copy(original);
  copy[0][1].stringRef() = "changed";
  copy[1].binaryRef().push_back(10);
  copy[0].arrayPush(3);
  ZUValue assigned;
  assigned = original;
  original[0][0] = 5;
  EXPECT_EQ(original.toString(), "[[5, \"x\"], \\9]");
  EXPECT_EQ(copy.toString(), "[[1, \"changed\", 3], \\9\\10]");
  EXPECT_EQ(assigned.toString(), "[[1, \"x\"], \\9]");

  ZUValue v = ZUValue::makeArray({ZUValue::makeArray({1, 2}), "a"});
  ZUValue& alias = v;
  v = alias;
  v = v[0];
  v.arrayPush(v);
  v.arrayPush(v[0]);
  EXPECT_EQ(v.toString(), "[1, 2, [1, 2], 1]");
  ZUValue moved(std::move(v));
  EXPECT_FALSE(v.isValid());  // NOLINT(bugprone-use-after-move)
  EXPECT_EQ(moved.arraySize(), 4);
}

TEST(ZUValueAssignTest, AssigningAnotherTypeReplacesTheContent) {
  ZUValue v = ZUValue::makeArray({1});
  v = "s";
  EXPECT_EQ(v.toString(), "\"s\"");
  v = 3;
  EXPECT_TRUE(v.isInt());
  v = 0.1;  // a double is narrowed to single precision
  EXPECT_EQ(v.asFloat(), static_cast<double>(0.1f));
  EXPECT_EQ(v.toString(), "0.1");
  v = std::string("back");
  EXPECT_EQ(v.toString(), "\"back\"");
  v.clear();
  EXPECT_EQ(v.getType(), ZUValue::TypeInvalid);
}

TEST(ZUValueReadTest, NumbersReadAsIntegersAndFloats) {
  const struct {
    ZUValue value;
    int expected;
  } cases[] = {
      {ZUValue(-12), -12},           {ZUValue::makeBool(true), 1},
      {ZUValue::makeBool(false), 0}, {ZUValue(2.9f), 2},
      {ZUValue(-2.9f), -2},          {ZUValue(1e20f), INT_MAX},
      {ZUValue(-1e20f), INT_MIN},    {ZUValue(std::numeric_limits<float>::quiet_NaN()), 0}};
  for (const auto& c : cases)
    EXPECT_EQ(c.value.asInt(), c.expected) << c.value.toString();
  EXPECT_EQ(ZUValue(3).asFloat(), 3.0);
}

// Every failure: module, method and description in one text.
TEST(ZUValueErrorTest, EachFailureRaisesItsText) {
  const ZUValue three = ZUValue::makeArray({1, 2, 3});
  ZUValue text("x"), four(4);
  std::vector<std::string> out;
  const std::string typeError = "\tZUValue::xAssertType: type error\n\tExpected a ";
  const std::string compatible = "\tZUValue::xAssertCompatibleType: type error\n\tExpected a ";
  const std::string sizeError = "\tZUValue::xAssertArraySize\n\t";
  const std::pair<std::function<void()>, std::string> cases[] = {
      {[] { ZUValue::TypeToString(8); }, "\tZUValue::TypeToString\n\tUnknown type: 8"},
      {[] { ZUValue::TypeToString(-1); }, "\tZUValue::TypeToString\n\tUnknown type: -1"},
      {[] { (void)ZUValue().asInt(); },
       typeError + "Int but received a Invalid (zuvalue contents:  )"},
      {[&] { (void)three.asInt(); },
       typeError + "Int but received a Array (zuvalue contents: [1, 2, 3] )"},
      {[] { (void)ZUValue("abc").asFloat(); },
       typeError + "Float but received a String (zuvalue contents: \"abc\" )"},
      {[&] { (void)three[0][0]; }, typeError + "Array but received a Int (zuvalue contents: 1 )"},
      {[&] { text.ToStringArray(out); },
       typeError + "Array but received a String (zuvalue contents: \"x\" )"},
      {[&] { (void)three[3]; },
       sizeError + "The array has a size of 3 and you want it to be of size 4"},
      {[&] { (void)three[-1]; }, sizeError + "Invalid negative index: -1"},
      {[] { ZUValue()[0] = 1; },
       sizeError + "The array has a size of 0 and you want it to be of size 1"},
      {[] { ZUValue::makeArray({}).arraySetSize(-1); },
       "\tZUValue::arraySetSize\n\tInvalid negative size: -1"},
      {[&] { four = static_cast<const char*>(nullptr); }, "\tZUValue::operator=\n\tAssert failed"},
      {[] { ZUValue(5).stringRef(); },
       compatible + "String but received a Int (zuvalue contents: 5 )"},
      {[&] { text.boolRef(); },
       compatible + "Bool but received a String (zuvalue contents: \"x\" )"},
      {[&] { text.floatRef(); }, compatible + "Float but received a String"},
      {[&] { text.binaryRef(); }, compatible + "Binary but received a String"},
      {[&] { (void)text[0]; }, compatible + "Array but received a String"},
      {[&] { text.arraySetSize(1); }, compatible + "Array but received a String"},
      {[&] { text.arrayPush(1); }, compatible + "Array but received a String"},
  };
  for (const auto& c : cases)
    EXPECT_THAT(errorOf(c.first), StartsWith(c.second));
  EXPECT_EQ(text.toString() + four.toString(), "\"x\"4");  // a failed check changes nothing

  ZUValue nowArray;  // ...but an Invalid value has become an Array before its size check
  EXPECT_NE(errorOf([&] { nowArray[0] = 1; }), "<none>");
  EXPECT_EQ(nowArray.toString(), "[]");
}

TEST(ZUValueReadTest, BinaryReadAsStringBecomesAStringUnlessTooLarge) {
  const ZUValue v = binary({'h', 'i', 0, 'x'});
  ::testing::internal::CaptureStdout();
  const std::string& s = v.asString();
  EXPECT_EQ(::testing::internal::GetCapturedStdout(),
            "WARNING: ZUValue::operator const TZUValueString&: creating a string on the fly to "
            "patch possible ruby encoding problem (size of binary: 4)\n");
  EXPECT_EQ(s, std::string("hi\0x", 4));
  EXPECT_TRUE(v.isString());

  const ZUValue large = binary(std::vector<unsigned char>(100000, 'a'));
  EXPECT_THAT(errorOf([&] { (void)large.asString(); }),
              StartsWith("\tZUValue::xAssertType: type error\n\tExpected a String but received a "
                         "Binary (zuvalue contents: \\97\\97"));
  EXPECT_TRUE(large.isBinary());
  ::testing::internal::CaptureStdout();
  EXPECT_EQ(binary(std::vector<unsigned char>(99999, 'a')).asString().size(), 99999u);
  EXPECT_THAT(::testing::internal::GetCapturedStdout(), ::testing::HasSubstr("binary: 99999)"));
}

TEST(ZUValueReadTest, ToStringArrayReportsNonStringsAndInsertsEmptyOnlyWhenAsked) {
  const ZUValue v = ZUValue::makeArray({"a", 1, "b", binary({1})});
  const std::string skipped = "WARNING: ZUValue::ToStringArray: elem 1 is not a string...\n";
  std::vector<std::string> out{"old"};
  for (const bool insertEmpty : {false, true}) {
    ::testing::internal::CaptureStdout();
    v.ToStringArray(out, insertEmpty);
    const std::string also = insertEmpty ? "...inserting an empty string.\n" : "";
    EXPECT_EQ(
        ::testing::internal::GetCapturedStdout(),
        skipped + also + "WARNING: ZUValue::ToStringArray: elem 3 is not a string...\n" + also);
    const std::vector<std::string> expected = insertEmpty
                                                  ? std::vector<std::string>{"a", "", "b", ""}
                                                  : std::vector<std::string>{"a", "b"};
    EXPECT_EQ(out, expected);
  }
}

TEST(ZUValueMutableTest, AccessorsTurnInvalidIntoTheirTypeAndIntIntoBoolOrFloat) {
  ZUValue b, f, s, bin, a, p, fromInt(5), floatFromInt(3), assigned(3);
  EXPECT_FALSE(b.boolRef());
  EXPECT_EQ(f.floatRef(), 0.0f);
  EXPECT_GE(s.stringRef().capacity(), 64u);
  EXPECT_GE(bin.binaryRef().capacity(), 1024u);
  assigned = "x";
  EXPECT_GE(assigned.stringRef().capacity(), 64u);
  a.arraySetSize(2);
  p.arrayPush(ZUValue::makeBool(false));
  fromInt.boolRef() = fromInt.boolRef();
  floatFromInt.floatRef() += 0.5f;
  EXPECT_EQ(ZUValue::makeArray({b, f, s, bin, a, p, fromInt, floatFromInt}).toString(),
            "[false, 0, \"\", , [, ], [false], true, 3.5]");
  // Elements keep their addresses while the array grows within its reserve of 32.
  const ZUValue* first = &p[0];
  for (int i = 1; i < 32; ++i)
    p.arrayPush(i);
  EXPECT_EQ(&p[0], first);
  p.arraySetSize(2);
  EXPECT_EQ(p.toString(), "[false, 1]");
}

TEST(ZUErrorTest, TextJoinsThePiecesThatAreGiven) {
  const struct {
    const char *module, *method, *description, *text;
  } cases[] = {{"ZUValue", "conversion", "NULL type", "\tZUValue::conversion\n\tNULL type"},
               {"", "setBodyLanguageMode", "bad", "\t::setBodyLanguageMode\n\tbad"},
               {"ZUMokuto", "", "bad", "\tZUMokuto\n\tbad"},
               {"", "", "only this", "\t\n\tonly this"},
               {"ZUMokuto", "say", "", "\tZUMokuto::say\n\t"}};
  for (const auto& c : cases) {
    const ZU::ZUError error(c.module, c.method, c.description);
    EXPECT_STREQ(error.what(), c.text);
    EXPECT_EQ(error.moduleName() + "|" + error.methodName() + "|" + error.description(),
              std::string(c.module) + "|" + c.method + "|" + c.description);
  }
}

TEST(ZUErrorTest, ThrowMacroRecordsFileAndLine) {
  const int line = __LINE__ + 2;
  try {
    ZU_THROW_ERROR("ZUMokuto", "say", std::string("failed"));
  } catch (const ZUError& error) {
    EXPECT_EQ(error.sourceLine(), line);
    EXPECT_EQ(error.sourceFile(), __FILE__);
    EXPECT_STREQ(error.what(), "\tZUMokuto::say\n\tfailed");
  }
}

}  // namespace
