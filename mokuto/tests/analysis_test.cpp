// The syntactic analysis and the automatic tags: the tokeniser, the structures, the
// look-back and the anticipation of the tags, the write-back, and the emotion of a text,
// on small databases that mkbdb builds; plus a few sentences on the real databases.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "ko/path.hpp"
#include "lingtest.h"
#include "mkbdb/writer.h"
#include "mokuto/zulingsyntacticanalyzer.h"
#include "mokuto/zulingsyntacticanalyzertagger.h"
#include "mokuto/zumokutoparser.h"

namespace {

namespace fs = std::filesystem;
using namespace ZU;

constexpr const char* kEnglish =
    "i\tpronoun/1s=i\n"
    "he\tpronoun/3ms=he\n"
    "like\tpreposition=like\tverb/WP=like\n"
    "likes\tverb/P3s=like\n"
    "apples\tnoun/p\n"
    "pears\tnoun/p\n"
    "plums\tnoun/p\n"
    "tea\tnoun/s\n"
    "coffee\tnoun/s\n"
    "and\tconjunctive\n"
    "or\tconjunctive\n"
    "in\tpreposition\n"
    "of\tpreposition\n"
    "for\tpreposition\n"
    "don't\tauxiliary/n=do\n"
    "the\tdeterminant\n"
    "big\tadjective=big\n"
    "thinking\tverb/G=think\tnoun/s=thinking\n"
    "hello\tinterjection=hello\n"
    "aujourd'hui\tadverb\n"
    "peut-être\tadverb\n"
    "je\tpronoun/1s=je\n"
    "ne\tadverb/n=ne\n"
    "n\tadverb/n=ne\n"
    "n'\tadverb/n=ne\n"
    "l\tdeterminant/s=le\n"
    "l'\tdeterminant/s=le\n"
    "homme\tnoun/ms=homme\n"
    "mange\tverb/P3s=manger\n"
    "pas\tadverb/n=pas\n"
    "les\tdeterminant/p=le\tpronoun_comp/3p=le\n"
    "pommes\tverb/PS2s=pommer\tnoun/fp=pomme\n"
    "poires\tnoun/fp=poire\n"
    "et\tconjunctive\n";

constexpr const char* kJapanese =
    "りんご\tnoun=りんご\n"
    "バナナ\tnoun=バナナ\n"
    "みかん\tnoun=みかん\n"
    "と\tpreposition=と\tconjunctive=と\n"
    "が\tpreposition=が\n"
    "好き\tadjective=好き\n"
    "です\tauxiliary=です\n"
    "食べ\tverb=食べる\n"
    "ない\tadjective=ない\tauxiliary/n=ない\n"
    "思い\tnoun=思い\tverb=思う\n";

constexpr const char* kEmotions =
    "happy\tunkonwn=positive\n"
    "great\tunkonwn=very positive\n"
    "sad\tunkonwn=negative\n"
    "awful\tunkonwn=very negative\n"
    "very\tunkonwn=strong adverb\n"
    "not\tunkonwn=negation\n"
    "don't\tunkonwn=negation\n";

class AnalysisTest : public ::testing::Test {
 protected:
  void SetUp() override {
    auto languages = std::make_shared<ZULingLanguageMap>();
    (*languages)["English"] = folder_.database("en.bdb", kEnglish, 1);
    (*languages)["Unspaced"] = folder_.database("en0.bdb", kEnglish, 0);
    (*languages)["Japanese"] = folder_.database("ja.bdb", kJapanese, 0);
    (*languages)["EnglishEmotions"] = folder_.database("emotions.bdb", kEmotions, 1);
    languages_ = languages;
    config_.msPauseBeforeSpeech = 0;
    tagging_ = std::make_unique<ZULingAutomaticTagging>(languages_);
  }

  ZULingSyntacticAnalysis analyse(const std::string& text,
                                  const std::string& language = "English") {
    ZULingSyntacticAnalyzer analyzer(languages_);
    analyzer.setLanguage(language);
    return analyzer.analyse(text);
  }

  // Parses the text and adds its automatic tags, as the compiler stage does.
  std::shared_ptr<MKTaskInstruction> compile(const std::string& text,
                                             const std::string& language = "English", MKID id = 1) {
    auto job = std::make_shared<MKTaskInstruction>(id, text, config_, Standing);
    ZUMokutoParser().parse(job, text, language == "Japanese");
    tagging_->process(*job, language);
    return job;
  }

  static std::vector<std::string> autoTags(const MKTaskInstruction& job) {
    std::vector<std::string> tags;
    for (const auto& action : job.actions) {
      if (action->type == AUTO_START_TAG)
        tags.push_back(static_cast<const MKAnimationAction&>(*action).tag);
    }
    return tags;
  }

  lingtest::Folder folder_;
  std::shared_ptr<const ZULingLanguageMap> languages_;
  MokutoConfig config_;
  std::unique_ptr<ZULingAutomaticTagging> tagging_;
};

// "kind[words]", "!" for a negated structure, the item count after "and" and "or".
std::string describe(const ZULingSyntacticAnalysis& analysis) {
  std::string out;
  for (const auto& s : analysis.structures) {
    out += out.empty() ? "" : " ";
    out += kLingStructureKindNames[s.kind];
    if (s.kind >= STRUCTURE_AND)
      out += std::to_string(s.itemCount);
    out += s.notNegated ? "[" : "![";
    std::string words;
    for (std::size_t c = s.first; c <= s.last; ++c) {
      if (analysis.chunks[c].isWord())
        words += (words.empty() ? "" : " ") + analysis.chunks[c].text;
    }
    out += words + "]";
  }
  return out;
}

// The chunks of an analysis, "|" between them; with their class after a ":" if asked.
std::string cut(const ZULingSyntacticAnalysis& analysis, bool withClasses = false) {
  std::string out;
  for (const auto& chunk : analysis.chunks) {
    out += (out.empty() ? "" : "|") + chunk.text;
    if (withClasses)
      out += ":" + std::to_string(chunk.wordClass());
  }
  return out;
}

TEST_F(AnalysisTest, TheTokeniserCutsTagsSpacesLinksPunctuationAndWords) {
  const std::vector<std::array<std::string, 3>> cases = {
      {"English", "Hello \\mrk=1\\ the\\pau=300\\",
       "Hello:10| :1| \\mrk=1\\ :0| :1|the:9| \\pau=300\\ :0"},
      // A backslash before a space, or never closed, is no tag.
      {"English", "a \\ b \\mrk=1", "a:4| :1|\\:3| :1|b:4| :1|\\:3|mrk:4|=:3|1:4"},
      // Stored words with links, elisions, a written word longer than a stored prefix.
      {"English", "don't aujourd'hui peut-être l'homme theme",
       "don't:15| :1|aujourd'hui:6| :1|peut-être:6| :1|l:9|':2|homme:11| :1|theme:4"},
      {"English", "pear-shaped n'a", "pear:4|-:2|shaped:4| :1|n:6|':2|a:4"},
      // The digit rule and repeated marks.
      {"English", "1 000,50 or 3.5!!! (2)", "1 000,50:4| :1|or:7| :1|3.5:4|!!!:3| :1|(:3|2:4|):3"},
      // Capitals: a known word keeps its class first, an unknown one is a proper noun.
      {"English", "The Paris", "The:9| :1|Paris:17"},
      // Unspaced: the longest stored word wherever it ends; unknown runs of katakana or
      // latin letters stay whole, other unknown characters go one by one.
      {"Japanese", "りんごとメロンが好き。Melon犬",
       "りんご:11|と:12|メロン:4|が:12|好き:5|。:3|Melon:17|犬:4"},
      {"Unspaced", "ithe theme", "i:13|the:9| :1|the:9|me:4"},
      // Without a database every word is unknown.
      {"Klingon", "Hello world", "Hello:17| :1|world:4"},
  };
  for (const auto& [language, text, chunks] : cases)
    EXPECT_EQ(cut(analyse(text, language), true), chunks) << language << ": " << text;
  // A proper noun is appended to a known word's classes.
  const auto the = analyse("The").chunks.at(0).classes;
  EXPECT_EQ(the, (std::vector<ZULingClassFeatures>{{WORD_CLASS_DETERMINANT, ""},
                                                   {WORD_CLASS_PROPER_NOUN, ""}}));
}

// Whatever the bytes, the chunks hold the whole text once: the tags with a space on
// either side, every other byte as written; tagging them never fails.
TEST_F(AnalysisTest, AnyTextIsCutWithoutLosingAByte) {
  std::vector<std::string> texts = {
      "",
      "\\",
      "\\\\",
      "\\ \\",
      "a\\b\\c\\",
      "\xE3",
      "\xE3\x81",
      "a\xFF'b",
      "-'-",
      "'''",
      "1 , . 2 ,3.",
      "\\pau=-5\\ x",
      "\\pau=99999999999999999999\\ a and b",
      "\\mrk=\\ \\mrkpause=2\\",
      "and or , and",
      "l'",
      "'l",
      "n'",
      "メロンーーー",
      std::string(300, 'x') + " and y",
  };
  std::mt19937 random(7);
  const std::string alphabet = "ab AI,'-\\=1.\xC3\xA9\xE3\x81\x82pau";
  for (int k = 0; k < 200; ++k) {
    std::string text;
    for (std::size_t n = random() % 40; n > 0; --n)
      text += alphabet[random() % alphabet.size()];
    texts.push_back(text);
  }
  for (const char* language : {"English", "Japanese", "Klingon"}) {
    for (const std::string& text : texts) {
      SCOPED_TRACE(std::string(language) + ": " + text);
      const ZULingSyntacticAnalysis analysis = analyse(text, language);
      std::string joined;
      for (const auto& chunk : analysis.chunks) {
        ASSERT_FALSE(chunk.text.empty());
        if (chunk.wordClass() == WORD_CLASS_BOOKMARK)
          joined += chunk.text.substr(1, chunk.text.size() - 2);
        else
          joined += chunk.text;
      }
      EXPECT_EQ(joined, text);
      for (const auto& structure : analysis.structures)
        ASSERT_LT(structure.last, analysis.chunks.size());
      compile(text, language);
    }
  }
}

TEST_F(AnalysisTest, StructuresGroupWordsAndFindCoordinations) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"I like apples, pears and plums", "nominal[I] verb[like] and3[apples pears and plums]"},
      {"apples, pears, and plums", "and3[apples pears and plums]"},
      {"apples and pears and plums", "and3[apples and pears and plums]"},
      {"tea or coffee", "or2[tea or coffee]"},
      {"I don't like tea", "nominal[I] verb![don't like] nominal[tea]"},
      {"I like tea and he likes coffee",
       "nominal[I] verb[like] nominal[tea] nominal[he] verb[likes] nominal[coffee]"},
      {"in Paris, in London and in Tokyo", "and3[in Paris in London and in Tokyo]"},
      {"a, b, c, d, e and f", "and6[a b c d e and f]"},
      {"the big apples, hello", "nominal[the big apples] nominal[hello]"},
      {"and plums, or", "nominal[plums]"},
      {"je ne mange pas les pommes et les poires",
       "nominal[je] verb![ne mange pas] and2[les pommes et les poires]"},
  };
  for (const auto& [text, expected] : cases)
    EXPECT_EQ(describe(analyse(text)), expected) << text;
  EXPECT_EQ(describe(analyse("りんご、バナナとみかんが好きです", "Japanese")),
            "and3[りんご バナナ と みかん] nominal[好き] verb[です]");
  EXPECT_EQ(describe(analyse("食べない", "Japanese")), "verb[食べ ない]");
  // A quoting particle after an adjective coordinates nothing.
  EXPECT_EQ(describe(analyse("ないと思い", "Japanese")), "nominal[ない] nominal[思い]");
  EXPECT_TRUE(lingIsNegationWord("wouldn't"));
  EXPECT_FALSE(lingIsNegationWord("Not"));
}

TEST_F(AnalysisTest, StructuresProposeTheirTags) {
  const std::vector<std::pair<std::string, std::vector<std::string>>> cases = {
      {"apples and pears", {"two"}},         {"apples, pears and plums", {"three"}},
      {"a, b, c and d", {"four"}},           {"a, b, c, d and e", {"five"}},
      {"a, b, c, d, e and f", {}},           {"tea or coffee", {"pick"}},
      {"I don't like tea", {"i", "oppose"}}, {"hello, the big thinking", {"hello", "big", "think"}},
  };
  // With the flag, tags that go back to the same word start come in reverse order.
  for (const auto& [text, tags] : cases) {
    auto proposed = autoTags(*compile(text));
    std::reverse(proposed.begin(), proposed.end());
    EXPECT_EQ(proposed, tags) << text;
  }
}

// A caller's gesture or blocking sound keeps automatic tags away for 1300 ms of speech
// after its bookmark; other actions do not.
TEST_F(AnalysisTest, TheLookBackDropsTagsNearTheCallersGestures) {
  EXPECT_THAT(autoTags(*compile("^start(a) I like apples, pears and plums")), ::testing::IsEmpty());
  EXPECT_THAT(autoTags(*compile("^start(a) I like many different kinds of fruit, for example "
                                "apples, pears and plums")),
              ::testing::ElementsAre("three"));
  const std::vector<std::pair<std::string, bool>> instructions = {
      {"^startTag(t)", false},    {"^start(a)", false},
      {"^runTag(t)", false},      {"^run(a)", false},
      {"^wait(a)", false},        {"^waitTag(t)", false},
      {"^waitSound(s/n)", false}, {"^runSound(s/n)", false},
      {"^stop(a)", true},         {"^stopTag(t)", true},
      {"^mode(random)", true},    {"^startSound(s/n)", true},
      {"^stopSound(s/n)", true},  {"^call(M.m())", true},
      {"^pCall(M.m())", true},    {"$x=1", true},
      {"^foo(x)", true},          {"\\mrk=9\\", true},
  };
  for (const auto& [instruction, tagged] : instructions) {
    const auto job = compile(instruction + " apples, pears and plums");
    EXPECT_EQ(autoTags(*job).size(), tagged ? 1u : 0u) << instruction;
  }
  // A pause counts its milliseconds, the two spaces around it 70 ms each: 1160 + 140 ms
  // of speech covers the look-back, 1150 + 140 ms does not.
  for (const auto& [pause, tagged] : {std::pair{1160, true}, std::pair{1150, false}}) {
    const auto job = compile("^start(a) \\pau=" + std::to_string(pause) + "\\ apples and pears");
    EXPECT_EQ(autoTags(*job).size(), tagged ? 1u : 0u) << pause;
  }
}

// A bookmark that the anticipation would bring within 1300 ms of speech after the
// caller's gesture stays before its word, where the look-back accepted it.
TEST_F(AnalysisTest, TheLookBackHoldsAfterTheMoveBack) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"^start(a) I like many kinds of fruit: apples, pears and plums",
       " \\mrk=1\\  I like many kinds of fruit:  \\mrk=2\\ apples"},
      {"^stop(a) I like many kinds of fruit: apples, pears and plums",
       " \\mrk=1\\  I like  \\mrk=4\\ many kinds of fruit: apples"},
      {"^start(a) \\pau=1300\\ I like many kinds of fruit: apples",
       " \\mrk=1\\   \\pau=1300\\   \\mrk=2\\ I"},
      {"^start(a) I like many different kinds of fruit, for example apples, pears and plums",
       " \\mrk=1\\  I like many different  \\mrk=2\\ kinds of fruit"},
  };
  for (const auto& [text, expected] : cases)
    EXPECT_THAT(compile(text)->text, ::testing::HasSubstr(expected)) << text;
}

TEST_F(AnalysisTest, BookmarksStandBeforeTheirWordOrAheadWithTheFlag) {
  const std::string text = "I like many kinds of fruit: apples, pears and plums";
  // Without the flag, right before the enumeration; with it, 1300 ms of speech earlier,
  // at the start of a word.
  const auto unspaced = compile(text, "Unspaced");
  EXPECT_THAT(unspaced->text, ::testing::HasSubstr("fruit:  \\mrk=2\\ apples,"));
  const auto spaced = compile(text);
  EXPECT_THAT(spaced->text, ::testing::HasSubstr("like  \\mrk=3\\ many kinds of fruit: apples,"));
  // A pause long enough is split where the 1300 ms end.
  const auto split = compile("Hello. \\pau=1000\\ I like apples, pears and plums");
  EXPECT_THAT(split->text,
              ::testing::HasSubstr(".  \\pau=260\\  \\mrk=4\\  \\pau=740\\  I like apples,"));
  EXPECT_THAT(autoTags(*split), ::testing::ElementsAre("hello", "i", "like", "three"));
  // Going back past the start stops at the first chunk.
  EXPECT_EQ(compile("apples and pears")->text, " \\mrk=1\\ apples and pears");
}

TEST_F(AnalysisTest, ThePauseBeforeSpeechComesOncePerTextIdInContextualModeAlone) {
  config_.msPauseBeforeSpeech = 500;
  EXPECT_EQ(compile("tea", "English", 7)->text, " \\pau=500\\ tea");
  EXPECT_EQ(compile("tea", "English", 7)->text, "tea");
  EXPECT_EQ(compile("tea", "English", 8)->text, " \\pau=500\\ tea");
  config_.msPauseBeforeSpeech = 0;
  EXPECT_EQ(compile("tea", "English", 9)->text, "tea");
  config_.msPauseBeforeSpeech = 500;
  EXPECT_EQ(compile("tea", "English", 9)->text, " \\pau=500\\ tea");
  // Only contextual mode tags; Japanese keeps its comma.
  config_.bodyLanguageMode = BODY_LANGUAGE_MODE_RANDOM;
  EXPECT_EQ(compile("apples and pears", "English", 9)->text, "apples and pears");
  config_.bodyLanguageMode = BODY_LANGUAGE_MODE_CONTEXTUAL;
  config_.msPauseBeforeSpeech = 0;
  EXPECT_EQ(compile("\\mrk=1\\ \\pau=300\\", "Japanese")->text, " \\mrk=1\\  , \\pau=300\\ ");
  EXPECT_EQ(compile("\\mrk=1\\ \\pau=300\\", "English")->text, " \\mrk=1\\   \\pau=300\\ ");
}

TEST_F(AnalysisTest, ConfigurationWordsChooseAmongTheirTags) {
  config_.wordsToTags["tea"] = {"drink", "cup"};
  std::set<std::string> seen;
  for (int k = 0; k < 64; ++k) {
    const auto tags = autoTags(*compile("Tea"));
    ASSERT_EQ(tags.size(), 1u);
    seen.insert(tags[0]);
  }
  EXPECT_EQ(seen, (std::set<std::string>{"drink", "cup"}));
  // Without a database: only the configuration's words and the parsed actions.
  const auto job = compile("^run(x) I like tea, pears and plums", "Klingon");
  EXPECT_EQ(job->actions.size(), 1u);
  EXPECT_THAT(autoTags(*compile("I like tea and pears", "Klingon")), ::testing::ElementsAre("two"));
  config_.wordsToTags["i"] = {"me"};
  EXPECT_THAT(autoTags(*compile("I like coffee", "Klingon")), ::testing::ElementsAre("me"));
}

TEST_F(AnalysisTest, EmotionFollowsItsLabels) {
  using Labels = std::vector<std::string>;
  const std::vector<std::pair<Labels, std::int32_t>> cases = {
      {{"positive", "negation"}, -1},
      {{"very negative"}, -2},
      {{"negative", "strong adverb"}, -2},
      {{"strong adverb", "positive"}, 2},
      {{"positive", "negative"}, 0},
      {{}, 0},
      {{"very positive", "negative"}, 2},
      {{"positive", "very negative", "negation"}, 1},
      {{"very positive", "negation", "negation"}, 2},
      {{"negative", "negative", "positive"}, 0},
      {{"very positive", "strong adverb", "negation"}, -1},
  };
  for (const auto& [labels, expected] : cases)
    EXPECT_EQ(lingEmotionOfLabels(labels), expected) << ::testing::PrintToString(labels);

  ZULingEmotionEstimator estimator(languages_);
  std::vector<ZULingEmotionWord> words;
  EXPECT_EQ(estimator.getEmotion("English", "I am NOT very happy", &words), -1);
  EXPECT_EQ(words, (std::vector<ZULingEmotionWord>{
                       {"NOT", "negation"}, {"very", "strong adverb"}, {"happy", "positive"}}));
  EXPECT_EQ(estimator.getEmotion("English", "awful"), -2);
  EXPECT_EQ(estimator.getEmotion("French", "awful"), 0);
  EXPECT_EQ(estimator.getEmotion("", "awful"), 0);
}

// On the databases of the build: sensible structures and tags in the three languages,
// and every word tag of the starter library kept as a base form.
class RealDatabases : public ::testing::Test {
 protected:
  void SetUp() override {
    languages_ = std::make_shared<ZULingLanguageMap>(makeLingLanguageMap());
    for (const char* language : {"English", "French", "Japanese"}) {
      if (!fs::exists(languages_->at(language)))
        GTEST_SKIP() << "no linguistic databases in this build";
    }
  }
  std::shared_ptr<const ZULingLanguageMap> languages_;
};

TEST_F(RealDatabases, SentencesOfTheThreeLanguages) {
  struct Case {
    std::string language;
    std::string text;
    std::string structures;
  };
  const std::vector<Case> cases = {
      {"English", "I like apples, pears and plums, but I don't like tea or coffee.",
       "nominal[I] verb[like] and3[apples pears and plums] nominal[I] verb![don't like] "
       "or2[tea or coffee]"},
      {"French", "J'aime les pommes, les poires et les prunes, mais je ne bois pas de thé.",
       "nominal[J] verb[aime] and3[les pommes les poires et les prunes] nominal[je] "
       "verb![ne bois pas] nominal[de thé]"},
      {"Japanese", "りんごとバナナが好きです。", "and2[りんご と バナナ] nominal[好き] verb[です]"},
      // A subject after "and" that follows a prepositional group begins a clause.
      {"English", "I was born in Paris and I was happy",
       "nominal[I] verb[was born] nominal[Paris] nominal[I] verb[was] nominal[happy]"},
      {"French", "je suis né à Paris et il faisait froid",
       "nominal[je] verb[suis né] nominal[Paris] nominal[il] verb[faisait] nominal[froid]"},
      // "A and B and C" where B can be a verb and its object: a second action, then a list.
      {"English", "They are members of the team and moderate news and announcements.",
       "nominal[They] verb[are] nominal[members] nominal[the team] and2[moderate news and "
       "announcements]"},
  };
  for (const Case& c : cases) {
    ZULingSyntacticAnalyzer analyzer(languages_);
    analyzer.setLanguage(c.language);
    EXPECT_EQ(describe(analyzer.analyse(c.text)), c.structures) << c.text;
  }
}

TEST_F(RealDatabases, TheLibrarysWordTagsAreBaseForms) {
  const std::set<std::string> structureTags = {"two",  "three",  "four",    "five",
                                               "pick", "oppose", "medidate"};
  const std::string library = ko::path::findData("zefoko", "behaviors/animations/Stand/Gestures");
  ASSERT_FALSE(library.empty());
  std::vector<ZULingDatabasePtr> databases;
  for (const char* language : {"English", "French", "Japanese"}) {
    ZULingDatabaseUser user(languages_);
    user.setLanguage(language);
    ASSERT_TRUE(user.database()) << language;
    databases.push_back(user.database());
  }
  for (const std::string& tag : mkbdb::readBehaviorTags(library)) {
    if (structureTags.count(tag) != 0)
      continue;
    // Some language gives the tag itself as the base form of the tag's word.
    bool kept = false;
    for (const auto& database : databases) {
      std::string baseForm;
      const auto classes = database->wordClasses(tag);
      kept = kept || (database->lemma(tag, classes.front().wordClass, baseForm) && baseForm == tag);
    }
    EXPECT_TRUE(kept) << tag;
  }
}

// The data of the databases: words with their cut, base form or emotion label.
TEST_F(RealDatabases, WordsGetTheirCutBaseFormAndLabel) {
  ZULingSyntacticAnalyzer japanese(languages_);
  japanese.setLanguage("Japanese");
  // Japanese is cut where MeCab cuts it; a katakana run is one word.
  for (const auto& [text, expected] : std::vector<std::pair<std::string, std::string>>{
           {"しています", "し|て|い|ます"},
           {"ありません", "あり|ません"},
           {"でください", "で|ください"},
           {"プロンプト", "プロンプト"},
           {"ファイルシステム", "ファイルシステム"},
           {"楽しいですね", "楽しい|です|ね"},
       })
    EXPECT_EQ(cut(japanese.analyse(text)), expected) << text;

  // The base form of each word's first record, or its emotion label; "" for none.
  struct BaseForm {
    std::string language, word, baseForm;
  };
  const std::vector<BaseForm> baseForms = {
      {"Japanese", "し", "する"},
      {"French", "au", "à"},
      {"French", "aux", "à"},
      {"French", "du", "de"},
      {"French", "des", "de"},
      {"French", "cela", "cela"},
      {"French", "vi", "vi"},
      {"French", "votre", "votre"},
      {"French", "fichiers", "fichier"},
      {"French", "four", ""},
      {"English", "no", "no"},
      {"English", "non", ""},
      {"English", "files", "file"},
      {"FrenchEmotions", "réussi", "positive"},
      {"FrenchEmotions", "succès", "positive"},
      {"FrenchEmotions", "échec", "negative"},
      {"FrenchEmotions", "bienvenue", "positive"},
      {"FrenchEmotions", "félicitations", "very positive"},
      {"FrenchEmotions", "tout", ""},
      {"EnglishEmotions", "sorry", "negative"},
      {"EnglishEmotions", "congratulations", "very positive"},
      {"ja_JPEmotions", "ね", ""},
      {"ja_JPEmotions", "ません", "negation"},
      {"ja_JPEmotions", "ず", "negation"},
      {"ja_JPEmotions", "ありがとう", "positive"},
  };
  for (const BaseForm& b : baseForms) {
    ZULingDatabaseUser user(languages_);
    user.setLanguage(b.language);
    ASSERT_TRUE(user.database()) << b.language;
    std::string baseForm;
    const auto classes = user.database()->wordClasses(b.word);
    user.database()->lemma(b.word, classes.front().wordClass, baseForm);
    EXPECT_EQ(baseForm, b.baseForm) << b.language << ": " << b.word;
  }
  // The emotion of a few sentences.
  ZULingEmotionEstimator estimator(languages_);
  for (const auto& [language, text, emotion] :
       std::vector<std::tuple<std::string, std::string, int>>{
           {"Japanese", "楽しいですね", 1},
           {"Japanese", "満足していません", -1},
           {"Japanese", "申し訳ありません", -1},
           {"French", "Le test a réussi", 1},
           {"English", "Sorry, I am late", -1},
       })
    EXPECT_EQ(estimator.getEmotion(language, text), emotion) << text;
}

// Structure tags count things: verbs and clauses joined by "and" or "or" get none; the
// starter library's tags are words of one language.
TEST_F(RealDatabases, OnlyThingsAreEnumerated) {
  struct Case {
    std::string language, text;
    bool enumeration;
  };
  const std::vector<Case> cases = {
      {"English", "I like apples and pears.", true},
      {"English", "Apples, pears, and plums are ripe.", true},
      {"English", "You can read, write and remove files.", false},
      {"English", "You can add or remove files.", false},
      {"English", "Type your password and press the Enter key.", false},
      {"English", "There is one disk, and everything is there.", false},
      {"English", "They are used for games, and they all have a network.", false},
      {"English", "Sign up when booking a holiday and check if anyone is there.", false},
      {"English", "It opens the library and the library calls the kernel.", false},
      {"English", "It is a great feature and very useful.", false},
      {"English", "It does more and comes with examples.", false},
      {"English", "Follow the guide provided by the team and sent to the list.", false},
      {"English", "Copy the files somewhere else and run the tool.", false},
      {"English", "Tools aid developers and free their time.", false},
      {"English", "It declares a need and all of the files listed here must exist.", false},
      {"English", "There were some problems and a few of them were hard.", false},
      {"English", "He sold apples and the pears picked in May.", true},
      {"English", "Users reach the mirrors and get used to them.", false},
      {"English", "It loads the image to memory and passes control over.", false},
      {"French", "Il charge le noyau en mémoire et lance init.", false},
      {"English", "This bypasses the communication channel and gains speed.", false},
      {"English", "It is run to give root privileges to users and log root activity.", false},
      {"English", "The packages provide information for maintainers or help with the work.", false},
      {"English", "I use disks, tapes or films from a good shop and store in a cool place.", false},
      {"English", "This will allow a review of your text and package name.", true},
      {"English", "We ship documents in PDF and plain text format.", true},
      {"English", "It returns the addresses for it and exits.", false},
      {"English", "It spreads the load over several servers and networks.", true},
      {"French", "Il a de riches fonctionnalités et aide à identifier les processus.", false},
      {"English", "Data should be on different disks and machines to resist it.", true},
      {"French", "J'achète des pommes d'une petite marque et je les range ici.", false},
      {"English", "It sorts the files and lists of names.", true},
      {"English", "Build the package with dpkg-buildpackage and run lintian on it.", false},
      {"English", "Set the version with dch and then insert the comments.", false},
      {"English", "The cat and the dog are asleep.", true},
      {"English", "Check the directory and file names.", true},
      {"English", "Edit those files and in those lines replace the path.", false},
      {"English", "These rules are merely advice, and are not requirements.", false},
      {"English", "It is kept in the patches directory and the source tree is untouched.", false},
      {"English", "Although books and documents are helpful, practice.", true},
      {"English", "Learn how it works and how you can help.", false},
      {"English", "Put a space between each directory or file in the name.", true},
      {"English", "Changing the owner or the rights of a file changes its time.", true},
      {"French", "Je mange des pommes et des poires.", true},
      {"French", "Lisez les erreurs du paquet et Chapitre 9.", true},
      {"French", "Cela permet de lire le fichier, et de manger ses pommes.", false},
      {"French", "Une question permet de garder les fichiers ou non.", false},
      {"French", "Il ouvre le fichier et ferme la fenêtre.", false},
      {"French", "Il crée le squelette du paquet et il utilise debhelper.", false},
      {"French", "C'est une idée d'UNIX, et les noyaux de Linux ont développé cette idée.", false},
      {"French", "Ce n'est pas une personne et les écrans de debconf ne parlent pas.", false},
      {"French", "Il est supprimé du fichier et objcopy --add-gnu-debuglink peut servir.", false},
      {"French", "Ils sont dans /bin/truc, et les symboles de /lib/libtruc.so.1 sont là.", false},
      {"French", "Si vous n'êtes pas un porteur et que vous utilisez i386, lisez ceci.", false},
      {"French", "Vous devriez l'envoyer vers DELAYED/7 et dire au responsable d'attendre.", false},
      {"French", "Il faut le dire sur la liste et de le mentionner dans le sujet.", false},
      {"French", "Vous lisez le paquet d'exemple et vous vous apprêtez à partir.", false},
      {"French", "Vous devriez analyser pourquoi et œuvrer pour corriger cela.", false},
      {"French", "Vous devriez mettre les pommes et les poires dans le panier.", true},
      {"French", "Il dit que les pommes et les poires de Paris sont mûres.", true},
      {"French", "Le chat et le chien de Paul dorment.", true},
      {"English", "Please send it along to debian-l10n@lists.example.org and request feedback.",
       false},
      {"English", "The field should better be version agnostic and point to the main branch.",
       false},
      {"English", "Creating \"/etc/truc.conf\" to set macros and editing \"/etc/truc.template\".",
       false},
      {"English", "It says that a package replaces another, and that for this purpose it can.",
       false},
      {"English", "It has modules that cover many applications, and that are sent by servers.",
       false},
      {"French", "Il modifie des paquets de base et dont l'intégration serait gênante.", false},
      {"English", "Compare the name of the source and that of the binary.", true},
      {"English",
       "The package, which they compile for the Unstable version and place on the server.", false},
      {"French", "Le paquet, qu'il compile pour Unstable et place sur le serveur.", false},
      {"English", "They assist with the translation and review of documents.", true},
      {"English", "The site is smaller, with only fifty workers, and produces amplifiers.", false},
      {"French",
       "Il détecte les systèmes installés sur l'ordinateur et ajoute automatiquement des choix.",
       false},
      {"English", "The project started in 2014 and aims to provide support.", false},
      {"English",
       "The former release becomes Oldstable and the one even before becomes Oldoldstable.", false},
      {"French", "Certains ont contribué à Debian LTS, et d'autres ont préféré payer.", false},
      {"French", "Il correspond aux erreurs sur le site de Debian et lists.example.org rassemble.",
       false},
      {"English", "Developers have many duties, and as official members, they have influence.",
       false},
      {"English",
       "Tools include dch, which reads the file from the shell, and debuild, which is a wrapper.",
       true},
      {"English", "It is shown on the laptop, and the session (for each user) will be secure.",
       false},
      {"French", "Il s'assoit sur la chaise et le chien (un gros) dort.", false},
      {"English",
       "Filters such as Message Authentication, Reporting and Conformance (MARC) are used.", true},
      {"French", "Le choix revêt donc une importance capitale et il est facile de se tromper.",
       false},
      {"French", "Il mange donc des pommes et des poires.", true},
      {"English",
       "It requires that drivers know it, and that they properly reconfigure the devices.", false},
      {"English", "I like this and that one.", true},
      {"English", "The suffix is a number and the files that we keep in the folder are small.",
       false},
      {"French", "Le suffixe est long et les composants qui sont listés sont les caractères.",
       false},
      {"French", "J'aime les paquets et les fichiers qui sont listés dans le dossier.", true},
      {"English", "The zone is example.org and the address components are each a letter.", false},
      {"English",
       "keys/server.crt goes to /etc/ssl/certs/server.crt, and keys/server.key goes to "
       "/etc/ssl/private/server.key.",
       false},
      {"English", "Write to team-devel@lists.example.org or team-release@lists.example.org.", true},
      {"English", "The certificate goes to the server and the key goes to the client.", false},
      {"French", "Il décompresse l'archive et la recompresse.", false},
      {"English", "The zone is example.org and the records which are listed are short.", false},
      {"English", "Declare the name of the machine, or set up a static network.", false},
      {"English",
       "The advice is to stay out of such debates, and maybe rapidly skim through their content.",
       false},
      {"English", "It offers speed, and maybe support for IPv6.", true},
      {"English", "If SLAAC is activated in the network and IPv6 on the computer, it works.",
       false},
      {"English", "In short, software was designed with security and reliability in mind.", true},
      {"French", "Le premier pourra être /dev/sdb et le second /dev/sdc.", false},
      {"French", "Les noyaux intègrent le QoS et toute la panoplie des modules.", true},
      {"English", "The kernel learns about any newly added device and hands out a pair of numbers.",
       false},
      {"English",
       "The daemon handles activation of the interfaces and a user interface controls this daemon.",
       false},
      {"French", "Ils sont séparés par des virgules et c'est l'opérateur qui décide.", false},
      {"English", "It is enough to open these files and re-save them as UTF-8.", false},
      {"English",
       "Note that ACLs are processed in their order and that an earlier entry that fits has "
       "precedence.",
       false},
      {"French",
       "Ce champ indique si le système doit être vérifié au démarrage et dans quel ordre.", false},
      {"French", "On voit ce qui se passe dans la communauté et ce à quoi ses membres pensent.",
       false},
      {"English",
       "The first desktop uses the mutter manager, Plasma uses kwin, and Xfce (which we show "
       "later) has xfwm.",
       false},
      {"French",
       "Le câble va au port central, qui permet de relier les commutateurs et sur lequel tout le "
       "trafic passe.",
       false},
      {"French",
       "Le module est intégré dans les noyaux fournis par Debian et les outils Unix de base le "
       "gèrent sans peine.",
       false},
      {"French", "Changer le propriétaire ou les droits d'un fichier le modifie.", true},
      {"French",
       "Il ne faut pas donner plus que les droits utiles et il convient de garder des copies.",
       false},
      {"English",
       "The filter weighs the IP address/sender/recipient triplet and looks in its table whether "
       "it was seen.",
       false},
      {"English",
       "Two options are needed to turn on logging, and the log_max_size setting needs to be set.",
       false},
      {"English", "Set the log_level, the max_size, and the dry_run in the file.", true},
      {"French",
       "Le journal est gardé dans un dossier et chaque entrée commençant par une date (suivie "
       "d'un point) marque la fin d'une session.",
       false},
      {"English",
       "It lets you build a system by choosing a set of the packages, configuring them with a "
       "tool, adding specific software, and executing custom scripts at the end.",
       false},
      {"French", "Il suffit de nommer le document notes.txt et de le placer à la racine du disque.",
       false},
      {"English", "The best way is to skip the usual traps and get quick replies.", false},
      {"English", "Use the flag to filter results and target precise data.", false},
      {"English", "I want to buy red apples and green organic pears.", true},
      {"English", "The page shows the open bugs and release critical issues.", true},
      {"English",
       "The stub is kept as a small package, relying on the new one and shipping only the basic "
       "files.",
       false},
      {"English", "It works by relying on the tracking system and mailing lists.", true},
  };
  for (const Case& c : cases) {
    ZULingSyntacticAnalyzer analyzer(languages_);
    analyzer.setLanguage(c.language);
    const ZULingSyntacticAnalysis analysis = analyzer.analyse(c.text);
    const bool enumeration =
        std::any_of(analysis.structures.begin(), analysis.structures.end(), [](const auto& s) {
          return s.kind == STRUCTURE_AND || (s.kind == STRUCTURE_OR && s.itemCount == 2);
        });
    EXPECT_EQ(enumeration, c.enumeration) << c.text << ": " << describe(analysis);
  }
  // Words of one language that another spells alike call for no gesture there: their
  // tags are none of the library's. The answer "No" shakes the head.
  const std::vector<std::string> library =
      mkbdb::readBehaviorTags(ko::path::findData("zefoko", "behaviors/animations/Stand/Gestures"));
  ZULingAutomaticTagging tagging(languages_);
  for (const auto& [language, text, tag, wanted] :
       std::vector<std::tuple<std::string, std::string, std::string, bool>>{
           {"English", "Read the contents of the file.", "content", false},
           {"English", "It works with no file.", "no", false},
           {"English", "No file, no answer.", "no", false},
           {"English", "A non-POSIX shell.", "non", false},
           {"English", "Log in as the super user.", "super", false},
           {"French", "Mettez le plat au four.", "four", false},
           {"English", "No, thank you.", "no", true},
       }) {
    MokutoConfig config;
    config.msPauseBeforeSpeech = 0;
    MKTaskInstruction job(1, text, config, Standing);
    tagging.process(job, language);
    std::vector<std::string> gestures;
    for (const auto& action : job.actions) {
      const std::string& gesture = static_cast<const MKAnimationAction&>(*action).tag;
      if (std::find(library.begin(), library.end(), gesture) != library.end())
        gestures.push_back(gesture);
    }
    EXPECT_EQ(std::find(gestures.begin(), gestures.end(), tag) != gestures.end(), wanted) << text;
  }
}

}  // namespace
