// The compiler stage: the speech engine's language decides the Japanese pause rule, the
// parse fills the job, and a speech engine that cannot answer is logged.
#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "ko/log.hpp"
#include "mokuto/compilertask.h"
#include "robotsim/robot.h"
#include "zu/zuserviceproxies.h"

namespace ZU {
namespace {

std::shared_ptr<MKTaskInstruction> job(const std::string& text, BodyLanguageMode mode) {
  MokutoConfig config;
  config.bodyLanguageMode = mode;
  return std::make_shared<MKTaskInstruction>(1, text, config, Standing);
}

robotsim::RobotOptions timingRobot() {
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  return options;
}

struct LanguageCase {
  const char* language;
  const char* speech;
};

TEST(CompilerTask, TheSpeechEnginesLanguageDecidesThePauseRule) {
  robotsim::Robot robot(timingRobot());
  auto tts = std::make_shared<ZUTextToSpeechProxy>(robot.broker());
  CompilerTask compiler(tts);
  const LanguageCase cases[] = {
      {"Japanese", R"(\mrk=1\ ,\pau=300\ hai)"},
      {"French", R"(\mrk=1\ \pau=300\ hai)"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.language);
    robot.speech()->setLanguage(c.language);
    const auto j = job(R"(\mrk=1\ \pau=300\ hai)", BODY_LANGUAGE_MODE_RANDOM);
    compiler.process(j);
    EXPECT_EQ(j->text, c.speech);
  }
}

TEST(CompilerTask, RandomModeGivesOnlyTheParsedActions) {
  robotsim::Robot robot(timingRobot());
  CompilerTask compiler(std::make_shared<ZUTextToSpeechProxy>(robot.broker()));
  const auto plain = job("Hello my friend", BODY_LANGUAGE_MODE_RANDOM);
  compiler.process(plain);
  EXPECT_TRUE(plain->actions.empty());
  EXPECT_EQ(plain->text, "Hello my friend");
  const auto annotated =
      job("Hello ^start(animations/Stand/Gestures/Hey_1) friend", BODY_LANGUAGE_MODE_RANDOM);
  compiler.process(annotated);
  ASSERT_EQ(annotated->actions.size(), 1u);
  EXPECT_EQ(annotated->text, R"(Hello \mrk=1\ friend)");
}

TEST(CompilerTask, ASpeechEngineThatFailsIsLoggedAndTheParseGoesOn) {
  std::shared_ptr<ZUTextToSpeechProxy> tts;
  {
    robotsim::Robot robot(timingRobot());
    tts = std::make_shared<ZUTextToSpeechProxy>(robot.broker());
  }
  ko::log::ScopedCapture cap;
  CompilerTask compiler(tts);
  const auto j = job(R"(a \mrk=1\ \pau=300\ b ^start(x))", BODY_LANGUAGE_MODE_RANDOM);
  compiler.process(j);
  EXPECT_EQ(j->actions.size(), 1u);
  EXPECT_EQ(j->text, R"(a \mrk=1\ \pau=300\ b \mrk=2\)");
  EXPECT_TRUE(cap->containsPart("mokuto.compiler", ko::log::Error,
                                "TTS.getLanguage() has thrown an error: "));
}

}  // namespace
}  // namespace ZU
