#include <gtest/gtest.h>

#include <condition_variable>
#include <memory>
#include <random>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "ko/log.hpp"
#include "mokuto/mktaskaction.h"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace ZU {
namespace {

using Matching = ZUMokutoParser::Matching;

std::shared_ptr<MKTaskInstruction> parse(const std::string& text, bool japanese = false,
                                         Matching matching = Matching::Adaptive) {
  auto job = std::make_shared<MKTaskInstruction>();
  ZUMokutoParser(matching).parse(job, text, japanese);
  return job;
}

// An action as the parser leaves it; `fields`, when given, is what fieldsOf shows.
struct ExpectedAction {
  MKTaskActionType type;
  std::uint32_t id;
  std::string text;
  std::string fields = "";
};

// The fields of an action's record, "|" between them.
std::string fieldsOf(const MKTaskAction& action) {
  std::ostringstream out;
  if (const auto* a = dynamic_cast<const MKAnimationAction*>(&action)) {
    out << a->animation << '|' << a->tag;
  } else if (const auto* s = dynamic_cast<const MKSoundAction*>(&action)) {
    out << s->soundSet << '|' << s->soundName << '|' << s->volume;
  } else if (const auto* c = dynamic_cast<const MKCallAction*>(&action)) {
    out << c->module << '|' << c->method << '|' << c->arguments << '|' << (c->proxy != nullptr);
  } else if (const auto* m = dynamic_cast<const MKModeAction*>(&action)) {
    out << m->mode;
  } else if (const auto* f = dynamic_cast<const MKAffectationAction*>(&action)) {
    out << f->name << '|' << f->value;
  }
  return out.str();
}

// Everything the parser writes, in one comparable text.
std::string describe(const MKTaskInstruction& job) {
  std::ostringstream out;
  out << job.text << "\nused:";
  for (const auto n : job.usedBookmarks) {
    out << ' ' << n;
  }
  out << "\ninputMode2: " << job.config.inputMode2;
  for (const auto& action : job.actions) {
    out << "\n"
        << action->type << ' ' << action->id << ' ' << action->text << " | " << fieldsOf(*action);
  }
  return out.str();
}

struct TextCase {
  const char* name;
  std::string input;
  std::string speech;
  std::vector<ExpectedAction> actions;
  bool japanese = false;
};

void PrintTo(const TextCase& c, std::ostream* os) {
  *os << c.name;
}

using TextParam = std::tuple<Matching, TextCase>;

class ParsedText : public testing::TestWithParam<TextParam> {};

TEST_P(ParsedText, GivesTheSpeechTextAndActions) {
  const auto& [matching, c] = GetParam();
  ko::log::ScopedCapture quiet;
  const auto job = parse(c.input, c.japanese, matching);
  EXPECT_EQ(job->text, c.speech);
  ASSERT_EQ(job->actions.size(), c.actions.size());
  for (std::size_t k = 0; k < c.actions.size(); ++k) {
    EXPECT_EQ(job->actions[k]->type, c.actions[k].type) << k;
    EXPECT_EQ(job->actions[k]->id, c.actions[k].id) << k;
    EXPECT_EQ(job->actions[k]->text, c.actions[k].text) << k;
    if (!c.actions[k].fields.empty()) {
      EXPECT_EQ(fieldsOf(*job->actions[k]), c.actions[k].fields) << k;
    }
  }
}

const std::vector<TextCase> kTextCases = {
    // Plain words and the replacement of instructions by bookmarks.
    {"empty", "", "", {}},
    {"noInstruction", "Hello world", "Hello world", {}},
    {"start",
     "Hello ^start(animations/Stand/Gestures/Hey_1) world",
     R"(Hello \mrk=1\ world)",
     {{START, 1, "^start(animations/Stand/Gestures/Hey_1)", "animations/Stand/Gestures/Hey_1|"}}},
    {"blocking",
     "^run(x) ^wait(x)",
     R"(\mrkpause=1\ \mrkpause=2\)",
     {{RUN, 1, "^run(x)"}, {WAIT, 2, "^wait(x)"}}},
    {"allAnimationKinds",
     "^startTag( a )^runTag(b)^waitTag(c)^stop(d)^stopTag(e)",
     R"(\mrk=1\\mrkpause=2\\mrkpause=3\\mrk=4\\mrk=5\)",
     {{START_TAG, 1, "^startTag(a)", "|a"},
      {RUN_TAG, 2, "^runTag(b)"},
      {WAIT_TAG, 3, "^waitTag(c)"},
      {STOP, 4, "^stop(d)", "d|"},
      {STOP_TAG, 5, "^stopTag(e)"}}},
    {"spacesAroundArguments",
     "a ^start (x) b ^start(  x  ) c",
     R"(a \mrk=1\ b \mrk=2\ c)",
     {{START, 1, "^start(x)"}, {START, 2, "^start(x)"}}},
    {"emptyArguments", "^start()", R"(\mrk=1\)", {{START, 1, "^start()"}}},
    {"utf8",
     "Bonjour ^start(a) à tous, 日本語です ^run(é/ü)",
     R"(Bonjour \mrk=1\ à tous, 日本語です \mrkpause=2\)",
     {{START, 1, "^start(a)"}, {RUN, 2, "^run(é/ü)"}}},

    // The caller's own bookmarks.
    {"callerBookmark",
     R"(Hi \mrk=1\ there ^start(a))",
     R"(Hi \mrk=1\ there \mrk=2\)",
     {{START, 2, "^start(a)"}}},
    {"callerBookmarkFive",
     R"(\mrk=5\^start(a)^start(b)^start(c)^start(d)^start(e))",
     R"(\mrk=5\\mrk=1\\mrk=2\\mrk=3\\mrk=4\\mrk=6\)",
     {{START, 1, "^start(a)"},
      {START, 2, "^start(b)"},
      {START, 3, "^start(c)"},
      {START, 4, "^start(d)"},
      {START, 6, "^start(e)"}}},
    {"callerBookmarkSigned",
     R"(\mrk=+1\ \mrk=-2\ ^start(a))",
     R"(\mrk=+1\ \mrk=-2\ \mrk=2\)",
     {{START, 2, "^start(a)"}}},
    {"callerBookmarkNotANumber",
     R"(\mrk=x\ \mrk=\ \mrk= 3\ ^start(a))",
     R"(\mrk=x\ \mrk=\ \mrk= 3\ \mrk=1\)",
     {{START, 1, "^start(a)"}}},

    // Names.
    {"deprecatedTag", "^tag(hello)", R"(\mrk=1\)", {{START_TAG, 1, "^tag(hello)", "|hello"}}},
    {"unknownName", "^foo(bar)", R"(\mrk=1\)", {{UNKNOWN, 1, "UNKNOWN_INSTRUCTION ^foo(bar)"}}},
    {"emptyName", "^(x)", R"(\mrk=1\)", {{UNKNOWN, 1, "UNKNOWN_INSTRUCTION ^(x)"}}},
    {"caseMatters", "^Start(x)", R"(\mrk=1\)", {{UNKNOWN, 1, "UNKNOWN_INSTRUCTION ^Start(x)"}}},
    {"nameWithOtherByte", "^sta-rt(x) ^st_art(x)", "^sta-rt(x) ^st_art(x)", {}},
    {"nameWithoutParenthesis", "^start x) and ^start", "^start x) and ^start", {}},
    {"caretAtEnd", "end ^", "end ^", {}},
    {"doubleCaret", "^^start(x)", R"(^\mrk=1\)", {{START, 1, "^start(x)"}}},

    // Parentheses, quotes and backslashes.
    {"unclosed", "^start(a", "^start(a", {}},
    {"unclosedThenInner", "^start(^run(x) b", R"(^start(\mrkpause=1\ b)", {{RUN, 1, "^run(x)"}}},
    {"nested", "^start(a(b)c) d", R"(\mrk=1\ d)", {{START, 1, "^start(a(b)c)"}}},
    {"quotedParenthesis",
     R"~(^start(a")" b) c)~",
     R"(\mrk=1\ c)",
     {{START, 1, R"~(^start(a")" b))~"}}},
    {"escapedParenthesis", R"(^start(a\)b) c)", R"(\mrk=1\ c)", {{START, 1, R"(^start(a\)b))"}}},
    {"unclosedQuote", R"~(^start(a"b) c)~", R"~(^start(a"b) c)~", {}},
    {"backslashAtEnd", "^start(a\\", "^start(a\\", {}},

    // Sounds.
    {"sound",
     "^startSound(bells/ding) ^stopSound(bells/ding) ^waitSound(bells/ding)",
     R"(\mrk=1\ \mrk=2\ \mrkpause=3\)",
     {{START_SOUND, 1, "^startSound(bells/ding)", "bells|ding|100"},
      {STOP_SOUND, 2, "^stopSound(bells/ding)"},
      {WAIT_SOUND, 3, "^waitSound(bells/ding)"}}},
    {"soundVolume",
     "^runSound(a/b/c , 100) ^runSound(x/y,+7)",
     R"(\mrkpause=1\ \mrkpause=2\)",
     {{RUN_SOUND, 1, "^runSound(a/b/c , 100)", "a/b|c|100"},
      {RUN_SOUND, 2, "^runSound(x/y,+7)", "x|y|7"}}},
    {"soundVolumeTooHigh",
     "^runSound(a/b/c, 101)",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b/c, 101)", "a/b|c|100"}}},
    {"soundVolumeNegative",
     "^runSound(a/b, -1)",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b, -1)"}}},
    {"soundVolumeNotANumber",
     "^runSound(a/b, loud) then ^run(x)",
     R"(\mrk=1\ then \mrkpause=2\)",
     {{UNKNOWN, 1, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b, loud)"}, {RUN, 2, "^run(x)"}}},
    {"soundVolumeEmpty",
     "^runSound(a/b, ) ^runSound(a/b,)",
     R"(\mrk=1\ \mrk=2\)",
     {{UNKNOWN, 1, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b,)"},
      {UNKNOWN, 2, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b,)"}}},
    {"soundWithoutSlash",
     "^startSound(ding)",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "INSTRUCTION_BADLY_FORMATTED ^startSound(ding)", "||100"}}},
    {"soundWithoutSlashWithVolume",
     "^waitSound(ding, 5)",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "INSTRUCTION_BADLY_FORMATTED ^waitSound(ding, 5)"}}},
    {"soundWithParenthesis",
     "^startSound(a/b(c)) d",
     R"(\mrk=1\ d)",
     {{UNKNOWN, 1, "INSTRUCTION_BADLY_FORMATTED ^startSound(a/b(c))", "||100"}}},
    {"soundUnclosed", "^startSound(a/b", "^startSound(a/b", {}},
    {"soundUnclosedVolume", "^runSound(a/b, 5", "^runSound(a/b, 5", {}},

    // Calls.
    {"call",
     R"~(^call(ZUMotion.setAngles("Head(Yaw)", 0.5)))~",
     R"(\mrkpause=1\)",
     {{CALL, 1, R"~(^call(ZUMotion.setAngles("Head(Yaw)", 0.5)))~",
       R"~(ZUMotion|setAngles|["Head(Yaw)", 0.5]|0)~"}}},
    {"pCallSpaces",
     "^pCall( A.b (1, 2) ) ^call(A.b())",
     R"(\mrk=1\ \mrkpause=2\)",
     {{PCALL, 1, "^pCall(A.b (1, 2))", "A|b|[1, 2]|0"}, {CALL, 2, "^call(A.b())", "A|b|[]|0"}}},
    {"callWithoutDot",
     "^call(foo) x",
     R"(\mrk=1\ x)",
     {{UNKNOWN, 1, "INSTRUCTION_BADLY_FORMATTED ^call(foo)", "|||0"}}},
    {"callWithoutArguments",
     "^call(ZUMemory.raiseEvent)",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "INSTRUCTION_BADLY_FORMATTED ^call(ZUMemory.raiseEvent)"}}},
    {"callWithoutModule",
     "^call(.b(1))",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "INSTRUCTION_BADLY_FORMATTED ^call(.b(1))"}}},
    {"callUnclosedArguments", "^call(A.b(1", "^call(A.b(1", {}},
    {"callUnclosed", "^call(A.b(1) x", "^call(A.b(1) x", {}},

    // Mode and the inputMode2 switch.
    {"mode",
     "^mode(random) ^mode(disabled) ^mode(contextual)",
     R"(\mrk=1\ \mrk=2\ \mrk=3\)",
     {{MODE, 1, "^mode(random)", "1"},
      {MODE, 2, "^mode(disabled)", "0"},
      {MODE, 3, "^mode(contextual)", "2"}}},
    {"modeCase",
     "^mode(Random)",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "BODY_LANGUAGE_MODE_UNKNOWN ^mode(Random)", "3"}}},
    {"modeEndOfEnum",
     "^mode(endOfEnum)",
     R"(\mrk=1\)",
     {{UNKNOWN, 1, "BODY_LANGUAGE_MODE_UNKNOWN ^mode(endOfEnum)"}}},
    {"inputMode2", "a ^inputMode2() b ^start(x)", R"(a  b \mrk=1\)", {{START, 1, "^start(x)"}}},

    // Affectations.
    {"affectation", "$x=1 and", R"(\mrk=1\ and)", {{AFFECTATION, 1, "$x=1", "x|1"}}},
    {"affectationAtEnd", "set $x=1", R"(set \mrk=1\)", {{AFFECTATION, 1, "$x=1"}}},
    {"affectationLastEqual", "$a=b=c d", R"(\mrk=1\ d)", {{AFFECTATION, 1, "$a=b=c", "a=b|c"}}},
    {"affectationEmptyValue", "$x= and", "$x= and", {}},
    {"affectationEmptyName", "$=1", "$=1", {}},
    {"affectationNoEqual", "$$ costs $5", "$$ costs $5", {}},
    {"affectationAndInstruction",
     "$x=1 ^start(a)",
     R"(\mrk=1\ \mrk=2\)",
     {{AFFECTATION, 1, "$x=1"}, {START, 2, "^start(a)"}}},

    // The Japanese pause rule.
    {"japanesePause", R"(\mrk=1\ \pau=300\ hello)", R"(\mrk=1\ ,\pau=300\ hello)", {}, true},
    {"otherLanguagePause", R"(\mrk=1\ \pau=300\ hello)", R"(\mrk=1\ \pau=300\ hello)", {}, false},
    {"japanesePauseAfterWords", R"(a \pau=300\ b)", R"(a \pau=300\ b)", {}, true},
    {"japanesePauseAfterAffectation",
     R"($x=1 \pau=3\ a)",
     R"(\mrk=1\ ,\pau=3\ a)",
     {{AFFECTATION, 1, "$x=1"}},
     true},
    // The scan resumes on the instruction's closing parenthesis, which is not a backslash.
    {"japanesePauseAfterInstruction",
     R"(^start(a) \pau=3\ a)",
     R"(\mrk=1\ \pau=3\ a)",
     {{START, 1, "^start(a)"}},
     true},
    {"japanesePauseTooShort", R"(\mrk=1\ \pau=)", R"(\mrk=1\ \pau=)", {}, true},
    {"japaneseTwoPauses", R"(\mrk=1\ \pau=3\ \pau=4\)", R"(\mrk=1\ ,\pau=3\ ,\pau=4\)", {}, true},
};

std::string textParamName(const testing::TestParamInfo<TextParam>& p) {
  static const char* const kMatching[] = {"Adaptive", "Walk", "Index"};
  return std::string(kMatching[static_cast<int>(std::get<0>(p.param))]) + "_" +
         std::get<1>(p.param).name;
}

INSTANTIATE_TEST_SUITE_P(Cases, ParsedText,
                         testing::Combine(testing::Values(Matching::Adaptive, Matching::Walk,
                                                          Matching::Index),
                                          testing::ValuesIn(kTextCases)),
                         textParamName);

TEST(ParsedJob, UsedBookmarksAreTheCallersThenTheActions) {
  const auto job = parse(R"(\mrk=4\ a ^start(x) \mrk=2\ ^run(y) ^run(z) \mrk=oops\)");
  EXPECT_EQ(job->usedBookmarks, (std::vector<std::int32_t>{4, 2, 1, 3, 5}));
  EXPECT_EQ(job->text, R"(\mrk=4\ a \mrk=1\ \mrk=2\ \mrkpause=3\ \mrkpause=5\ \mrk=oops\)");
  EXPECT_EQ(job->currentAction, 0u);
}

// The compiler parses a job's own text into it: its tests read the result.
TEST(ParsedJob, ANullJobIsRefused) {
  EXPECT_THROW(ZUMokutoParser().parse(nullptr, "x", false), std::invalid_argument);
}

// Records are made a block at a time: each must still have a condition variable of its
// own, and live on with its fields after the job and the other actions are gone. The
// records of "^inputMode2()" and of the unclosed call at the end are made and dropped.
TEST(ParsedJob, ActionsOwnTheirConditionsAndOutliveTheJob) {
  std::string text;
  for (int k = 0; k < 600; ++k) {
    const std::string n = std::to_string(k);
    text += "^start(a" + n + ") ^inputMode2() $v" + n + "=x ^runSound(s/n" + n + ", 5) ";
  }
  text += "^call(M.m(\"";
  auto job = parse(text);
  ASSERT_EQ(job->actions.size(), 1800u);
  std::set<const std::condition_variable*> conditions;
  for (const auto& action : job->actions) {
    ASSERT_NE(action->condition, nullptr);
    conditions.insert(action->condition.get());
  }
  EXPECT_EQ(conditions.size(), job->actions.size());

  const std::shared_ptr<MKTaskAction> affectation = job->actions[1234];
  const std::shared_ptr<MKTaskAction> sound = job->actions[1799];
  job.reset();
  EXPECT_EQ(affectation->text, "$v411=x");
  EXPECT_EQ(affectation->id, 1235u);
  EXPECT_EQ(dynamic_cast<const MKSoundAction&>(*sound).soundName, "n599");
  sound->condition->notify_all();
}

// Most lines are the parser's errors, from the function that reads an instruction.
struct LogCase {
  const char* name;
  std::string input;
  std::string message;
  const char* function = "ZU::ZUMokutoParser::xActionContent";
  const char* category = "mokuto.parser";
  ko::log::Level level = ko::log::Error;
};

class ParserLog : public testing::TestWithParam<LogCase> {};

TEST_P(ParserLog, WritesOneLine) {
  const LogCase& c = GetParam();
  ko::log::ScopedCapture cap;
  parse(c.input);
  EXPECT_TRUE(cap->contains(c.category, c.level, c.message)) << c.message;
  const auto records = cap->records();
  ASSERT_EQ(records.size(), 1u);
  EXPECT_EQ(records[0].function, c.function);
}

const char* const kSoundError = "ZU::ZUMokutoParser::xPrintSoundParsingError";

INSTANTIATE_TEST_SUITE_P(
    Cases, ParserLog,
    testing::Values(
        LogCase{"unknown", "^foo(bar)",
                R"~(Instruction "^foo(bar)" not recognized. Instruction skipped.)~"},
        LogCase{"mode", "^mode( Random )", R"("Random" body language mode is unknown.)"},
        LogCase{
            "soundName", "^startSound( ding )",
            R"(Bad sound file name in "ding". The sound files has to follow the pattern: "soundSet/soundName")",
            kSoundError},
        LogCase{
            "soundParenthesis", "^runSound(a/b(c), 5)",
            R"(Bad sound file name in "a/b(c), 5". The sound files has to follow the pattern: "soundSet/soundName")",
            kSoundError},
        LogCase{"volume", "^runSound(a/b/c, 101)",
                "the second parameter of ^runSound(a/b/c, 101) has to be an integer between 0 "
                "and 100 (sound volume)"},
        LogCase{"volumeNotANumber", "^runSound(a/b, loud)",
                "the second parameter of ^runSound(a/b, loud) has to be an integer between 0 "
                "and 100 (sound volume)"},
        LogCase{"call", "^call(foo)",
                "This instruction ^call(foo) is badly formated. Here is the pattern to follow: "
                "ZUModule.method(args)"},
        LogCase{"deprecatedTag", "^tag(hello)", "^tag is deprecated please use ^startTag instead.",
                "ZU::MKTaskActionType_fromStr", "Mokuto", ko::log::Warning}),
    [](const testing::TestParamInfo<LogCase>& p) { return p.param.name; });

TEST(ParserLogSilence, FailuresThatLeaveWordsLogNothing) {
  ko::log::ScopedCapture cap;
  parse(R"(^start(a ^sta-rt(x) ^start x $x= \mrk=x\ ^runSound(a/b, 5)");
  EXPECT_EQ(cap->count(), 0u);
}

// Texts built from the bytes that matter to the parser, to compare the three ways of
// finding closing parentheses; the long ones exhaust the adaptive walk's budget.
std::string randomText(std::mt19937& random, std::size_t pieces, bool withClosing) {
  // The pieces, "|" between them; the last two are closing parentheses.
  static const std::vector<std::string> kPieces = [] {
    std::vector<std::string> all;
    std::string piece;
    for (const char c : std::string(
             "(|\"|\\| |a|$|=|/|,|.|1|^|^start(|^run(|^call(|^runSound(|^mode(|^pCall(|^foo (|"
             "\\mrk=2\\|\\pau=|A.b(|^inputMode2(|é|$x=1 |^stopTag(|)|)|")) {
      if (c == '|')
        all.push_back(std::exchange(piece, ""));
      else
        piece += c;
    }
    return all;
  }();
  const std::size_t last = kPieces.size() - (withClosing ? 1 : 3);
  std::uniform_int_distribution<std::size_t> pick(0, last);
  std::string text;
  for (std::size_t k = 0; k < pieces; ++k) {
    text += kPieces[pick(random)];
  }
  return text;
}

TEST(ParenthesisMatching, AllStrategiesAgree) {
  ko::log::ScopedCapture quiet;
  std::mt19937 random(20240611);
  for (int round = 0; round < 600; ++round) {
    const bool isLong = round >= 500;
    const std::size_t pieces = isLong ? 3000 : 1 + static_cast<std::size_t>(round % 60);
    const std::string text = randomText(random, pieces, !isLong || round % 3 != 0);
    const bool japanese = round % 2 == 0;
    const std::string walked = describe(*parse(text, japanese, Matching::Walk));
    ASSERT_EQ(describe(*parse(text, japanese, Matching::Index)), walked) << text;
    ASSERT_EQ(describe(*parse(text, japanese, Matching::Adaptive)), walked) << text;
  }
}

TEST(ParenthesisMatching, ManyUnclosedInstructions) {
  std::string text;
  for (int k = 0; k < 3000; ++k) {
    text += "^start(\"x\" ";
  }
  text += "^run(y) z)";
  const std::string walked = describe(*parse(text, false, Matching::Walk));
  EXPECT_EQ(describe(*parse(text, false, Matching::Adaptive)), walked);
  // Only the last "^start(" closes, around the "^run(y)".
  const auto job = parse(text);
  ASSERT_EQ(job->actions.size(), 1u);
  EXPECT_EQ(job->actions[0]->text, "^start(\"x\" ^run(y) z)");
  EXPECT_EQ(job->text.size(), text.size() - std::string("^start(\"x\" ^run(y) z)").size() + 7);
}

std::vector<std::uint32_t> addActions(MKTaskInstruction& job, int count) {
  std::vector<std::uint32_t> ids;
  for (int k = 0; k < count; ++k) {
    auto action = std::make_shared<MKAnimationAction>(START);
    job.addAction(action);
    ids.push_back(action->id);
  }
  return ids;
}

// Automatic tags come after the parsed actions; a number recorded in between (as another
// stage might) is skipped as well. Each action added makes the first one current again.
TEST(BookmarkNumberingLater, ContinuesFromTheLastActionAndResetsTheCurrentAction) {
  MKTaskInstruction job;
  EXPECT_EQ(job.currentAction, job.actions.size());
  EXPECT_THROW(job.addAction(nullptr), std::invalid_argument);
  job.usedBookmarks = {3};
  EXPECT_EQ(addActions(job, 2), (std::vector<std::uint32_t>{1, 2}));
  job.usedBookmarks.push_back(5);
  job.currentAction = 2;
  EXPECT_EQ(addActions(job, 3), (std::vector<std::uint32_t>{4, 6, 7}));
  EXPECT_EQ(job.currentAction, 0u);
}

TEST(ActionRecords, EachHasAConditionOfItsOwn) {
  MKSoundAction sound(START_SOUND);
  ASSERT_NE(sound.condition, nullptr);
  EXPECT_NE(MKTaskAction(STOP).condition, sound.condition);
}

TEST(ActionRecords, AnErrorMakesTheRecordUnknownWithABookmarkOfKindMrk) {
  MKSoundAction sound(RUN_SOUND);
  sound.text = "^runSound(a/b, 101)";
  sound.markAsError("SECOND_PARAMETER_NOT_VALID");
  EXPECT_EQ(sound.type, UNKNOWN);
  EXPECT_EQ(sound.text, "SECOND_PARAMETER_NOT_VALID ^runSound(a/b, 101)");
  sound.id = 4294967295u;
  EXPECT_EQ(sound.bookmark(), "\\mrk=4294967295\\");
}

TEST(KeywordTable, EveryWrittenKeywordMapsBackToItsType) {
  for (MKTaskActionType type = START_TAG; type <= AFFECTATION; ++type) {
    EXPECT_EQ(MKTaskActionType_fromStr(MKTaskActionType_toStr(type)), type)
        << MKTaskActionType_toStr(type);
  }
  EXPECT_EQ(MKTaskActionType_fromStr("UNKNOWN"), UNKNOWN);
  EXPECT_EQ(MKTaskActionType_fromStr("^start "), UNKNOWN);
  EXPECT_EQ(MKTaskActionType_fromStr(""), UNKNOWN);
  EXPECT_EQ(MKTaskActionType_toStr(-1), "UNKNOWN");
  EXPECT_EQ(MKTaskActionType_toStr(19), "UNKNOWN");
  EXPECT_EQ(MKTaskActionType_bookmarkKind(INPUT_MODE2), "");
}

TEST(PrintedForm, MarksTheActionsBeforeTheCurrentOne) {
  const std::string text = R"(Hello \mrk=1\ world \mrkpause=2\)";
  MKTaskInstruction job(4, text, MokutoConfig(), Sitting);
  const auto printed = [&job] {
    std::ostringstream out;
    out << job;
    return out.str();
  };
  EXPECT_EQ(printed(), text);
  for (const auto& [type, written] : {std::pair{START, "^start(a)"}, std::pair{RUN, "^run(b)"}}) {
    auto action = std::make_shared<MKAnimationAction>(type);
    action->text = written;
    job.addAction(action);
  }
  const std::string start = text + "\n^start=1: ^start(a)";
  EXPECT_EQ(printed(), start + "\n^run=2: ^run(b)");
  job.currentAction = 1;
  EXPECT_EQ(printed(), start + "\taction already done\n^run=2: ^run(b)");
  job.currentAction = job.actions.size();
  EXPECT_EQ(printed(), start + "\taction already done\n^run=2: ^run(b)\taction already done");
}

}  // namespace
}  // namespace ZU
