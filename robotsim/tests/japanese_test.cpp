// The speech engine's Japanese: texts read into kana with MeCab, the tags at the edges of
// the words, and espeak-ng's timing of the result (durations, bookmarks beside words).
#include <gtest/gtest.h>

#include <algorithm>
#include <stdexcept>
#include <string>
#include <vector>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/speechscript.h"
#include "robotsim/zutexttospeech.h"
#include "speechjapanese.h"
#include "zu/zubroker.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {
namespace {

std::string ssmlOf(const std::string& text) {
  return toEspeakSsml(JapaneseReadings::shared().read(parseSpeechText(text)));
}

// ---- readings ----------------------------------------------------------------------

struct ReadingCase {
  std::string text;
  std::string ssml;  // inside <speak>
};

class JapaneseReading : public ::testing::TestWithParam<ReadingCase> {};

TEST_P(JapaneseReading, SpeaksTheTextInKana) {
  EXPECT_EQ(ssmlOf(GetParam().text), "<speak>" + GetParam().ssml + "</speak>");
}

INSTANTIATE_TEST_SUITE_P(
    Texts, JapaneseReading,
    ::testing::Values(
        // The particle は read "wa", a long vowel as written in the pronunciation.
        ReadingCase{"今日はいい天気ですね。", "キョーワ イイ テンキデスネ。"},
        ReadingCase{"3人で2024年に１０，０００円と3.14",
                    "サンニンデ ニセンニジュウヨンネンニ イチマンエント サンテンイチヨン"},
        ReadingCase{"8600と1000000000000と007と0",
                    "ハッセンロッピャクト イッチョウト ゼロゼロナナト ゼロ"},
        ReadingCase{"Ｈｅｌｌｏ worldは、「Ｃ＋＋、」です。",
                    "<voice name=\"en\">Hello world</voice>ワ、 「<voice "
                    "name=\"en\">C++</voice>、」デス。"},
        // A mark after the end of a sentence goes before its punctuation.
        ReadingCase{"はい。\\mrk=1\\いいえ！\\mrk=2\\",
                    "ハイ<mark name=\"0\"/>。 イーエ<mark name=\"1\"/>！"},
        // Inside a word, a tag moves to its nearest edge (the start on a tie); the pause
        // rule's comma stays.
        ReadingCase{"博\\mrk=1\\物館\\mrk=2\\ ,\\pau=300\\ ロボ\\mrk=3\\ット",
                    "<mark name=\"0\"/>ハクブツカン<mark name=\"1\"/>, <break strength=\"x-weak\" "
                    "time=\"300ms\"/><mark name=\"2\"/>ロボット"}));

// An unreadable kanji is left out and logged once; a missing dictionary is named.
TEST(JapaneseReadings, ReadingProblemsAreNamed) {
  JapaneseReadings reader(JapaneseReadings::kDictionary);
  ko::log::ScopedCapture cap(ko::log::Warning);
  EXPECT_EQ(toEspeakSsml(reader.read(parseSpeechText("𠮷と𠮷"))), "<speak>ト</speak>");
  std::size_t lines = 0;
  for (const auto& record : cap->records())
    lines += record.message.find("No reading for the kanji 𠮷 (U+20BB7)") != std::string::npos;
  EXPECT_EQ(lines, 1U);
  EXPECT_NE(ko::test::errorOf<std::runtime_error>([] {
              JapaneseReadings missing("/nonexistent/ipadic-utf8");
            }).find("mecab-ipadic-utf8"),
            std::string::npos);
}

// ---- spoken by espeak-ng --------------------------------------------------------------

// What the speech engine made of a Japanese text, spoken without waiting in real time.
struct Spoken {
  std::vector<SpeechMarkRecord> marks;
  std::vector<SpeechWordRecord> words;
  double durationUs = 0;
};

Spoken speak(const std::string& text) {
  const auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  ZUTextToSpeechOptions options;
  options.language = "Japanese";
  options.playbackRate = kSpeechAsFastAsPossible;
  options.recordAudio = false;
  options.timeline = std::make_shared<Timeline>();
  const auto tts = ZU::ZUModule::createModule<ZUTextToSpeech>(broker, "ZUTextToSpeech", options);
  ZU::ZUTextToSpeechProxy proxy(broker);
  const int id = proxy.post_say(text);
  EXPECT_FALSE(proxy.wait(id, 0));
  Spoken spoken{tts->markRecords(id), tts->wordRecords(id)};
  for (const auto& done : options.timeline->entries("ZUTextToSpeech", "done"))
    spoken.durationUs = done.result.asMap().at(0).second.to<double>();
  return spoken;
}

// Each bookmark comes when the word written after it begins, as the same text without
// bookmarks speaks it; the words are the caller's.
TEST(JapaneseSpeaking, EachBookmarkComesWithTheWordAfterIt) {
  const std::vector<std::string> pieces = {
      "今日は", "いい",     "天気ですね。", "私は",       "Helloと",  "言いながら、",
      "3人で",  "博物館に", "行きました！", "ロボットは", "2024年に", "生まれました。"};
  std::string marked, plain;
  std::vector<std::size_t> markedAt, plainAt;  // where each piece begins
  for (std::size_t n = 0; n < pieces.size(); ++n) {
    marked += "\\mrk=" + std::to_string(n + 1) + "\\";
    markedAt.push_back(marked.size());
    plainAt.push_back(plain.size());
    marked += pieces[n];
    plain += pieces[n];
  }
  const Spoken bookmarked = speak(marked);
  const auto words = speak(plain).words;
  ASSERT_EQ(bookmarked.marks.size(), pieces.size());
  for (const auto& word : words)
    EXPECT_EQ(word.text, plain.substr(word.offset, word.length));
  for (const auto& mark : bookmarked.marks) {
    const auto n = static_cast<std::size_t>(mark.number - 1);
    SCOPED_TRACE(pieces[n]);
    const auto at = [](const std::vector<SpeechWordRecord>& all, std::size_t offset) {
      return std::find_if(all.begin(), all.end(),
                          [&](const auto& w) { return w.offset == offset; });
    };
    ASSERT_NE(at(bookmarked.words, markedAt[n]), bookmarked.words.end());
    const auto word = at(words, plainAt[n]);
    ASSERT_NE(word, words.end());
    // After the end of a sentence, the bookmark comes at the end of the sentence, before
    // the pause.
    if (n > 0 && (pieces[n - 1].ends_with("。") || pieces[n - 1].ends_with("！"))) {
      EXPECT_LT(mark.audioUs, word->audioUs);
      continue;
    }
    EXPECT_NEAR(static_cast<double>(mark.audioUs), static_cast<double>(word->audioUs), 80'000);
  }
}

}  // namespace
}  // namespace robotsim
