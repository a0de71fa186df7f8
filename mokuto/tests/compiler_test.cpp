// The compiler stage: the speech engine's language decides the Japanese pause rule and
// the linguistic databases, the parse fills the job, contextual mode adds the automatic
// tags, the emotion of a recognised text, and a speech engine that cannot answer is
// logged.
#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "ko/log.hpp"
#include "mkbdb/writer.h"
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

namespace fs = std::filesystem;

// English (flag 0: bookmarks right before their word) and its emotions; no French.
class Databases {
 public:
  Databases() {
    static std::atomic<int> counter{0};
    dir_ = fs::temp_directory_path() /
           ("compiler-" + std::to_string(::getpid()) + "-" + std::to_string(counter++));
    fs::create_directories(dir_);
    auto languages = std::make_shared<ZULingLanguageMap>();
    (*languages)["English"] = write("en.bdb",
                                    "i\tpronoun/1s=i\n"
                                    "like\tverb/WP=like\n"
                                    "apples\tnoun/p\n"
                                    "pears\tnoun/p\n"
                                    "tea\tnoun/s\n"
                                    "and\tconjunctive\n");
    (*languages)["EnglishEmotions"] = write("emotions.bdb",
                                            "happy\tunkonwn=positive\n"
                                            "awful\tunkonwn=very negative\n"
                                            "not\tunkonwn=negation\n");
    languages_ = languages;
  }
  ~Databases() { fs::remove_all(dir_); }
  std::shared_ptr<const ZULingLanguageMap> languages() const { return languages_; }

 private:
  std::string write(const std::string& name, const std::string& lexiconText) {
    mkbdb::Lexicon lexicon;
    std::istringstream in(lexiconText);
    mkbdb::readLexicon(in, name, lexicon);
    mkbdb::Options options;
    options.flag = 0;
    mkbdb::Report report;
    const std::string path = (dir_ / name).string();
    std::ofstream(path, std::ios::binary) << mkbdb::build(lexicon, options, report);
    return path;
  }

  fs::path dir_;
  std::shared_ptr<const ZULingLanguageMap> languages_;
};

std::vector<std::string> actionTexts(const MKTaskInstruction& j) {
  std::vector<std::string> texts;
  for (const auto& action : j.actions)
    texts.push_back(action->text);
  return texts;
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

// In contextual mode the speech engine's language selects the database; a language
// without one keeps the parsed actions and the configuration's word tags.
TEST(CompilerTask, ContextualModeAddsTheAutomaticTagsOfTheLanguage) {
  struct Case {
    const char* language;
    BodyLanguageMode mode;
    const char* text;
    const char* speech;
    std::vector<std::string> actions;
  };
  const Case cases[] = {
      {"English",
       BODY_LANGUAGE_MODE_CONTEXTUAL,
       "^stop(x) I like apples and pears ^run(y)",
       R"( \pau=500\  \mrk=1\   \mrk=3\ I  \mrk=4\ like  \mrk=5\ apples and pears  \mrkpause=2\ )",
       {"^stop(x)", "AUTO_START_TAG(i)", "AUTO_START_TAG(like)", "AUTO_START_TAG(two)", "^run(y)"}},
      {"English",
       BODY_LANGUAGE_MODE_RANDOM,
       "I like apples and pears",
       "I like apples and pears",
       {}},
      {"French",
       BODY_LANGUAGE_MODE_CONTEXTUAL,
       "^stop(y) I like tea",
       R"( \pau=500\  \mrk=1\  I like  \mrk=2\ tea)",
       {"^stop(y)", "AUTO_START_TAG(drink)"}},
  };
  robotsim::Robot robot(timingRobot());
  Databases databases;
  CompilerTask compiler(std::make_shared<ZUTextToSpeechProxy>(robot.broker()),
                        databases.languages());
  MKID id = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.language) + ": " + c.text);
    robot.speech()->setLanguage(c.language);
    const auto j = job(c.text, c.mode);
    j->id = ++id;
    j->config.wordsToTags["tea"] = {"drink"};
    compiler.process(j);
    EXPECT_EQ(j->text, c.speech);
    EXPECT_EQ(actionTexts(*j), c.actions);
  }
}

TEST(CompilerTask, TheEmotionOfARecognisedTextIsRaisedFromHalfConfidence) {
  struct Case {
    const char* language;
    const char* text;
    std::int32_t emotion;
    double confidence;
    std::optional<std::int32_t> raised;
  };
  const Case cases[] = {
      {"English", "I am happy", 1, 0.49, std::nullopt},
      {"English", "I am happy", 1, 0.5, 1},
      {"English", "not happy", -1, 1.0, -1},
      {"English", "Awful", -2, 0.7, -2},
      {"English", "I like tea", 0, 0.9, std::nullopt},
      {"French", "happy", 0, 0.9, std::nullopt},
  };
  robotsim::Robot robot(timingRobot());
  Databases databases;
  CompilerTask compiler(std::make_shared<ZUTextToSpeechProxy>(robot.broker()),
                        databases.languages());
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.language) + ": " + c.text + " " + std::to_string(c.confidence));
    robot.speech()->setLanguage(c.language);
    EXPECT_EQ(compiler.getEmotion(c.text), c.emotion);
    EXPECT_EQ(compiler.asrEmotion(c.text, c.confidence), c.raised);
  }
}

// The recognised-word callback's estimates run beside the pipeline's jobs, each with
// its own language selection.
TEST(CompilerTask, EmotionsAndJobsMayRunAtTheSameTime) {
  robotsim::Robot robot(timingRobot());
  Databases databases;
  CompilerTask compiler(std::make_shared<ZUTextToSpeechProxy>(robot.broker()),
                        databases.languages());
  std::atomic<int> wrong{0};
  std::thread callback([&compiler, &wrong] {
    for (int k = 0; k < 100; ++k)
      wrong += compiler.asrEmotion("not happy", 0.9) != -1 ? 1 : 0;
  });
  for (int k = 0; k < 100; ++k) {
    const auto j = job("apples and pears", BODY_LANGUAGE_MODE_CONTEXTUAL);
    compiler.process(j);
    wrong += actionTexts(*j) != std::vector<std::string>{"AUTO_START_TAG(two)"} ? 1 : 0;
  }
  callback.join();
  EXPECT_EQ(wrong, 0);
}

// Without the speech engine's language, contextual mode has no database: the parse and
// the configuration's words only; getEmotion logs under its own name and gives 0.
TEST(CompilerTask, WithoutTheSpeechEngineNoDatabaseIsSelected) {
  std::shared_ptr<ZUTextToSpeechProxy> tts;
  {
    robotsim::Robot robot(timingRobot());
    tts = std::make_shared<ZUTextToSpeechProxy>(robot.broker());
  }
  Databases databases;
  CompilerTask compiler(tts, databases.languages());
  ko::log::ScopedCapture cap;
  const auto j = job("^run(y) I like apples", BODY_LANGUAGE_MODE_CONTEXTUAL);
  compiler.process(j);
  EXPECT_EQ(actionTexts(*j), std::vector<std::string>{"^run(y)"});
  EXPECT_EQ(compiler.getEmotion("awful"), 0);
  EXPECT_TRUE(cap->containsPart("mokuto.compiler", ko::log::Error,
                                "TTS.getLanguage() has thrown an error: "));
}

}  // namespace
}  // namespace ZU
