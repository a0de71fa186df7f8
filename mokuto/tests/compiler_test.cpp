// The compiler stage: the speech engine's language decides the Japanese pause rule and
// the linguistic databases, the parse fills the job, contextual mode adds the automatic
// tags, the emotion of a recognised text, and a speech engine that cannot answer is
// logged.
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <thread>

#include "ko/log.hpp"
#include "lingtest.h"
#include "mokuto/compilertask.h"
#include "robotsim/robot.h"
#include "zu/zuserviceproxies.h"

namespace ZU {
namespace {

std::shared_ptr<MKTaskInstruction> job(const std::string& text, BodyLanguageMode mode,
                                       MKID id = 1) {
  MokutoConfig config;
  config.bodyLanguageMode = mode;
  config.wordsToTags["tea"] = {"drink"};
  return std::make_shared<MKTaskInstruction>(id, text, config, Standing);
}

// The texts of the job's actions, "|" between them.
std::string actionTexts(const MKTaskInstruction& j) {
  std::string texts;
  for (const auto& action : j.actions)
    texts += (texts.empty() ? "" : "|") + action->text;
  return texts;
}

// The simulated robot's speech engine (or a proxy left without it) and a compiler with
// English (flag 0: bookmarks right before their word) and its emotions; no French.
struct Compiler {
  explicit Compiler(bool withSpeechEngine = true) {
    robotsim::RobotOptions options;
    options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
    robot.emplace(options);
    tts = std::make_shared<ZUTextToSpeechProxy>(robot->broker());
    if (!withSpeechEngine)
      robot.reset();
    auto languages = std::make_shared<ZULingLanguageMap>();
    (*languages)["English"] =
        folder.database("en.bdb",
                        "i\tpronoun/1s=i\nlike\tverb/WP=like\napples\tnoun/p\npears\tnoun/p\n"
                        "tea\tnoun/s\nand\tconjunctive\n",
                        0);
    (*languages)["EnglishEmotions"] =
        folder.database("emotions.bdb",
                        "happy\tunkonwn=positive\nawful\tunkonwn=very negative\n"
                        "not\tunkonwn=negation\n",
                        0);
    compiler.emplace(tts, languages);
  }
  void setLanguage(const std::string& language) { robot->speech()->setLanguage(language); }

  std::optional<robotsim::Robot> robot;
  std::shared_ptr<ZUTextToSpeechProxy> tts;
  lingtest::Folder folder;
  std::optional<CompilerTask> compiler;
};

// Random mode: the parse alone, Japanese with its comma; contextual mode: the automatic
// tags of the language's database, or of the configuration's words without one.
TEST(CompilerTask, TheLanguageDecidesThePauseRuleAndTheDatabase) {
  constexpr auto kRandom = BODY_LANGUAGE_MODE_RANDOM;
  constexpr auto kContextual = BODY_LANGUAGE_MODE_CONTEXTUAL;
  struct Case {
    const char* language;
    BodyLanguageMode mode;
    const char* text;
    const char* speech;
    const char* actions;  // their texts, "|" between them
  };
  const Case cases[] = {
      {"Japanese", kRandom, R"(\mrk=1\ \pau=300\ hai)", R"(\mrk=1\ ,\pau=300\ hai)", ""},
      {"French", kRandom, R"(\mrk=1\ \pau=300\ hai)", R"(\mrk=1\ \pau=300\ hai)", ""},
      {"English", kRandom, "Hello ^start(a) I like apples and pears",
       R"(Hello \mrk=1\ I like apples and pears)", "^start(a)"},
      {"English", kContextual, "^stop(x) I like apples and pears ^run(y)",
       R"( \pau=500\  \mrk=1\   \mrk=3\ I  \mrk=4\ like  \mrk=5\ apples and pears  \mrkpause=2\ )",
       "^stop(x)|AUTO_START_TAG(i)|AUTO_START_TAG(like)|AUTO_START_TAG(two)|^run(y)"},
      {"French", kContextual, "^stop(y) I like tea", R"( \pau=500\  \mrk=1\  I like  \mrk=2\ tea)",
       "^stop(y)|AUTO_START_TAG(drink)"},
  };
  Compiler c;
  MKID id = 0;
  for (const auto& k : cases) {
    SCOPED_TRACE(std::string(k.language) + ": " + k.text);
    c.setLanguage(k.language);
    const auto j = job(k.text, k.mode, ++id);
    c.compiler->process(j);
    EXPECT_EQ(j->text, k.speech);
    EXPECT_EQ(actionTexts(*j), k.actions);
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
  Compiler c;
  for (const auto& k : cases) {
    SCOPED_TRACE(std::string(k.language) + ": " + k.text + " " + std::to_string(k.confidence));
    c.setLanguage(k.language);
    EXPECT_EQ(c.compiler->getEmotion(k.text), k.emotion);
    EXPECT_EQ(c.compiler->asrEmotion(k.text, k.confidence), k.raised);
  }
}

// The recognised-word callback's estimates run beside the pipeline's jobs, each with
// its own language selection.
TEST(CompilerTask, EmotionsAndJobsMayRunAtTheSameTime) {
  Compiler c;
  std::atomic<int> wrong{0};
  std::thread callback([&c, &wrong] {
    for (int k = 0; k < 100; ++k)
      wrong += c.compiler->asrEmotion("not happy", 0.9) != -1 ? 1 : 0;
  });
  for (int k = 0; k < 100; ++k) {
    const auto j = job("apples and pears", BODY_LANGUAGE_MODE_CONTEXTUAL);
    c.compiler->process(j);
    wrong += actionTexts(*j) != "AUTO_START_TAG(two)" ? 1 : 0;
  }
  callback.join();
  EXPECT_EQ(wrong, 0);
}

// Without the speech engine's language: the parse goes on (not Japanese), contextual mode
// has no database, and getEmotion logs under its own name and gives 0.
TEST(CompilerTask, ASpeechEngineThatFailsIsLoggedAndNoDatabaseIsSelected) {
  Compiler c(false);
  ko::log::ScopedCapture cap;
  const auto random = job(R"(a \mrk=1\ \pau=300\ b ^start(x))", BODY_LANGUAGE_MODE_RANDOM);
  c.compiler->process(random);
  EXPECT_EQ(random->text, R"(a \mrk=1\ \pau=300\ b \mrk=2\)");
  const auto contextual = job("^run(y) I like apples", BODY_LANGUAGE_MODE_CONTEXTUAL);
  c.compiler->process(contextual);
  EXPECT_EQ(actionTexts(*contextual), "^run(y)");
  EXPECT_EQ(c.compiler->getEmotion("awful"), 0);
  std::size_t lines = 0;
  for (const auto& r : cap->records()) {
    lines += r.category == "mokuto.compiler" && r.level == ko::log::Error &&
             r.message.rfind("TTS.getLanguage() has thrown an error: ", 0) == 0;
  }
  EXPECT_EQ(lines, 3u);
}

}  // namespace
}  // namespace ZU
