#include "mokuto/mokutoconfig.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <map>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "ko/json.hpp"
#include "ko/log.hpp"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace {

using ko::log::Error;
using ZU::MokutoConfig;
using ZU::ZUValue;

ZUValue json(const char* text) {
  return ZU::fromAnyReference(ko::fromJson(text));
}

std::string printed(const MokutoConfig& config) {
  std::ostringstream os;
  os << config;
  return os.str();
}

using Words = std::map<std::string, std::vector<std::string>>;
using Anims = std::map<std::string, std::set<std::string>>;

const char* const kDefaultPrinted =
    "config: bodyLanguageMode: contextual\n"
    "        msPauseBeforeSpeech: 500\n"
    "        behaviorAtEndOfMokuto: \"\"\n"
    "        ifBehaviorAtEndOfMokutoIsBlocking: True\n"
    "        armsBreathingAllowed: True\n"
    "        animationsPackages: \"animations/\"";

void expectDefaults(const MokutoConfig& c) {
  EXPECT_EQ(c.bodyLanguageMode, ZU::BODY_LANGUAGE_MODE_CONTEXTUAL);
  EXPECT_EQ(c.msPauseBeforeSpeech, 500);
  EXPECT_EQ(c.behaviorAtEndOfMokuto, "");
  EXPECT_TRUE(c.ifBehaviorAtEndOfMokutoIsBlocking);
  EXPECT_TRUE(c.armsBreathingAllowed);
  EXPECT_EQ(c.animationsPackages, std::vector<std::string>{"animations/"});
  EXPECT_TRUE(c.wordsToTags.empty());
  for (const auto& m : c.tagsToAnimations)
    EXPECT_TRUE(m.empty());
  EXPECT_FALSE(c.inputMode2);
}

// A configuration, and what it logs.
class MokutoConfigTest : public ::testing::Test {
 protected:
  ko::log::ScopedCapture cap;
  MokutoConfig c;
};

TEST_F(MokutoConfigTest, ResetKeepsOnlyTheFirstPackageAndFourEmptyMaps) {
  c.fromZUValue(json(R"([["bodyLanguageMode", "disabled"], ["msPauseBeforeSpeech", 3],
      ["behaviorAtEndOfMokuto", "b"], ["ifBehaviorAtEndOfMokutoIsBlocking", false],
      ["armsBreathingAllowed", false]])"));
  c.animationsPackages.push_back("other/");
  c.updateWordsToTags(json(R"([["hello", ["hi"]]])"));
  c.updateTagsToAnimations(json(R"([["hello", ["animations/Stand/a", "other/Sit/b"]]])"));
  c.inputMode2 = true;
  c.reset();
  expectDefaults(c);

  c.animationsPackages.clear();
  c.reset();
  EXPECT_EQ(c.animationsPackages, std::vector<std::string>{""});
}

TEST(EnumNamesTest, LookupsMatchTheFirstThreeNamesExactly) {
  const std::map<std::string, ZU::BodyLanguageMode> modes{
      {"disabled", 0}, {"random", 1},  {"contextual", 2},   {"Random", 3}, {"endOfEnum", 3},
      {"", 3},         {"random ", 3}, {"contextual_0", 3}, {"RANDOM", 3}};
  for (const auto& [name, mode] : modes)
    EXPECT_EQ(ZU::bodyLanguageModeFromStr(name), mode) << name;
  const std::map<std::string, ZU::PostureFamily> families{
      {"Standing", 0}, {"Sitting", 1},  {"SittingOnChair", 2},
      {"Unknown", 3},  {"standing", 3}, {"Stand", 3},
      {"Sit", 3},      {"", 3}};
  for (const auto& [name, family] : families)
    EXPECT_EQ(ZU::postureFamilyFromStr(name), family) << name;
  // The names of values outside the table are the last name.
  EXPECT_STREQ(ZU::bodyLanguageModeToStr(ZU::BODY_LANGUAGE_MODE_RANDOM), "random");
  EXPECT_STREQ(ZU::postureFamilyToStr(ZU::SittingOnChair), "SittingOnChair");
  for (std::int32_t out : {3, 4, -1, std::numeric_limits<std::int32_t>::min(),
                           std::numeric_limits<std::int32_t>::max()}) {
    EXPECT_STREQ(ZU::bodyLanguageModeToStr(out), "endOfEnum") << out;
    EXPECT_STREQ(ZU::postureFamilyToStr(out == 3 ? -1 : out), "Unknown") << out;
  }
  MokutoConfig c;
  c.bodyLanguageMode = 7;
  EXPECT_THAT(printed(c), ::testing::StartsWith("config: bodyLanguageMode: endOfEnum\n"));
}

TEST_F(MokutoConfigTest, SetsEveryKeyAndLaterPairsOverrideEarlierOnes) {
  c.fromZUValue(json(R"([["msPauseBeforeSpeech", 100], ["bodyLanguageMode", "random"],
      ["behaviorAtEndOfMokuto", "animations/Stand/Gestures/Hey_1"],
      ["ifBehaviorAtEndOfMokutoIsBlocking", false], ["armsBreathingAllowed", false],
      ["msPauseBeforeSpeech", 0], ["bodyLanguageMode", "disabled"]])"));
  EXPECT_EQ(cap->count(), 0u);
  EXPECT_EQ(printed(c),
            "config: bodyLanguageMode: disabled\n"
            "        msPauseBeforeSpeech: 0\n"
            "        behaviorAtEndOfMokuto: \"animations/Stand/Gestures/Hey_1\"\n"
            "        ifBehaviorAtEndOfMokutoIsBlocking: False\n"
            "        armsBreathingAllowed: False\n"
            "        animationsPackages: \"animations/\"");
}

struct RejectedCase {
  const char* name;
  const char* value;
  const char* message;
};

class MokutoConfigRejectedTest : public ::testing::TestWithParam<RejectedCase> {};

TEST_P(MokutoConfigRejectedTest, LogsOneErrorAndChangesNothing) {
  const RejectedCase& c = GetParam();
  ko::log::ScopedCapture cap;
  MokutoConfig config;
  config.fromZUValue(json(c.value));
  expectDefaults(config);
  const auto records = cap->records();
  ASSERT_EQ(records.size(), 1u);
  EXPECT_EQ(records[0].level, Error);
  EXPECT_EQ(records[0].category, "MokutoConfig");
  EXPECT_EQ(records[0].function, "ZU::MokutoConfig::fromZUValue");
  EXPECT_EQ(records[0].message, c.message);
}

INSTANTIATE_TEST_SUITE_P(
    Values, MokutoConfigRejectedTest,
    ::testing::Values(
        RejectedCase{"floatPause", R"([["msPauseBeforeSpeech", 1.5]])",
                     "uknown key \"msPauseBeforeSpeech\" with the value: 1.5"},
        RejectedCase{"intMode", R"([["bodyLanguageMode", 1]])",
                     "uknown key \"bodyLanguageMode\" with the value: 1"},
        RejectedCase{"intFlag", R"([["armsBreathingAllowed", 0]])",
                     "uknown key \"armsBreathingAllowed\" with the value: 0"},
        RejectedCase{"stringFlag", R"([["ifBehaviorAtEndOfMokutoIsBlocking", "true"]])",
                     "uknown key \"ifBehaviorAtEndOfMokutoIsBlocking\" with the value: \"true\""},
        RejectedCase{"nullBehavior", R"([["behaviorAtEndOfMokuto", null]])",
                     "uknown key \"behaviorAtEndOfMokuto\" with the value: "},
        RejectedCase{"unknownKey", R"([["tagsToWords", [["a", ["b"]]]]])",
                     "uknown key \"tagsToWords\" with the value: [[\"a\", [\"b\"]]]"},
        RejectedCase{"modeCase", R"([["bodyLanguageMode", "Random"]])",
                     "Invalid body language mode: \"Random\"\n"
                     "All the possible body language modes are: \"disabled\", \"random\" and "
                     "\"contextual\"."},
        RejectedCase{"modeEndOfEnum", R"([["bodyLanguageMode", "endOfEnum"]])",
                     "Invalid body language mode: \"endOfEnum\"\n"
                     "All the possible body language modes are: \"disabled\", \"random\" and "
                     "\"contextual\"."},
        RejectedCase{"negativePause", R"([["msPauseBeforeSpeech", -1]])",
                     "pause time can't be negative."}),
    [](const ::testing::TestParamInfo<RejectedCase>& p) { return p.param.name; });

TEST_F(MokutoConfigTest, GoesOnAfterARejectedPair) {
  c.fromZUValue(json(R"([["msPauseBeforeSpeech", -5], ["bodyLanguageMode", "Random"],
      ["volume", 1], [5], ["msPauseBeforeSpeech", 20], ["bodyLanguageMode", "random"],
      ["armsBreathingAllowed", 1], ["armsBreathingAllowed", false]])"));
  EXPECT_EQ(c.msPauseBeforeSpeech, 20);
  EXPECT_EQ(c.bodyLanguageMode, ZU::BODY_LANGUAGE_MODE_RANDOM);
  EXPECT_FALSE(c.armsBreathingAllowed);
  // One line for each refused pair: the lines themselves are in the table above.
  EXPECT_EQ(cap->count(), 4u);
}

TEST_F(MokutoConfigTest, MalformedValuesAndElementsAreSkippedSilently) {
  for (const char* text :
       {"5", "null", R"("msPauseBeforeSpeech")", R"([5, [], ["msPauseBeforeSpeech"],
            ["msPauseBeforeSpeech", 0, 1], [1, 0], [["msPauseBeforeSpeech"], 0]])"}) {
    c.fromZUValue(json(text));
  }
  expectDefaults(c);
  EXPECT_EQ(cap->count(), 0u);
  // A JSON object arrives as pairs.
  c.fromZUValue(json(R"({"msPauseBeforeSpeech": 0, "bodyLanguageMode": "random"})"));
  EXPECT_EQ(c.msPauseBeforeSpeech, 0);
  EXPECT_EQ(c.bodyLanguageMode, ZU::BODY_LANGUAGE_MODE_RANDOM);
}

// Only pairs of a tag and an array count, and only the strings of the array.
TEST_F(MokutoConfigTest, AddsTheTagToEachWordKeepsDuplicatesAndSkipsOtherShapes) {
  const ZUValue value = json(R"([["hello", ["hi", "hey"]]])");
  c.updateWordsToTags(value);
  EXPECT_EQ(c.wordsToTags, (Words{{"hey", {"hello"}}, {"hi", {"hello"}}}));
  c.updateWordsToTags(value);
  c.updateWordsToTags(json(R"([["greet", ["hi"]], [1, ["a"]], ["t", "a"], ["t", ["b"], 3], "t",
      [], ["t", [1, "c", null, ["d"]]]])"));
  c.updateWordsToTags(json("[]"));
  EXPECT_EQ(
      c.wordsToTags,
      (Words{{"c", {"t"}}, {"hey", {"hello", "hello"}}, {"hi", {"hello", "hello", "greet"}}}));
  EXPECT_EQ(cap->count(), 0u);
  for (const char* text : {"null", R"("hello")", "3"}) {
    c.updateWordsToTags(json(text));
    EXPECT_EQ(cap->records().back().function, "ZU::MokutoConfig::updateWordsToTags");
    EXPECT_EQ(cap->records().back().message, "The new tags to words should be an array");
  }
  EXPECT_EQ(cap->count(), 3u);
  EXPECT_EQ(c.wordsToTags.size(), 3u);
}

TEST_F(MokutoConfigTest, PrintedFormListsWordsByTag) {
  c.updateWordsToTags(json(R"([["hello", ["hi", "hey"]], ["greet", ["hi"]], ["hello", ["hey"]]])"));
  EXPECT_EQ(printed(c),
            std::string(kDefaultPrinted) +
                "\n        tagsToWords: "
                "\n                    tag: \"greet\" have words \"hi\""
                "\n                    tag: \"hello\" have words \"hey\" \"hey\" \"hi\"");
  c.animationsPackages.clear();
  EXPECT_THAT(printed(c), ::testing::HasSubstr("True\n        tagsToWords: \n"));
}

// Non-strings and animations of unknown posture are logged and the walk goes on; the
// first element of another shape ends it.
TEST_F(MokutoConfigTest, StoresEachAnimationUnderItsPostureAndLogsTheRest) {
  c.updateTagsToAnimations(json(R"([["hello", ["animations/Stand/Gestures/Hey_1",
      "animations/Sit/Gestures/Hey_1", 7, "animations/Stand/Gestures/Hey_1"]],
      ["wave", [null, "animations/Crouch/W", "animations/Stand/W"]],
      ["bow", [["animations/Sit/x"], "animations/SitOnPod/B"]], ["a", []],
      "bad", ["b", ["animations/Stand/y"]]])"));
  EXPECT_EQ(c.tagsToAnimations[ZU::Standing], (Anims{{"hello", {"animations/Stand/Gestures/Hey_1"}},
                                                     {"wave", {"animations/Stand/W"}}}));
  EXPECT_EQ(c.tagsToAnimations[ZU::Sitting], (Anims{{"hello", {"animations/Sit/Gestures/Hey_1"}}}));
  EXPECT_EQ(c.tagsToAnimations[ZU::SittingOnChair], (Anims{{"bow", {"animations/SitOnPod/B"}}}));
  EXPECT_TRUE(c.tagsToAnimations[ZU::Unknown].empty());
  std::vector<std::string> lines;
  for (const auto& r : cap->records()) {
    EXPECT_EQ(r.level, Error);
    EXPECT_EQ(r.category, "MokutoConfig");
    lines.push_back(r.function + ": " + r.message);
  }
  const std::string walk = "ZU::MokutoConfig::updateTagsToAnimations: ";
  EXPECT_THAT(lines,
              ::testing::ElementsAre(
                  walk + "The animation: \"7\" is not formatted as a string",
                  walk + "The animation: \"\" is not formatted as a string",
                  "ZU::MokutoConfig::xPostureFamilyFormAnimPath: Unknown posture of animation: "
                  "animations/Crouch/W the root folder after declareAnimationsPackage has to be: "
                  "Stand, Sit or SitOnPod",
                  walk + "The animation: \"[\"animations/Sit/x\"]\" is not formatted as a string",
                  walk + "The new tags to animations should be an array following this pattern: "
                         "[ [tag1, [anim1, anim2, anim3]], [tag2, [anim4]] ]"));
}

TEST(MokutoConfigAnimationsTest, NonArrayValueAndOtherPairShapesLogThePattern) {
  for (const char* text : {"null", "3", R"(["a"])", R"([["a", "animations/Stand/x"]])",
                           R"([["a", ["animations/Stand/x"], 1]])", R"([[1, []]])"}) {
    ko::log::ScopedCapture cap;
    MokutoConfig c;
    c.updateTagsToAnimations(json(text));
    EXPECT_TRUE(c.tagsToAnimations[ZU::Standing].empty()) << text;
    EXPECT_TRUE(
        cap->containsPart("MokutoConfig", Error, "The new tags to animations should be an array"))
        << text;
  }
  ko::log::ScopedCapture cap;
  MokutoConfig c;
  c.updateTagsToAnimations(json("[]"));
  EXPECT_EQ(cap->count(), 0u);
}

struct PostureCase {
  std::vector<std::string> packages;
  const char* path;
  ZU::PostureFamily family;
};

class MokutoConfigPostureTest : public ::testing::TestWithParam<PostureCase> {};

TEST_P(MokutoConfigPostureTest, FolderAfterThePackageNamesTheFamily) {
  const PostureCase& p = GetParam();
  ko::log::ScopedCapture cap;
  MokutoConfig c;
  c.animationsPackages = p.packages;
  EXPECT_EQ(c.xPostureFamilyFormAnimPath(p.path), p.family) << p.path;
  EXPECT_EQ(cap->count(), p.family == ZU::Unknown ? 1u : 0u);
}

const std::vector<std::string> kDefaultPackages{"animations/"};

INSTANTIATE_TEST_SUITE_P(
    Paths, MokutoConfigPostureTest,
    ::testing::Values(
        PostureCase{kDefaultPackages, "animations/Stand/Gestures/Hey_1", ZU::Standing},
        PostureCase{kDefaultPackages, "animations/Sit/Gestures/Hey_1", ZU::Sitting},
        PostureCase{kDefaultPackages, "animations/SitOnPod/Emotions/Happy_1", ZU::SittingOnChair},
        PostureCase{kDefaultPackages, "animations/Stand/", ZU::Standing},
        // Only the package's length counts, not its characters.
        PostureCase{kDefaultPackages, "somethingX/Sit/a", ZU::Sitting},
        PostureCase{kDefaultPackages, "animations/Standing/a", ZU::Unknown},
        PostureCase{kDefaultPackages, "animations/Sit", ZU::Unknown},
        PostureCase{kDefaultPackages, "animations/stand/a", ZU::Unknown},
        PostureCase{kDefaultPackages, "animations/", ZU::Unknown},
        PostureCase{{}, "animations/Stand/a", ZU::Unknown},
        // The first package that gives a match wins; later ones are not tried.
        PostureCase{{"animations/", "a/very/long/package/"}, "animations/Sit/a", ZU::Sitting},
        PostureCase{{"pkg/", "animations/"}, "animations/SitOnPod/a", ZU::SittingOnChair}));

TEST_F(MokutoConfigTest, PathShorterThanAPackageTriedThrowsAndKeepsWhatWasStored) {
  c.animationsPackages = {"animations/", "a/very/long/package/"};
  EXPECT_THROW(c.xPostureFamilyFormAnimPath("animations/Foo"), std::out_of_range);
  EXPECT_THROW(c.xPostureFamilyFormAnimPath("anim"), std::out_of_range);

  c.updateTagsToAnimations(json(R"([["a", ["animations/Stand/x"]]])"));
  EXPECT_THROW(c.updateTagsToAnimations(json(R"([["b", ["animations/Sit/y", "short"]],
                                                  ["c", ["animations/Stand/z"]]])")),
               std::out_of_range);
  EXPECT_EQ(c.tagsToAnimations[ZU::Standing], (Anims{{"a", {"animations/Stand/x"}}}));
  EXPECT_EQ(c.tagsToAnimations[ZU::Sitting], (Anims{{"b", {"animations/Sit/y"}}}));
  EXPECT_EQ(cap->count(), 0u);
}

}  // namespace
