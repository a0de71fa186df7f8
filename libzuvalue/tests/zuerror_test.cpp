#include "zu/zuerror.h"

#include <gtest/gtest.h>

#include <string>

namespace {

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
  } catch (const ZU::ZUError& error) {
    EXPECT_EQ(error.sourceLine(), line);
    EXPECT_EQ(error.sourceFile(), __FILE__);
    EXPECT_STREQ(error.what(), "\tZUMokuto::say\n\tfailed");
  }
}

}  // namespace
