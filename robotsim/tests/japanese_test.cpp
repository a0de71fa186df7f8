// The speech engine's Japanese: texts read into kana with MeCab, the tags at the edges of
// the words, and espeak-ng's timing of the result (durations, bookmarks beside words).
#include <gtest/gtest.h>

#include <algorithm>
#include <iterator>
#include <numeric>
#include <random>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "ko/log.hpp"
#include "ko/session.hpp"
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

TEST(JapaneseReadings, UnreadableKanjiAreLoggedOnceAndLeftOut) {
  JapaneseReadings reader(JapaneseReadings::kDictionary);
  ko::log::ScopedCapture cap(ko::log::Warning);
  const auto read = reader.read(parseSpeechText("𠮷と𠮷"));
  EXPECT_EQ(toEspeakSsml(read), "<speak>ト</speak>");
  std::size_t lines = 0;
  for (const auto& record : cap->records())
    lines += record.message.find("No reading for the kanji 𠮷 (U+20BB7)") != std::string::npos;
  EXPECT_EQ(lines, 1U);
}

TEST(JapaneseReadings, AMissingDictionaryIsNamed) {
  try {
    JapaneseReadings reader("/nonexistent/ipadic-utf8");
    ADD_FAILURE() << "no error";
  } catch (const std::runtime_error& e) {
    EXPECT_NE(std::string(e.what()).find("mecab-ipadic-utf8"), std::string::npos) << e.what();
  }
}

// ---- tags among the words ----------------------------------------------------------------

const std::vector<std::string> kSentences = {"今日はいい天気ですね。", "博物館に3人で行きました。",
                                             "私はHelloと言いながら2024年に東京タワーを見た。",
                                             "ロボットが、ゆっくり歩いています！"};

std::size_t characters(std::string_view s) {
  return static_cast<std::size_t>(
      std::count_if(s.begin(), s.end(), [](char c) { return (c & 0xC0) != 0x80; }));
}

// Marks at random places, one of them at each character edge in turn: none is lost or
// reordered, the reading does not change, and a mark written inside a word goes to the
// word's nearer edge (the start on a tie), any other stays between the same words.
TEST(JapaneseTags, MarksAnywhereKeepTheirOrderAndTheirWords) {
  std::mt19937 random(23);
  for (const std::string& sentence : kSentences) {
    const auto spoken = [](const SpeechScript& script) {
      std::string out;
      for (const auto& part : script.parts)
        out += part.kind == SpeechScriptPart::Kind::Text ? part.text : "";
      return out;
    };
    const std::string reading = spoken(JapaneseReadings::shared().read(parseSpeechText(sentence)));
    std::vector<std::size_t> edges;
    for (std::size_t at = 0; at <= sentence.size(); ++at) {
      if (at == sentence.size() || (sentence[at] & 0xC0) != 0x80)
        edges.push_back(at);
    }
    std::uniform_int_distribution<std::size_t> anyEdge(0, edges.size() - 1);
    for (const std::size_t edge : edges) {
      std::vector<std::size_t> places{edge};
      for (std::size_t n = std::uniform_int_distribution<std::size_t>(0, 3)(random); n > 0; --n)
        places.push_back(edges[anyEdge(random)]);
      std::sort(places.begin(), places.end());
      // The text with its marks, and where each tag stands in it.
      std::string text;
      std::vector<std::pair<std::size_t, std::size_t>> tags;
      for (std::size_t n = 0, from = 0; n <= places.size(); ++n) {
        const std::size_t to = n < places.size() ? places[n] : sentence.size();
        text += sentence.substr(from, to - from);
        from = to;
        if (n == places.size())
          break;
        const std::string tag = (n % 2 ? "\\mrkpause=" : "\\mrk=") + std::to_string(n) + "\\";
        tags.emplace_back(text.size(), tag.size());
        text += tag;
      }
      SCOPED_TRACE(text);
      const auto untagged = [&](std::size_t offset) {
        std::size_t out = offset;
        for (const auto& [at, length] : tags)
          out -= at < offset ? length : 0;
        return out;
      };
      const auto read = JapaneseReadings::shared().read(parseSpeechText(text));
      EXPECT_EQ(spoken(read), reading);
      std::vector<std::size_t> numbers;
      for (auto mark = read.parts.begin(); mark != read.parts.end(); ++mark) {
        if (mark->kind != SpeechScriptPart::Kind::Mark)
          continue;
        const auto n = static_cast<std::size_t>(read.marks[mark->mark].number);
        numbers.push_back(n);
        // The words either side of the mark, in the sentence.
        const auto word = [](auto from, auto to) {
          const auto found =
              std::find_if(from, to, [](const auto& part) { return part.sourceLength > 0; });
          return found == to ? nullptr : &*found;
        };
        const SpeechScriptPart* previous =
            word(std::make_reverse_iterator(mark), read.parts.rend());
        const SpeechScriptPart* next = word(mark + 1, read.parts.end());
        const std::size_t before =
            previous ? untagged(previous->source + previous->sourceLength) : 0;
        const std::size_t after = next ? untagged(next->source) : sentence.size();
        const std::size_t at = places[n];
        const std::string_view s = sentence;
        if (at < before) {  // moved on to the end of the word it was in
          const std::size_t begin = untagged(previous->source);
          EXPECT_GT(characters(s.substr(begin, at - begin)), characters(s.substr(at, before - at)));
        } else if (at > after) {  // moved back to the start of the word it was in
          const std::size_t end = untagged(next->source + next->sourceLength);
          EXPECT_LE(characters(s.substr(after, at - after)), characters(s.substr(at, end - at)));
        }
      }
      std::vector<std::size_t> written(places.size());
      std::iota(written.begin(), written.end(), 0);
      EXPECT_EQ(numbers, written);
    }
  }
}

// ---- spoken by espeak-ng --------------------------------------------------------------

// What the speech engine made of a Japanese text, spoken without waiting in real time.
struct Spoken {
  std::vector<SpeechMarkRecord> marks;
  std::vector<SpeechWordRecord> words;
  double durationUs = 0;
};

Spoken speak(const std::string& text,
             ZUTextToSpeechOptions::Backend backend = ZUTextToSpeechOptions::Backend::Espeak) {
  const auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  ZUTextToSpeechOptions options;
  options.backend = backend;
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

// espeak-ng reads kana only: written in kanji or in kana, a sentence lasts the same.
TEST(JapaneseSpeaking, AKanjiSentenceLastsAsLongAsInKana) {
  for (const auto& [kanji, kana] : std::vector<std::pair<std::string, std::string>>{
           {"今日はいい天気ですね。", "きょうはいいてんきですね。"},
           {"博物館に行きました。", "はくぶつかんにいきました。"},
           {"昨日友達と公園で遊びました。", "きのうともだちとこうえんであそびました。"},
           {"東京タワーは333メートルです。",
            "とうきょうタワーはさんびゃくさんじゅうさんメートルです。"}}) {
    const double a = speak(kanji).durationUs;
    const double b = speak(kana).durationUs;
    EXPECT_NEAR(a / b, 1.0, 0.15) << kanji << " " << a / 1e3 << " ms, " << kana << " " << b / 1e3
                                  << " ms";
  }
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

// The timing engine's Japanese lasts about as long as espeak-ng's, its bookmarks near
// espeak-ng's; the blanks that the service puts around bookmarks are not read.
TEST(JapaneseSpeaking, TheTimingEngineReadsJapaneseAtItsOwnRate) {
  const std::string text =
      "こんにちは。 \\mrk=1\\ 私はロボットです。 \\mrk=2\\ みなさんと一緒にお話しできて "
      "\\mrk=3\\ うれしいです。 \\mrk=4\\ 昨日は友達と公園で \\mrk=5\\ 遊びました。";
  const Spoken spoken = speak(text);
  const Spoken estimated = speak(text, ZUTextToSpeechOptions::Backend::Timing);
  EXPECT_NEAR(estimated.durationUs / spoken.durationUs, 1.0, 0.15);
  ASSERT_EQ(spoken.marks.size(), estimated.marks.size());
  for (std::size_t i = 0; i < spoken.marks.size(); ++i) {
    EXPECT_NEAR(static_cast<double>(estimated.marks[i].audioUs),
                static_cast<double>(spoken.marks[i].audioUs), 0.15 * spoken.durationUs)
        << "bookmark " << spoken.marks[i].number;
  }
}

}  // namespace
}  // namespace robotsim
