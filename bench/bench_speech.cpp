// Bookmark lateness of the speech engine on espeak-ng in real time: for each "mrk"
// bookmark, the time at which the player reached it minus the mark's audio time, both on
// the text's playback clock. A module subscribed to the bookmark event stands for the
// service, so that the memory service delivers every event as it would on the robot.
// And for Japanese, the reading of a sentence into kana (MeCab) beside espeak-ng's
// synthesis of the same sentence.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "ko/session.hpp"
#include "robotsim/speechscript.h"
#include "robotsim/zumemory.h"
#include "robotsim/zutexttospeech.h"
#include "speechjapanese.h"
#include "speechsynthesizer.h"
#include "zu/zubroker.h"
#include "zu/zumodule.h"
#include "zu/zuserviceproxies.h"

namespace {

// Counts the bookmark events it receives.
class BookmarkCounter : public ZU::ZUModule {
 public:
  BookmarkCounter(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
      : ZU::ZUModule(broker, name) {
    bindMethods("BookmarkCounter",
                {{"onBookmark", &BookmarkCounter::onBookmark, "Counts a bookmark."}});
  }
  void onBookmark(const std::string& /*key*/, const ZU::ZUValue& /*value*/,
                  const std::string& /*message*/) {
    received.fetch_add(1, std::memory_order_relaxed);
  }
  std::atomic<int> received{0};
};

// `count` bookmarks, one after each short word.
std::string bookmarkedText(int count) {
  static const std::vector<std::string> words = {"one", "two", "red", "blue", "sun",
                                                 "sea", "hi",  "go",  "yes",  "now"};
  std::string text;
  for (int n = 1; n <= count; ++n) {
    text += words[static_cast<std::size_t>(n) % words.size()];
    text += n % 10 == 0 ? ". " : " ";
    text += "\\mrk=" + std::to_string(n) + "\\ ";
  }
  return text;
}

double percentile(std::vector<double> values, double p) {
  if (values.empty())
    return 0;
  std::sort(values.begin(), values.end());
  const auto index = static_cast<std::size_t>(p * static_cast<double>(values.size() - 1) + 0.5);
  return values[std::min(index, values.size() - 1)];
}

void BM_BookmarkLateness(benchmark::State& state) {
  const int marks = static_cast<int>(state.range(0));
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  auto memory = ZU::ZUModule::createModule<robotsim::ZUMemory>(broker, "ZUMemory");
  robotsim::ZUTextToSpeechOptions options;
  options.notifications = true;
  auto tts =
      ZU::ZUModule::createModule<robotsim::ZUTextToSpeech>(broker, "ZUTextToSpeech", options);
  auto counter = ZU::ZUModule::createModule<BookmarkCounter>(broker, "ZUMokuto");
  ZU::ZUMemoryProxy(broker).subscribeToEvent("ZUTextToSpeech/CurrentBookMark", "ZUMokuto",
                                             "onBookmark");
  ZU::ZUTextToSpeechProxy speech(broker);
  speech.setParameter("speed", 200.0F);
  const std::string text = bookmarkedText(marks);

  std::vector<double> latenessMs;
  for (auto _ : state) {
    const int id = speech.post_say(text);
    speech.wait(id, 0);
    for (const auto& record : tts->markRecords(id))
      latenessMs.push_back(static_cast<double>(record.playbackUs - record.audioUs) / 1000.0);
  }
  state.counters["marks"] = static_cast<double>(latenessMs.size());
  state.counters["lateness_median_ms"] = percentile(latenessMs, 0.5);
  state.counters["lateness_p99_ms"] = percentile(latenessMs, 0.99);
  state.counters["lateness_max_ms"] = percentile(latenessMs, 1.0);
  state.counters["lateness_min_ms"] = percentile(latenessMs, 0.0);
}

BENCHMARK(BM_BookmarkLateness)->Arg(200)->Iterations(2)->Unit(benchmark::kSecond)->UseRealTime();

// Sentences of 11 to 28 characters, with a bookmark, a number and a Latin word among them.
const std::vector<robotsim::SpeechScript>& japaneseSentences() {
  static const std::vector<robotsim::SpeechScript> scripts = [] {
    std::vector<robotsim::SpeechScript> out;
    for (const char* text :
         {"今日はいい天気ですね。", "博物館に3人で\\mrk=1\\行きました。",
          "私はHelloと言いながら2024年に東京タワーを見た。", "ロボットが、ゆっくり歩いています！",
          "みなさんと一緒にお話しできてうれしいです。"})
      out.push_back(robotsim::parseSpeechText(text));
    return out;
  }();
  return scripts;
}

// What the engine does to a Japanese sentence before espeak-ng: the reading and its SSML.
void BM_JapaneseReading(benchmark::State& state) {
  const auto& reader = robotsim::JapaneseReadings::shared();
  const auto& sentences = japaneseSentences();
  std::size_t i = 0;
  for (auto _ : state) {
    std::vector<robotsim::SpeechSourceSpan> sources;
    benchmark::DoNotOptimize(
        robotsim::toEspeakSsml(reader.read(sentences[i++ % sentences.size()]), &sources));
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_JapaneseReading)->Unit(benchmark::kMicrosecond);

// espeak-ng's synthesis of the same sentences, reading included, to the last sample.
void BM_JapaneseSynthesis(benchmark::State& state) {
  const auto synthesizer = robotsim::makeEspeakSynthesizer();
  robotsim::SpeechVoiceSettings voice;
  voice.language = "Japanese";
  const auto& sentences = japaneseSentences();
  std::size_t i = 0;
  double audioSeconds = 0;
  for (auto _ : state) {
    const auto& script = sentences[i++ % sentences.size()];
    auto performance = std::make_shared<robotsim::SpeechPerformance>(
        script.marks.size(), synthesizer->sampleRate(), false);
    synthesizer->synthesize(script, voice, performance);
    const auto samples = performance->waitForEnd();
    audioSeconds += static_cast<double>(samples.value_or(0)) / synthesizer->sampleRate();
  }
  state.SetItemsProcessed(state.iterations());
  state.counters["audio_ms"] = audioSeconds * 1000.0 / static_cast<double>(state.iterations());
}
BENCHMARK(BM_JapaneseSynthesis)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace
