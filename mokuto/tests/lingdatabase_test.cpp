// The linguistic database files: the writer's layout, the reader's lookups, its
// refusal of damaged files, and the selection of databases by language key.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

#include "ko/log.hpp"
#include "ko_test_helpers.hpp"
#include "lingtest.h"
#include "mkbdb/writer.h"
#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"

namespace {

using ZU::ZULingClassFeatures;
using ZU::ZULingSyntacticAnalyzerBinaryDatabase;

constexpr const char* kCategory = "syntacticanalyzer.bindatabase";

constexpr const char* kLexicon =
    "# a small French lexicon\n"
    "chat\tnoun/ms=chat\tverb/P3s=chatter\n"
    "chats\tnoun/mp=chat\n"
    "chaton\tnoun/ms=chaton\n"
    "château\tnoun/ms=château\n"
    "mange\tverb/PS13s=manger\tverb/Y2s=manger\n"
    "été\tauxiliary/K=être\tnoun/ms=été\n"
    "a\tauxiliary/P3s=avoir\tverb/P3s=avoir\n"
    "0\tdeterminant\n"
    "zut\tinterjection\n"
    "et\tconjunctive=et\n";

using lingtest::build;

void put32(std::string& bytes, std::size_t at, std::uint32_t value) {
  for (int i = 0; i < 4; ++i)
    bytes[at + static_cast<std::size_t>(i)] = static_cast<char>(value >> (8 * i));
}

class LingDatabaseTest : public ::testing::Test {
 protected:
  lingtest::Folder folder_;
};

TEST_F(LingDatabaseTest, EveryWordGivesItsRecordsAndBaseForms) {
  ZULingSyntacticAnalyzerBinaryDatabase db;
  ASSERT_TRUE(db.load(folder_.write("fr.bdb", build(kLexicon))));
  using namespace ZU;
  struct Case {
    std::string word;
    std::vector<ZULingClassFeatures> classes;
    ZU::ZULingWordClass lemmaClass;
    std::string lemma;
  };
  const std::vector<Case> cases = {
      {"chat", {{WORD_CLASS_NOUN, "ms"}, {WORD_CLASS_VERB, "P3s"}}, WORD_CLASS_VERB, "chatter"},
      {"chats", {{WORD_CLASS_NOUN, "mp"}}, WORD_CLASS_NOUN, "chat"},
      {"chaton", {{WORD_CLASS_NOUN, "ms"}}, WORD_CLASS_NOUN, "chaton"},
      {"château", {{WORD_CLASS_NOUN, "ms"}}, WORD_CLASS_NOUN, "château"},
      // The first record of the class decides.
      {"mange", {{WORD_CLASS_VERB, "PS13s"}, {WORD_CLASS_VERB, "Y2s"}}, WORD_CLASS_VERB, "manger"},
      // First bytes 0xC3, '0' and 'a' under one node: children in signed order.
      {"été", {{WORD_CLASS_AUXILIARY, "K"}, {WORD_CLASS_NOUN, "ms"}}, WORD_CLASS_NOUN, "été"},
      {"a",
       {{WORD_CLASS_AUXILIARY, "P3s"}, {WORD_CLASS_VERB, "P3s"}},
       WORD_CLASS_AUXILIARY,
       "avoir"},
      {"0", {{WORD_CLASS_DETERMINANT, ""}}, WORD_CLASS_DETERMINANT, ""},
      {"zut", {{WORD_CLASS_INTERJECTION, ""}}, WORD_CLASS_INTERJECTION, ""},
      // A class the word does not have: found, no base form.
      {"et", {{WORD_CLASS_CONJUNCTIVE, ""}}, WORD_CLASS_NOUN, ""},
      // A prefix of stored words, and a word not stored: "unkonwn".
      {"cha", {{WORD_CLASS_UNKNOWN, ""}}, WORD_CLASS_NOUN, ""},
      {"chien", {{WORD_CLASS_UNKNOWN, ""}}, WORD_CLASS_NOUN, ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.word);
    EXPECT_EQ(db.wordClasses(c.word), c.classes);
    std::string lemma = "stale";
    EXPECT_EQ(db.lemma(c.word, c.lemmaClass, lemma), c.classes[0].wordClass != 4);
    EXPECT_EQ(lemma, c.lemma);
  }
  EXPECT_EQ(db.flag, 1);
  EXPECT_STREQ(ZU::lingWordClassToStr(db.wordClasses("chien")[0].wordClass), "unkonwn");
  // No base form below the class of links.
  std::string lemma;
  EXPECT_FALSE(db.lemma("chat", ZU::WORD_CLASS_BOOKMARK, lemma));
  EXPECT_FALSE(db.lemma("chat", ZU::WORD_CLASS_INTERSPACE, lemma));
  EXPECT_TRUE(db.lemma("chat", ZU::WORD_CLASS_LINK_BETWEEN_WORDS, lemma));
}

TEST_F(LingDatabaseTest, FindGivesTheLongestStoredPrefix) {
  ZULingSyntacticAnalyzerBinaryDatabase db;
  ASSERT_TRUE(db.load(folder_.write("fr.bdb", build(kLexicon))));
  struct Case {
    std::string key;
    std::size_t start;
    bool found;
    std::size_t longestPrefix;
  };
  const std::vector<Case> cases = {
      {"chat", 0, true, 4},        {"cha", 0, false, 0},    {"chatons", 0, false, 6},
      {"chatte", 0, false, 4},     {"chats", 0, true, 5},   {"le chat", 3, true, 4},
      {"le chaton!", 3, false, 6}, {"", 0, false, 0},       {"chat", 4, false, 0},
      {"chat", 9, false, 0},       {"ch\xC3", 0, false, 0}, {"\xC3\xA9t\xC3\xA9s", 0, false, 5},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.key + " from " + std::to_string(c.start));
    std::size_t longestPrefix = 99;
    EXPECT_EQ(db.find(c.key, c.start, longestPrefix).has_value(), c.found);
    EXPECT_EQ(longestPrefix, c.longestPrefix);
  }
}

// The layout of a one-word file, byte for byte: base form, record, root, child.
TEST_F(LingDatabaseTest, WriterLaysOutTheFormat) {
  const std::string bytes = build("ab\tnoun/x=ab\n");
  const std::string expected(
      "\x02\0\0\0"
      "\x01\0\0\0"
      "\x07\0\0\0"
      "\x15\0\0\0"
      "\x01"  // header, flag
      "\x02"
      "ab"                // base form at 0
      "\x0B\x01\x00\x00"  // record at 3
      "\x00"
      "\x00"
      "\x01"
      "\x00\x00"    // root at 7, padding
      "\x10\0\0\0"  // child offset at 12
      "\x02"
      "ab"
      "\x01"
      "\x00"
      "\x03"
      "\x01"
      "x"            // child at 16: skip 3
      "\x03\0\0\0",  // record offset at 24
      17 + 28);
  EXPECT_EQ(bytes, expected);
}

TEST_F(LingDatabaseTest, DamagedFilesAreRefusedOrAnswerNotFound) {
  const std::string good = build("ab\tnoun/x=ab\n");
  constexpr std::size_t kBody = ZULingSyntacticAnalyzerBinaryDatabase::kBodyStart;
  struct Case {
    const char* name;
    std::size_t at;       // file offset
    std::string with;     // bytes written there
    const char* refusal;  // part of the warning, or nullptr when the file loads
  };
  auto word = [](std::uint32_t v) {
    std::string w(4, '\0');
    put32(w, 0, v);
    return w;
  };
  const std::vector<Case> cases = {
      {"root offset past the body", 8, word(28) + word(0), "root offset 28 lies past its body"},
      {"body size not the file's", 12, word(22), "announces a body of 29 bytes"},
      {"root children past the body", kBody + 9, "\xC8", "root node does not fit"},
      {"root label past the body", kBody + 7, "\xFF", "root node does not fit"},
      {"child offset past the body", kBody + 12, word(28), nullptr},
      {"child without label", kBody + 16, std::string(1, '\0'), nullptr},
      {"child label past the body", kBody + 16, "\x0C", nullptr},
      {"record count past the body", kBody + 19, "\xFF", nullptr},
      {"skip of zero", kBody + 21, std::string(1, '\0'), nullptr},
      {"offsets not aligned", kBody + 21, "\x02", nullptr},
      {"features past the offsets", kBody + 22, "\x05", nullptr},
      {"record offset past the body", kBody + 24, word(25), nullptr},
      {"base form offset past the body", kBody + 5, "\x1C\x00", nullptr},
      {"base form past the body", kBody + 0, "\x1C", nullptr},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::string bytes = good;
    bytes.replace(c.at, c.with.size(), c.with);
    const std::string path = folder_.write("damaged.bdb", bytes);
    ko::log::ScopedCapture capture(ko::log::Warning);
    ZULingSyntacticAnalyzerBinaryDatabase db;
    EXPECT_EQ(db.load(path), c.refusal == nullptr);
    if (c.refusal != nullptr) {
      EXPECT_TRUE(capture->containsPart(kCategory, ko::log::Warning, c.refusal));
      EXPECT_TRUE(capture->containsPart(kCategory, ko::log::Warning, "\"" + path + "\""));
    }
    std::size_t longestPrefix = 99;
    EXPECT_FALSE(db.find("ab", 0, longestPrefix).has_value());
    EXPECT_EQ(longestPrefix, 0u);
    EXPECT_EQ(db.wordClasses("ab"),
              (std::vector<ZULingClassFeatures>{{ZU::WORD_CLASS_UNKNOWN, ""}}));
  }
  // Bytes after the body the header announces are not read.
  ZULingSyntacticAnalyzerBinaryDatabase longer;
  ASSERT_TRUE(longer.load(folder_.write("longer.bdb", good + "tail")));
  std::size_t longestPrefix = 0;
  EXPECT_TRUE(longer.find("ab", 0, longestPrefix).has_value());
}

TEST_F(LingDatabaseTest, TruncatedAndOutOfDateFilesAreRefused) {
  const std::string good = build(kLexicon);
  ZULingSyntacticAnalyzerBinaryDatabase db;
  for (std::size_t length = 0; length < good.size(); ++length) {
    ko::log::ScopedCapture capture(ko::log::Warning);
    EXPECT_FALSE(db.load(folder_.write("cut.bdb", good.substr(0, length)))) << length;
    EXPECT_EQ(capture->count(), 1u) << length;
    EXPECT_EQ(db.wordClasses("chat")[0].wordClass, ZU::WORD_CLASS_UNKNOWN);
  }

  std::string old = good;
  old[0] = 1;
  const std::string path = folder_.write("old.bdb", old);
  ko::log::ScopedCapture capture(ko::log::Warning);
  EXPECT_FALSE(db.load(path));
  EXPECT_TRUE(capture->contains(
      kCategory, ko::log::Warning,
      "Linguistic database \"" + path + "\" is out of date. So, the database is not loaded."));
  const std::string missing = (folder_.path() / "missing.bdb").string();
  EXPECT_FALSE(db.load(missing));
  EXPECT_TRUE(capture->contains(kCategory, ko::log::Warning,
                                "Linguistic database \"" + missing + "\" not found."));
}

// Base forms must start in the body's first 64 KiB: the gesture tags go first, then the
// most frequent; the rest are left out.
TEST_F(LingDatabaseTest, BaseFormsKeptByTagThenFrequency) {
  std::string text;
  mkbdb::Options options;
  for (int i = 0; i < 8000; ++i) {
    const std::string word = "word" + std::to_string(10000 + i);
    text += word + "\tnoun=" + word + "-base\n";
    options.frequencies[word + "-base"] = i;
  }
  options.tags = {"word10000-base"};  // the least frequent
  mkbdb::Report report;
  ZULingSyntacticAnalyzerBinaryDatabase db;
  ASSERT_TRUE(db.load(folder_.write("big.bdb", build(text, options, &report))));
  EXPECT_EQ(report.baseForms, 8000u);
  EXPECT_LT(report.baseFormsKept, 8000u);
  EXPECT_LE(report.baseFormBytes, 65536u);
  EXPECT_EQ(report.tagsKept, 1u);
  std::string lemma;
  for (const auto& [word, kept] : std::vector<std::pair<std::string, bool>>{
           {"word10000", true}, {"word17999", true}, {"word10001", false}}) {
    SCOPED_TRACE(word);
    EXPECT_TRUE(db.lemma(word, ZU::WORD_CLASS_NOUN, lemma));
    EXPECT_EQ(lemma, kept ? word + "-base" : "");
  }
}

TEST(LingLexiconTest, MalformedLinesAreRefusedWithTheirLine) {
  for (const char* line : {"word", "\tnoun", "w\tbogus", "w\tbookmark", "w\t18", "w\t3=x"}) {
    SCOPED_TRACE(line);
    mkbdb::Lexicon lexicon;
    std::istringstream in(std::string("ok\tnoun\n") + line + "\n");
    EXPECT_THAT(
        ko::test::errorOf<std::runtime_error>([&] { mkbdb::readLexicon(in, "lex", lexicon); }),
        ::testing::StartsWith("lex:2: "));
  }
}

TEST_F(LingDatabaseTest, SetLanguageSharesReloadsAndDrops) {
  const std::string french = folder_.write("french.bdb", build(kLexicon));
  const std::string missing = (folder_.path() / "nothing.bdb").string();
  auto languages = std::make_shared<const ZU::ZULingLanguageMap>(
      ZU::ZULingLanguageMap{{"French", french}, {"fr_FR", french}, {"Missing", missing}});
  ZU::ZULingDatabaseUser analyzer(languages);
  ZU::ZULingDatabaseUser tagger(languages);
  ko::log::ScopedCapture capture(ko::log::Warning);

  analyzer.setLanguage("French");
  const ZU::ZULingDatabasePtr loaded = analyzer.database();
  ASSERT_TRUE(loaded);
  EXPECT_EQ(analyzer.databasePath(), french);

  // Were the file read again now, it would be refused.
  std::string old = build(kLexicon);
  old[0] = 1;
  folder_.write("french.bdb", old);
  analyzer.setLanguage("fr_FR");
  tagger.setLanguage("fr_FR");
  EXPECT_EQ(analyzer.database(), loaded);
  EXPECT_EQ(tagger.database(), loaded);
  EXPECT_EQ(capture->count(), 0u);

  analyzer.setLanguage("Klingon");
  EXPECT_FALSE(analyzer.database());
  EXPECT_EQ(analyzer.databasePath(), "");

  // A file that cannot be loaded is tried again at every selection.
  tagger.setLanguage("Missing");
  tagger.setLanguage("Missing");
  EXPECT_FALSE(tagger.database());
  EXPECT_EQ(capture->count(), 2u);
}

}  // namespace
