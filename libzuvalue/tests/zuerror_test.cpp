#include "zu/zuerror.h"

#include <gtest/gtest.h>

#include <string>

namespace {

struct TextCase {
  const char* moduleName;
  const char* methodName;
  const char* description;
  const char* text;
};

class ZUErrorTextTest : public ::testing::TestWithParam<TextCase> {};

TEST_P(ZUErrorTextTest, WhatJoinsThePiecesThatAreGiven) {
  const TextCase& c = GetParam();
  const ZU::ZUError error(c.moduleName, c.methodName, c.description);
  EXPECT_STREQ(error.what(), c.text);
  EXPECT_EQ(error.moduleName(), c.moduleName);
  EXPECT_EQ(error.methodName(), c.methodName);
  EXPECT_EQ(error.description(), c.description);
}

INSTANTIATE_TEST_SUITE_P(Pieces, ZUErrorTextTest,
                         ::testing::Values(TextCase{"ZUValue", "conversion", "NULL type",
                                                    "\tZUValue::conversion\n\tNULL type"},
                                           TextCase{"", "setBodyLanguageMode", "bad",
                                                    "\t::setBodyLanguageMode\n\tbad"},
                                           TextCase{"ZUMokuto", "", "bad", "\tZUMokuto\n\tbad"},
                                           TextCase{"", "", "only this", "\t\n\tonly this"},
                                           TextCase{"ZUMokuto", "say", "", "\tZUMokuto::say\n\t"}));

TEST(ZUErrorTest, ThrowMacroRecordsFileAndLine) {
  int line = 0;
  try {
    line = __LINE__ + 1;
    ZU_THROW_ERROR("ZUMokuto", "say", std::string("failed"));
  } catch (const std::exception& e) {
    const auto* error = dynamic_cast<const ZU::ZUError*>(&e);
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->sourceLine(), line);
    EXPECT_EQ(error->sourceFile(), __FILE__);
    EXPECT_STREQ(error->what(), "\tZUMokuto::say\n\tfailed");
    return;
  }
  FAIL() << "nothing thrown";
}

}  // namespace
