#include "zu/zuvalue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cinttypes>
#include <climits>
#include <cmath>
#include <cstdio>
#include <functional>
#include <limits>
#include <string>
#include <vector>

#include "zu/zuerror.h"

namespace {

using ZU::ZUError;
using ZU::ZUValue;

// The error thrown by f; fails the test when f throws nothing.
ZUError errorOf(const std::function<void()>& f) {
  try {
    f();
  } catch (const ZUError& e) {
    return e;
  }
  ADD_FAILURE() << "no ZUError thrown";
  return ZUError("", "", "");
}

std::string hexWord(std::uintptr_t word) {
  char buf[32];
  std::snprintf(buf, sizeof buf, "%0*" PRIXPTR, static_cast<int>(2 * sizeof(void*)), word);
  return buf;
}

std::string header(const ZUValue& v, const char* type, std::uintptr_t word) {
  return "ZuValue at 0x" + hexWord(reinterpret_cast<std::uintptr_t>(&v)) + ", Type: " + type +
         ", Value: 0x" + hexWord(word) + ", ";
}

ZUValue binary(std::vector<unsigned char> bytes) {
  ZUValue v;
  v.binaryRef() = std::move(bytes);
  return v;
}

// One value of each type.
std::vector<ZUValue> oneOfEach() {
  return {ZUValue(),
          ZUValue::makeArray({1, 2}),
          ZUValue::makeBool(true),
          ZUValue(7),
          ZUValue(1.5f),
          ZUValue("abc"),
          ZUValue::makeObject({'o', 'b'}),
          binary({1, 2, 3, 4})};
}

TEST(ZUValueTypeTest, TypeToStringNamesEveryTypeAndRejectsOthers) {
  const char* names[] = {"Invalid", "Array", "Bool", "Int", "Float", "String", "Object", "Binary"};
  for (int t = 0; t < 8; ++t)
    EXPECT_EQ(ZUValue::TypeToString(t), names[t]);
  for (int t : {8, -1}) {
    const ZUError e = errorOf([t] { ZUValue::TypeToString(t); });
    EXPECT_EQ(e.moduleName(), "ZUValue");
    EXPECT_EQ(e.methodName(), "TypeToString");
    EXPECT_EQ(e.description(), "Unknown type: " + std::to_string(t));
  }
}

TEST(ZUValueTypeTest, OneOfEachHasItsTypeAndArraySize) {
  const std::vector<ZUValue> values = oneOfEach();
  const int sizes[] = {0, 2, 0, 0, 0, 3, 2, 4};
  for (int t = 0; t < 8; ++t) {
    const ZUValue& v = values[static_cast<std::size_t>(t)];
    EXPECT_EQ(v.getType(), t);
    EXPECT_EQ(v.arraySize(), sizes[t]) << ZUValue::TypeToString(t);
  }
}

// ---- construction, copies, assignment ----

TEST(ZUValueCopyTest, CopiesAreDeep) {
  ZUValue original = ZUValue::makeArray({ZUValue::makeArray({1, "x"}), binary({9})});
  ZUValue copy(original);
  copy[0][1].stringRef() = "changed";
  copy[1].binaryRef().push_back(10);
  copy[0].arrayPush(3);
  EXPECT_EQ(original.toString(), "[[1, \"x\"], \\9]");
  EXPECT_EQ(copy.toString(), "[[1, \"changed\", 3], \\9\\10]");

  ZUValue assigned;
  assigned = original;
  original[0][0] = 5;
  EXPECT_EQ(assigned.toString(), "[[1, \"x\"], \\9]");
}

TEST(ZUValueCopyTest, SelfAssignmentAndAssignmentFromOwnElementAreSafe) {
  ZUValue v = ZUValue::makeArray({ZUValue::makeArray({1, 2}), "a"});
  ZUValue& alias = v;
  v = alias;
  EXPECT_EQ(v.toString(), "[[1, 2], \"a\"]");
  v = v[0];
  EXPECT_EQ(v.toString(), "[1, 2]");
  v.arrayPush(v);
  v.arrayPush(v[0]);
  EXPECT_EQ(v.toString(), "[1, 2, [1, 2], 1]");
}

TEST(ZUValueCopyTest, MovedFromValueIsInvalid) {
  ZUValue v("text");
  ZUValue moved(std::move(v));
  EXPECT_FALSE(v.isValid());  // NOLINT(bugprone-use-after-move)
  EXPECT_EQ(moved.toString(), "\"text\"");
}

TEST(ZUValueAssignTest, AssigningAnotherTypeReplacesTheContent) {
  ZUValue v = ZUValue::makeArray({1});
  v = "s";
  EXPECT_TRUE(v.isString());
  EXPECT_EQ(v.asString(), "s");
  v = 3;
  EXPECT_TRUE(v.isInt());
  v = 0.25f;
  EXPECT_TRUE(v.isFloat());
  v = std::string("back");
  EXPECT_EQ(v.toString(), "\"back\"");
  v.clear();
  EXPECT_FALSE(v.isValid());
  EXPECT_EQ(v.toString(), "");
}

TEST(ZUValueAssignTest, NullCharacterStringRaisesAssertFailedAndChangesNothing) {
  ZUValue v(4);
  const ZUError e = errorOf([&v] { v = static_cast<const char*>(nullptr); });
  EXPECT_STREQ(e.what(), "\tZUValue::operator=\n\tAssert failed");
  EXPECT_EQ(v.toString(), "4");
}

TEST(ZUValueAssignTest, ADoubleIsNarrowedToSinglePrecision) {
  ZUValue v;
  v = 0.1;
  EXPECT_TRUE(v.isFloat());
  EXPECT_EQ(v.asFloat(), static_cast<double>(0.1f));
  EXPECT_NE(v.asFloat(), 0.1);
  EXPECT_EQ(v.toString(), "0.1");
}

// ---- reads ----

struct IntReadCase {
  ZUValue value;
  int expected;
};

class ZUValueIntReadTest : public ::testing::TestWithParam<IntReadCase> {};

TEST_P(ZUValueIntReadTest, ReadsNumbersAsIntegers) {
  const IntReadCase& c = GetParam();
  EXPECT_EQ(c.value.asInt(), c.expected) << c.value.toString();
}

INSTANTIATE_TEST_SUITE_P(
    Numbers, ZUValueIntReadTest,
    ::testing::Values(IntReadCase{ZUValue(-12), -12}, IntReadCase{ZUValue::makeBool(true), 1},
                      IntReadCase{ZUValue::makeBool(false), 0}, IntReadCase{ZUValue(2.9f), 2},
                      IntReadCase{ZUValue(-2.9f), -2}, IntReadCase{ZUValue(1e20f), INT_MAX},
                      IntReadCase{ZUValue(-1e20f), INT_MIN},
                      IntReadCase{ZUValue(std::numeric_limits<float>::quiet_NaN()), 0}));

TEST(ZUValueReadTest, NonNumericValuesReadAsIntegersRaiseTheTypeError) {
  const std::vector<ZUValue> values = oneOfEach();
  const char* contents[] = {"",      "[1, 2]",  nullptr, nullptr,
                            nullptr, "\"abc\"", "ob",    "\\1\\2\\3\\4"};
  for (int t : {0, 1, 5, 6, 7}) {
    const ZUValue& v = values[static_cast<std::size_t>(t)];
    const ZUError e = errorOf([&v] { (void)v.asInt(); });
    EXPECT_EQ(e.moduleName(), "ZUValue");
    EXPECT_EQ(e.methodName(), "xAssertType: type error");
    EXPECT_EQ(e.description(), "Expected a Int but received a " + ZUValue::TypeToString(t) +
                                   " (zuvalue contents: " + contents[t] + " )");
  }
}

TEST(ZUValueReadTest, StringReadAsFloatRaisesTheTypeErrorWithItsContents) {
  const ZUValue v("abc");
  const ZUError e = errorOf([&v] { (void)v.asFloat(); });
  EXPECT_STREQ(e.what(),
               "\tZUValue::xAssertType: type error\n"
               "\tExpected a Float but received a String (zuvalue contents: \"abc\" )");
  EXPECT_EQ(ZUValue(3).asFloat(), 3.0);
}

TEST(ZUValueReadTest, ReadingOutsideAnArrayRaisesTheSizeError) {
  const ZUValue v = ZUValue::makeArray({1, 2, 3});
  EXPECT_EQ(v[2].asInt(), 3);
  ZUError e = errorOf([&v] { (void)v[3]; });
  EXPECT_STREQ(e.what(),
               "\tZUValue::xAssertArraySize\n"
               "\tThe array has a size of 3 and you want it to be of size 4");
  e = errorOf([&v] { (void)v[-1]; });
  EXPECT_EQ(e.methodName(), "xAssertArraySize");

  const ZUValue notArray(5);
  e = errorOf([&notArray] { (void)notArray[0]; });
  EXPECT_EQ(e.description(), "Expected a Array but received a Int (zuvalue contents: 5 )");
}

TEST(ZUValueReadTest, BinaryReadAsStringBecomesAStringWithAWarning) {
  const ZUValue v = binary({'h', 'i', 0, 'x'});
  ::testing::internal::CaptureStdout();
  const std::string& s = v.asString();
  const std::string out = ::testing::internal::GetCapturedStdout();
  EXPECT_EQ(out,
            "WARNING: ZUValue::operator const TZUValueString&: creating a string on the fly to "
            "patch possible ruby encoding problem (size of binary: 4)\n");
  EXPECT_EQ(s, std::string("hi\0x", 4));
  EXPECT_TRUE(v.isString());
}

TEST(ZUValueReadTest, LargeBinaryReadAsStringRaisesTheTypeError) {
  const ZUValue v = binary(std::vector<unsigned char>(100000, 'a'));
  ::testing::internal::CaptureStdout();
  const ZUError e = errorOf([&v] { (void)v.asString(); });
  EXPECT_EQ(::testing::internal::GetCapturedStdout(), "");
  EXPECT_EQ(e.methodName(), "xAssertType: type error");
  EXPECT_THAT(e.description(),
              ::testing::StartsWith("Expected a String but received a Binary (zuvalue contents: "));
  EXPECT_TRUE(v.isBinary());

  ::testing::internal::CaptureStdout();
  EXPECT_EQ(binary(std::vector<unsigned char>(99999, 'a')).asString().size(), 99999u);
  EXPECT_THAT(::testing::internal::GetCapturedStdout(),
              ::testing::HasSubstr("(size of binary: 99999)\n"));
}

TEST(ZUValueReadTest, ToStringArrayReportsNonStringsAndInsertsEmptyOnlyWhenAsked) {
  const ZUValue v = ZUValue::makeArray({"a", 1, "b", binary({1})});
  std::vector<std::string> out{"old"};

  ::testing::internal::CaptureStdout();
  v.ToStringArray(out);
  EXPECT_EQ(::testing::internal::GetCapturedStdout(),
            "WARNING: ZUValue::ToStringArray: elem 1 is not a string...\n"
            "WARNING: ZUValue::ToStringArray: elem 3 is not a string...\n");
  EXPECT_EQ(out, (std::vector<std::string>{"a", "b"}));

  ::testing::internal::CaptureStdout();
  v.ToStringArray(out, true);
  EXPECT_EQ(::testing::internal::GetCapturedStdout(),
            "WARNING: ZUValue::ToStringArray: elem 1 is not a string...\n"
            "...inserting an empty string.\n"
            "WARNING: ZUValue::ToStringArray: elem 3 is not a string...\n"
            "...inserting an empty string.\n");
  EXPECT_EQ(out, (std::vector<std::string>{"a", "", "b", ""}));

  const ZUError e = errorOf([&out] { ZUValue("a").ToStringArray(out); });
  EXPECT_EQ(e.methodName(), "xAssertType: type error");
  EXPECT_EQ(out.size(), 4u);
}

// ---- mutable accessors ----

TEST(ZUValueMutableTest, InvalidValueTakesTheAccessorsType) {
  ZUValue b;
  EXPECT_FALSE(b.boolRef());
  EXPECT_TRUE(b.isBool());
  ZUValue f;
  EXPECT_EQ(f.floatRef(), 0.0f);
  EXPECT_TRUE(f.isFloat());
  ZUValue s;
  EXPECT_EQ(s.stringRef(), "");
  EXPECT_TRUE(s.isString());
  ZUValue bin;
  EXPECT_TRUE(bin.binaryRef().empty());
  EXPECT_TRUE(bin.isBinary());
  ZUValue a;
  a.arraySetSize(2);
  EXPECT_EQ(a.toString(), "[, ]");
  ZUValue p;
  p.arrayPush(ZUValue::makeBool(false));
  EXPECT_EQ(p.toString(), "[false]");
}

TEST(ZUValueMutableTest, NewContentReservesItsRoom) {
  ZUValue s;
  EXPECT_GE(s.stringRef().capacity(), 64u);
  ZUValue assigned(3);
  assigned = "x";
  EXPECT_GE(assigned.stringRef().capacity(), 64u);
  ZUValue bin;
  EXPECT_GE(bin.binaryRef().capacity(), 1024u);
  ZUValue a;
  a.arrayPush(1);
  // Elements keep their addresses while the array grows within its reserve.
  const ZUValue* first = &a[0];
  for (int i = 1; i < 32; ++i)
    a.arrayPush(i);
  EXPECT_EQ(&a[0], first);
}

TEST(ZUValueMutableTest, IntIsTurnedIntoBoolOrFloatInPlace) {
  ZUValue b(5);
  b.boolRef() = b.boolRef();
  EXPECT_EQ(b.toString(), "true");
  ZUValue f(3);
  f.floatRef() += 0.5f;
  EXPECT_EQ(f.toString(), "3.5");
}

TEST(ZUValueMutableTest, OtherTypesRaiseTheCompatibleTypeError) {
  ZUValue v(5);
  ZUError e = errorOf([&v] { v.stringRef(); });
  EXPECT_STREQ(e.what(),
               "\tZUValue::xAssertCompatibleType: type error\n"
               "\tExpected a String but received a Int (zuvalue contents: 5 )");
  ZUValue s("x");
  for (const auto& access : std::vector<std::function<void()>>{
           [&s] { s.boolRef(); }, [&s] { s.floatRef(); }, [&s] { s.binaryRef(); },
           [&s] { (void)s[0]; }, [&s] { s.arraySetSize(1); }, [&s] { s.arrayPush(1); }}) {
    e = errorOf(access);
    EXPECT_EQ(e.methodName(), "xAssertCompatibleType: type error");
  }
  EXPECT_EQ(s.toString(), "\"x\"");
}

TEST(ZUValueMutableTest, ElementAccessOnInvalidMakesAnEmptyArrayThenRaisesTheSizeError) {
  ZUValue v;
  const ZUError e = errorOf([&v] { v[0] = 1; });
  EXPECT_STREQ(e.what(),
               "\tZUValue::xAssertArraySize\n"
               "\tThe array has a size of 0 and you want it to be of size 1");
  EXPECT_TRUE(v.isArray());
  EXPECT_EQ(v.arraySize(), 0);
}

TEST(ZUValueMutableTest, ArraySetSizeAddsInvalidElementsAndShrinks) {
  ZUValue v = ZUValue::makeArray({1, 2, 3});
  v.arraySetSize(4);
  EXPECT_FALSE(v[3].isValid());
  v[3] = "d";
  v.arraySetSize(2);
  EXPECT_EQ(v.toString(), "[1, 2]");
  EXPECT_THROW(v.arraySetSize(-1), ZUError);
  EXPECT_EQ(v.arraySize(), 2);
}

// ---- textual dump ----

TEST(ZUValueDumpTest, CompactFormOfEveryType) {
  EXPECT_EQ(ZUValue::makeArray({42, 0.5f, "abc"}).toString(1), "[42, 0.5, \"abc\"]");
  EXPECT_EQ(
      ZUValue::makeArray({ZUValue::makeArray({}), ZUValue::makeBool(false), ZUValue()}).toString(1),
      "[[], false, ]");
  EXPECT_EQ(binary({1, 2, 255}).toString(1), "\\1\\2\\255");
  EXPECT_EQ(ZUValue::makeObject({'{', 'x', '}'}).toString(1), "{x}");
  EXPECT_EQ(ZUValue("say \"hi\"").toString(1), "\"say \"hi\"\"");
  EXPECT_EQ(ZUValue(1e-7f).toString(1), "1e-07");
  EXPECT_EQ(ZUValue(3.14159f).toString(1), "3.14159");
  for (const ZUValue& v : oneOfEach())
    EXPECT_EQ(v.toString(0), "");
}

TEST(ZUValueDumpTest, DefaultValueAtVerbosityThree) {
  const ZUValue v;
  EXPECT_EQ(v.toString(), "");
  EXPECT_EQ(v.toString(3), "\n<ZuValue>" + header(v, "Invalid", 0) + "\n</ZuValue>\n");
}

TEST(ZUValueDumpTest, VerbosityTwoShowsTypesAddressesAndStorageWords) {
  const ZUValue i(42);
  EXPECT_EQ(i.toString(2), header(i, "Int", 42) + "Int: 0x0000002A (42)");
  const ZUValue neg(-1);
  EXPECT_EQ(neg.toString(2), header(neg, "Int", 0xFFFFFFFFu) + "Int: 0xFFFFFFFF (-1)");
  const ZUValue b = ZUValue::makeBool(true);
  EXPECT_EQ(b.toString(2), header(b, "Bool", 1) + "Bool:true");
  const ZUValue f(0.5f);
  EXPECT_EQ(f.toString(2), header(f, "Float", 0x3F000000u) + "Float: 0.5");
  const ZUValue s("ab");
  EXPECT_EQ(s.toString(2), header(s, "String", reinterpret_cast<std::uintptr_t>(&s.asString())) +
                               "String of size 2: \"ab\"");
  const ZUValue bin = binary({7});
  EXPECT_EQ(bin.toString(2),
            header(bin, "Binary", reinterpret_cast<std::uintptr_t>(&bin.asBinary())) + "\\7");

  const ZUValue a = ZUValue::makeArray({1, ZUValue::makeBool(false)});
  const std::string dump = a.toString(2);
  const std::string elems =
      header(a[0], "Int", 1) + "Int: 0x00000001 (1), " + header(a[1], "Bool", 0) + "Bool:false]";
  EXPECT_THAT(
      dump, ::testing::StartsWith("ZuValue at 0x" + hexWord(reinterpret_cast<std::uintptr_t>(&a)) +
                                  ", Type: Array, Value: 0x"));
  EXPECT_THAT(dump, ::testing::EndsWith(", [Vector of 2 elem(s):" + elems));
}

TEST(ZUValueDumpTest, VerbosityThreeIsTagged) {
  const ZUValue i(7);
  EXPECT_EQ(i.toString(3),
            "\n<ZuValue>" + header(i, "Int", 7) + "Int: 0x00000007 (7)\n\n</ZuValue>\n");
  const ZUValue bin = binary({1, 200});
  EXPECT_EQ(bin.toString(3),
            "\n<ZuValue>" +
                header(bin, "Binary", reinterpret_cast<std::uintptr_t>(&bin.asBinary())) +
                "\n<Binary>Binary: 2 bytes(s):\n\\1\\200</Binary>\n\n</ZuValue>\n");
  const ZUValue a = ZUValue::makeArray({"x"});
  const std::string dump = a.toString(3);
  EXPECT_THAT(dump,
              ::testing::EndsWith(
                  ", \n<Vector>Vector of 1 elem(s):\n<elem>\n\n<ZuValue>" +
                  header(a[0], "String", reinterpret_cast<std::uintptr_t>(&a[0].asString())) +
                  "String of size 1: \"x\"\n\n</ZuValue>\n\n</elem>\n</Vector>\n</ZuValue>\n"));
}

}  // namespace
