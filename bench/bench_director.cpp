// The director's action latency: from a bookmark to the "^start" of its action reaching the
// behaviour manager. A probe registered as "ZUBehaviorManager" records each start on the
// shared timeline as it arrives, so the figures hold the director's path alone: the memory
// service's delivery, the callback, the director's wake-up and the call.
//
// BM_BookmarkEventToStartBehavior: from the raise of "ZUTextToSpeech/CurrentBookMark" in
//   ZUMemory (the scripted speech engine raises it; one bookmark at a time).
// BM_AudioTimeToStartBehavior: from the bookmark's audio time on espeak-ng in real time (the
//   text's start on the timeline plus the mark's position in the audio), so the speech
//   engine's own lateness and notification are included.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <future>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "director_host.h"
#include "ko/reaper.hpp"
#include "ko/session.hpp"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"
#include "robotsim/timeline.h"
#include "robotsim/zumemory.h"
#include "robotsim/zurobotstate.h"
#include "robotsim/zutexttospeech.h"
#include "scripted_speech.h"
#include "zu/zubroker.h"
#include "zu/zumodule.h"
#include "zu/zuserviceproxies.h"

namespace {

constexpr const char* kManager = "ZUBehaviorManager";

// Records each start on the timeline as it arrives; a stop is signalled at once.
class BehaviorProbe : public ZU::ZUModule {
 public:
  BehaviorProbe(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                std::shared_ptr<robotsim::Timeline> timeline)
      : ZU::ZUModule(broker, name), fTimeline(std::move(timeline)) {
    advertiseSignal<std::string>("behaviorStopped");
    fStopped = signal<std::string>("behaviorStopped");
    bindMethods("BehaviorProbe",
                {{"startBehavior", &BehaviorProbe::startBehavior, "Records the start."},
                 {"stopBehavior", &BehaviorProbe::stopBehavior, "Signals the stop."},
                 {"isBehaviorRunning", &BehaviorProbe::isBehaviorRunning, "Never."}});
  }
  void startBehavior(const std::string& behavior) {
    fTimeline->record(kManager, "startBehavior", ko::AnyValue::list({behavior}));
    std::lock_guard lock(fMutex);
    ++fStarts;
    fStarted.notify_all();
  }
  void stopBehavior(const std::string& behavior) { (*fStopped)(behavior); }
  bool isBehaviorRunning(const std::string& /*behavior*/) { return false; }

  bool waitForStarts(int count) {
    std::unique_lock lock(fMutex);
    return fStarted.wait_for(lock, std::chrono::seconds(10), [&] { return fStarts >= count; });
  }

 private:
  std::shared_ptr<robotsim::Timeline> fTimeline;
  ko::Signal<std::string>* fStopped = nullptr;
  std::mutex fMutex;
  std::condition_variable fStarted;
  int fStarts = 0;
};

// The memory service, the probe, a speech engine and the host with its director.
struct Bench {
  using MakeSpeech = std::function<std::shared_ptr<ZU::ZUModuleCore>(
      const std::shared_ptr<ZU::ZUBroker>&, const std::shared_ptr<robotsim::Timeline>&)>;

  explicit Bench(const MakeSpeech& makeSpeech) {
    robotsim::ZUMemoryOptions memoryOptions;
    memoryOptions.timeline = timeline;
    modules.push_back(
        ZU::ZUModule::createModule<robotsim::ZUMemory>(broker, "ZUMemory", memoryOptions));
    modules.push_back(ZU::ZUModule::createModule<robotsim::ZURobotModel>(broker, "ZURobotModel"));
    probe = ZU::ZUModule::createModule<BehaviorProbe>(broker, kManager, timeline);
    modules.push_back(probe);
    speech = makeSpeech(broker, timeline);
    modules.push_back(speech);
    host = ZU::ZUModule::createModule<mokutotest::DirectorHost>(broker, "ZUMokuto");
    modules.push_back(host);
  }
  ~Bench() {
    while (!modules.empty()) {
      modules.back()->exit();
      modules.pop_back();
    }
    probe.reset();
    speech.reset();
    host.reset();
    broker.reset();
    ko::waitForReaper();
  }

  // A job of `count` "^start" actions, one after each word, each of its own gesture
  // "g/<first + k>"; the bookmark of gesture first + k is k + 1.
  static std::shared_ptr<ZU::MKTaskInstruction> job(int count, int first) {
    std::string text;
    for (int n = 0; n < count; ++n)
      text += "go ^start(g/" + std::to_string(first + n) + ") ";
    auto job = std::make_shared<ZU::MKTaskInstruction>();
    ZU::ZUMokutoParser().parse(job, text, false);
    return job;
  }

  // The time of each gesture's start on the timeline.
  std::map<int, std::int64_t> startTimes() const {
    std::map<int, std::int64_t> starts;
    for (const auto& entry : timeline->entries(kManager, "startBehavior"))
      starts.emplace(std::stoi(argument(entry, 0).substr(2)), entry.us);
    return starts;
  }
  static std::string argument(const robotsim::TimelineEntry& entry, std::size_t k) {
    return entry.arguments.to<std::vector<ko::AnyValue>>().at(k).to<std::string>();
  }

  std::shared_ptr<ZU::ZUBroker> broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  std::shared_ptr<robotsim::Timeline> timeline = std::make_shared<robotsim::Timeline>();
  std::vector<std::shared_ptr<ZU::ZUModuleCore>> modules;  // in start order
  std::shared_ptr<BehaviorProbe> probe;
  std::shared_ptr<ZU::ZUModuleCore> speech;
  std::shared_ptr<mokutotest::DirectorHost> host;
};

double percentile(std::vector<double> values, double p) {
  if (values.empty())
    return 0;
  std::sort(values.begin(), values.end());
  const auto index = static_cast<std::size_t>(p * static_cast<double>(values.size() - 1) + 0.5);
  return values[std::min(index, values.size() - 1)];
}

void report(benchmark::State& state, const std::vector<double>& latenciesMs) {
  state.counters["actions"] = static_cast<double>(latenciesMs.size());
  state.counters["median_ms"] = percentile(latenciesMs, 0.5);
  state.counters["p99_ms"] = percentile(latenciesMs, 0.99);
  state.counters["max_ms"] = percentile(latenciesMs, 1.0);
}

void BM_BookmarkEventToStartBehavior(benchmark::State& state) {
  constexpr int kPerText = 100;
  const int texts = static_cast<int>(state.range(0)) / kPerText;
  Bench bench([](const auto& broker, const auto&) {
    return ZU::ZUModule::createModule<mokutotest::ScriptedSpeech>(broker, "ZUTextToSpeech");
  });
  auto& speech = static_cast<mokutotest::ScriptedSpeech&>(*bench.speech);
  std::vector<double> latenciesMs;
  std::size_t says = 0;
  for (auto _ : state) {
    bench.timeline->clear();
    int started = 0;
    for (int t = 0; t < texts; ++t) {
      auto done = std::async(std::launch::async, [&, job = Bench::job(kPerText, t * kPerText)] {
        bench.host->say(job);
      });
      const auto say = speech.waitForSay(says++);
      for (int n = 1; n <= kPerText && say; ++n) {
        speech.raiseBookmark(ZU::ZUValue(n));
        bench.probe->waitForStarts(++started);
      }
      speech.finish(say ? say->id : 0);
      done.wait();
    }
    // The k-th bookmark raised started gesture k.
    const auto starts = bench.startTimes();
    int k = 0;
    for (const auto& entry : bench.timeline->entries("ZUMemory", "raiseEvent")) {
      if (Bench::argument(entry, 0) != "ZUTextToSpeech/CurrentBookMark")
        continue;
      if (const auto it = starts.find(k++); it != starts.end())
        latenciesMs.push_back(static_cast<double>(it->second - entry.us) / 1000.0);
    }
  }
  report(state, latenciesMs);
}
BENCHMARK(BM_BookmarkEventToStartBehavior)
    ->Arg(1000)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();

void BM_AudioTimeToStartBehavior(benchmark::State& state) {
  constexpr int kPerText = 200;
  const int texts = static_cast<int>(state.range(0)) / kPerText;
  std::shared_ptr<robotsim::ZUTextToSpeech> engine;
  Bench bench([&engine](const auto& broker, const auto& timeline) {
    robotsim::ZUTextToSpeechOptions options;
    options.timeline = timeline;
    options.recordAudio = false;
    engine =
        ZU::ZUModule::createModule<robotsim::ZUTextToSpeech>(broker, "ZUTextToSpeech", options);
    return engine;
  });
  engine->setParameter("speed", 300.0F);
  std::vector<double> latenciesMs;
  for (auto _ : state) {
    for (int t = 0; t < texts; ++t) {
      bench.timeline->clear();
      bench.host->say(Bench::job(kPerText, t * kPerText));
      const auto started = bench.timeline->entries("ZUTextToSpeech", "started");
      if (started.empty())
        continue;
      const int id = started.front().arguments.to<std::vector<ko::AnyValue>>().at(0).to<int>();
      const auto starts = bench.startTimes();
      for (const auto& mark : engine->markRecords(id)) {
        const auto it = starts.find(t * kPerText + mark.number - 1);
        if (it != starts.end()) {
          latenciesMs.push_back(
              static_cast<double>(it->second - (started.front().us + mark.audioUs)) / 1000.0);
        }
      }
    }
  }
  report(state, latenciesMs);
}
BENCHMARK(BM_AudioTimeToStartBehavior)
    ->Arg(1000)
    ->Iterations(1)
    ->Unit(benchmark::kSecond)
    ->UseRealTime();

}  // namespace
