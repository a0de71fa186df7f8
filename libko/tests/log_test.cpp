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

TEST(Log, LevelNamesNumbersAndGlobs) {
  Level l;
  ASSERT_TRUE(ko::log::parseLevel("5", l));
  EXPECT_EQ(l, ko::log::Verbose);
  ASSERT_TRUE(ko::log::parseLevel("warning", l));
  EXPECT_EQ(l, ko::log::Warning);
  EXPECT_FALSE(ko::log::parseLevel("7", l));
  EXPECT_STREQ(ko::log::levelName(ko::log::Debug), "debug");
  const struct {
    const char *pattern, *text;
    bool matches;
  } globs[] = {{"*", "anything", true},
               {"mokuto.*", "mokuto.parser", true},
               {"mokuto.*", "Mokuto", false},
               {"*.p*r", "mokuto.parser", true},
               {"a*b", "acbd", false}};
  for (const auto& g : globs)
    EXPECT_EQ(ko::log::globMatch(g.pattern, g.text), g.matches) << g.pattern << " " << g.text;
}

TEST(Log, QualifiedNameIsExtractedFromPrettyFunction) {
  const std::pair<const char*, const char*> cases[] = {
      {"void ZU::MokutoConfig::fromZUValue(const ZU::ZUValue&)", "ZU::MokutoConfig::fromZUValue"},
      {"int ZU::A::b() const", "ZU::A::b"},
      {"std::vector<std::basic_string<char> > ZU::A::list(int)", "ZU::A::list"},
      {"ZU::ZUMokuto::ZUMokuto(std::shared_ptr<ZU::ZUBroker>)", "ZU::ZUMokuto::ZUMokuto"},
      {"ZU::A::run()::<lambda()>", "ZU::A::run"},
      {"T ZU::B::get() [with T = int]", "ZU::B::get"},
      {"const std::string& ZU::ZUValue::str() const", "ZU::ZUValue::str"},
      {"std::ostream& ZU::operator<<(std::ostream&, const ZU::MokutoConfig&)", "ZU::operator<<"},
      {"bool ZU::A::operator<(const ZU::A&) const", "ZU::A::operator<"},
      {"std::vector<int> ZU::A::operator>>(int)", "ZU::A::operator>>"},
      {"ZU::B* ZU::A::operator->()", "ZU::A::operator->"},
      {"void ZU::A::operator()(int)", "ZU::A::operator()"},
      {"ZU::ZUValue::operator const TZUValueString&() const",
       "ZU::ZUValue::operator const TZUValueString&"},
      {"int ZU::Cooperator::operatorCount()", "ZU::Cooperator::operatorCount"},
      {"void ZU::A::operator()()::<lambda()>", "ZU::A::operator()"}};
  for (const auto& [pretty, name] : cases)
    EXPECT_EQ(ko::log::qualifiedFunctionName(pretty), name);
}

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
