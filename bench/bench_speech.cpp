// Bookmark lateness of the speech engine on espeak-ng in real time: for each "mrk"
// bookmark, the time at which the player reached it minus the mark's audio time, both on
// the text's playback clock. A module subscribed to the bookmark event stands for the
// service, so that the memory service delivers every event as it would on the robot.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "ko/session.hpp"
#include "robotsim/zumemory.h"
#include "robotsim/zutexttospeech.h"
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

}  // namespace
