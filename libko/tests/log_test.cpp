#include <gtest/gtest.h>

#include <thread>

#include "ko/log.hpp"

namespace ko_log_test {

struct Widget {
  int formatted = 0;
  std::string expensive() {
    ++formatted;
    return "x";
  }
  void report(int n) { KO_LOG_WARNING("test.widget") << "value " << n; }
  void quietLine() { KO_LOG_DEBUG("test.quiet") << expensive(); }
};

}  // namespace ko_log_test

namespace {

using ko::log::Level;

TEST(Log, LineCarriesCategoryLevelAndQualifiedFunction) {
  ko::log::ScopedCapture cap;
  ko_log_test::Widget w;
  w.report(3);
  ASSERT_TRUE(cap->contains("test.widget", ko::log::Warning, "value 3"));
  const auto records = cap->records();
  ASSERT_EQ(records.size(), 1u);
  EXPECT_EQ(records[0].function, "ko_log_test::Widget::report");
}

TEST(Log, DisabledCategoryFormatsNothing) {
  ko::log::ScopedCapture cap;
  ko::log::setLevel("test.quiet", ko::log::Info);
  ko_log_test::Widget w;
  w.quietLine();
  EXPECT_EQ(w.formatted, 0);
  EXPECT_EQ(cap->count(), 0u);
  ko::log::setLevel("test.quiet", ko::log::Debug);
  w.quietLine();
  EXPECT_EQ(w.formatted, 1);
}

TEST(Log, RulesFirstMatchWinsAndNewerRulesGoFirst) {
  ko::log::ScopedCapture cap(ko::log::Info);
  ASSERT_TRUE(ko::log::setLevels("mokutotest.*=verbose,*=warning"));
  EXPECT_EQ(ko::log::category("mokutotest.parser").level(), ko::log::Verbose);
  EXPECT_EQ(ko::log::category("othertest").level(), ko::log::Warning);
  ko::log::setLevel("mokutotest.parser", ko::log::Silent);
  EXPECT_EQ(ko::log::category("mokutotest.parser").level(), ko::log::Silent);
  EXPECT_EQ(ko::log::category("mokutotest.loader").level(), ko::log::Verbose);
  EXPECT_FALSE(ko::log::setLevels("a=loud"));
  EXPECT_FALSE(ko::log::setLevels("=info"));
}

TEST(Log, LevelNamesAndNumbers) {
  Level l;
  ASSERT_TRUE(ko::log::parseLevel("5", l));
  EXPECT_EQ(l, ko::log::Verbose);
  ASSERT_TRUE(ko::log::parseLevel("warning", l));
  EXPECT_EQ(l, ko::log::Warning);
  EXPECT_FALSE(ko::log::parseLevel("7", l));
  EXPECT_STREQ(ko::log::levelName(ko::log::Debug), "debug");
}

TEST(Log, GlobMatching) {
  EXPECT_TRUE(ko::log::globMatch("*", "anything"));
  EXPECT_TRUE(ko::log::globMatch("mokuto.*", "mokuto.parser"));
  EXPECT_FALSE(ko::log::globMatch("mokuto.*", "Mokuto"));
  EXPECT_TRUE(ko::log::globMatch("*.p*r", "mokuto.parser"));
  EXPECT_FALSE(ko::log::globMatch("a*b", "acbd"));
}

struct NameCase {
  const char* pretty;
  const char* name;
};
class QualifiedName : public ::testing::TestWithParam<NameCase> {};
TEST_P(QualifiedName, IsExtractedFromPrettyFunction) {
  EXPECT_EQ(ko::log::qualifiedFunctionName(GetParam().pretty), GetParam().name);
}
INSTANTIATE_TEST_SUITE_P(
    Forms, QualifiedName,
    ::testing::Values(
        NameCase{"void ZU::MokutoConfig::fromZUValue(const ZU::ZUValue&)",
                 "ZU::MokutoConfig::fromZUValue"},
        NameCase{"int ZU::A::b() const", "ZU::A::b"},
        NameCase{"std::vector<std::basic_string<char> > ZU::A::list(int)", "ZU::A::list"},
        NameCase{"ZU::ZUMokuto::ZUMokuto(std::shared_ptr<ZU::ZUBroker>)", "ZU::ZUMokuto::ZUMokuto"},
        NameCase{"ZU::A::run()::<lambda()>", "ZU::A::run"},
        NameCase{"T ZU::B::get() [with T = int]", "ZU::B::get"},
        NameCase{"const std::string& ZU::ZUValue::str() const", "ZU::ZUValue::str"},
        NameCase{"std::ostream& ZU::operator<<(std::ostream&, const ZU::MokutoConfig&)",
                 "ZU::operator<<"},
        NameCase{"bool ZU::A::operator<(const ZU::A&) const", "ZU::A::operator<"},
        NameCase{"std::vector<int> ZU::A::operator>>(int)", "ZU::A::operator>>"},
        NameCase{"ZU::B* ZU::A::operator->()", "ZU::A::operator->"},
        NameCase{"void ZU::A::operator()(int)", "ZU::A::operator()"},
        NameCase{"ZU::ZUValue::operator const TZUValueString&() const",
                 "ZU::ZUValue::operator const TZUValueString&"},
        NameCase{"int ZU::Cooperator::operatorCount()", "ZU::Cooperator::operatorCount"},
        NameCase{"void ZU::A::operator()()::<lambda()>", "ZU::A::operator()"}));

TEST(Log, ConcurrentWritersAndLevelChanges) {
  ko::log::ScopedCapture cap(ko::log::Info);
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([t] {
      for (int i = 0; i < 200; ++i) {
        KO_LOG_INFO("test.concurrent") << t << ":" << i;
        if (i % 50 == 0)
          ko::log::category("test.concurrent" + std::to_string(i));
      }
    });
  }
  for (auto& th : threads)
    th.join();
  EXPECT_EQ(cap->count(), 800u);
}

}  // namespace
