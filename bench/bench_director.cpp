// The director's action latency: from a bookmark to the "^start" of its action reaching the
// behaviour manager. A probe registered as "ZUBehaviorManager" records each start on the
// shared timeline as it arrives, so the figures hold the director's path alone: the memory
// service's delivery, the callback, the director's wake-up and the call.
//
// BM_BookmarkEventToStartBehavior: from the raise of "ZUTextToSpeech/CurrentBookMark" in
//   ZUMemory (the scripted speech engine raises it; one bookmark at a time).
// BM_AudioTimeToStartBehavior/<actions>/<load>: from the bookmark's audio time on espeak-ng
//   in real time (when the player's clock reached it), so the speech engine's own lateness
//   and notification are included; load 0 on the
//   machine as it is, load 1 with a busy thread per core beside it, at the bench's own nice
//   level, started by the bench. Counters: median, p99 and max of the whole path, and the
//   1-minute load average at the end of the run. After the runs, the same per hop:
//     engine   audio time -> the speech engine's player reaches the mark
//     notify   -> the engine raises "ZUTextToSpeech/CurrentBookMark" in ZUMemory
//     deliver  -> the director has the bookmark (the memory service's delivery, the callback)
//     takeUp   -> the director takes the action up
//     call     -> the behaviour manager's startBehavior
#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <fstream>
#include <functional>
#include <future>
#include <iomanip>
#include <iostream>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
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

// A busy thread per core, at the caller's nice level, while it lives.
class BusyLoad {
 public:
  explicit BusyLoad(unsigned threads) {
    for (unsigned n = 0; n < threads; ++n) {
      fThreads.emplace_back([this] {
        std::uint64_t x = 1;
        while (!fStop.load(std::memory_order_relaxed)) {
          x = x * 6364136223846793005ULL + 1442695040888963407ULL;
          benchmark::DoNotOptimize(x);
        }
      });
    }
  }
  ~BusyLoad() {
    fStop = true;
    for (auto& t : fThreads)
      t.join();
  }
  BusyLoad(const BusyLoad&) = delete;
  BusyLoad& operator=(const BusyLoad&) = delete;

 private:
  std::atomic<bool> fStop{false};
  std::vector<std::thread> fThreads;
};

double loadAverage() {
  std::ifstream in("/proc/loadavg");
  double oneMinute = 0;
  in >> oneMinute;
  return oneMinute;
}

// The director's report of each action, by bookmark, for the text being spoken.
class Reports : public ZU::DirectorObserver {
 public:
  void onAction(const ZU::DirectorActionReport& report) override {
    std::lock_guard lock(fMutex);
    fByBookmark[report.bookmark] = report;
  }
  std::map<std::uint32_t, ZU::DirectorActionReport> take() {
    std::lock_guard lock(fMutex);
    return std::exchange(fByBookmark, {});
  }

 private:
  std::mutex fMutex;
  std::map<std::uint32_t, ZU::DirectorActionReport> fByBookmark;
};

const char* const kHops[] = {"engine", "notify", "deliver", "takeUp", "call"};
constexpr std::size_t kHopCount = std::size(kHops);
// Per run (the benchmark's name): the latencies of each hop, in ms.
std::vector<std::pair<std::string, std::vector<std::vector<double>>>> gHopRuns;

void BM_AudioTimeToStartBehavior(benchmark::State& state) {
  constexpr int kPerText = 100;
  const int texts = static_cast<int>(state.range(0)) / kPerText;
  const bool loaded = state.range(1) != 0;
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
  const auto reports = std::make_shared<Reports>();
  bench.host->director().setObserver(reports);
  std::vector<double> latenciesMs;
  std::vector<std::vector<double>> hopsMs(kHopCount);
  std::unique_ptr<BusyLoad> load;
  if (loaded)
    load = std::make_unique<BusyLoad>(std::max(1u, std::thread::hardware_concurrency()));
  for (auto _ : state) {
    for (int t = 0; t < texts; ++t) {
      bench.timeline->clear();
      bench.host->say(Bench::job(kPerText, t * kPerText));
      const auto started = bench.timeline->entries("ZUTextToSpeech", "started");
      const auto byBookmark = reports->take();
      if (started.empty())
        continue;
      const std::int64_t origin = bench.timeline->originUs();
      const int id = started.front().arguments.to<std::vector<ko::AnyValue>>().at(0).to<int>();
      const auto starts = bench.startTimes();
      std::map<int, std::int64_t> raised;
      for (const auto& entry : bench.timeline->entries("ZUMemory", "raiseEvent")) {
        const auto arguments = entry.arguments.to<std::vector<ko::AnyValue>>();
        if (arguments.at(0).to<std::string>() == "ZUTextToSpeech/CurrentBookMark")
          raised.emplace(arguments.at(1).to<int>(), entry.us);
      }
      for (const auto& mark : engine->markRecords(id)) {
        const auto start = starts.find(t * kPerText + mark.number - 1);
        if (start == starts.end())
          continue;
        const std::int64_t audioUs = mark.dueUs - origin;
        latenciesMs.push_back(static_cast<double>(start->second - audioUs) / 1000.0);
        const auto raise = raised.find(mark.number);
        const auto report = byBookmark.find(static_cast<std::uint32_t>(mark.number));
        if (raise == raised.end() || report == byBookmark.end() || report->second.beginUs < 0)
          continue;
        const std::int64_t stamps[] = {audioUs,
                                       audioUs + mark.playbackUs - mark.audioUs,
                                       raise->second,
                                       report->second.bookmarkUs - origin,
                                       report->second.beginUs - origin,
                                       start->second};
        for (std::size_t h = 0; h < kHopCount; ++h)
          hopsMs[h].push_back(static_cast<double>(stamps[h + 1] - stamps[h]) / 1000.0);
      }
    }
  }
  state.counters["load1"] = loadAverage();
  load.reset();
  report(state, latenciesMs);
  gHopRuns.emplace_back(loaded ? "loaded" : "quiet", std::move(hopsMs));
}
BENCHMARK(BM_AudioTimeToStartBehavior)
    ->ArgNames({"actions", "load"})
    ->Args({400, 0})
    ->Args({400, 1})
    ->Iterations(1)
    ->Unit(benchmark::kSecond)
    ->UseRealTime();

void printHops(std::ostream& os) {
  for (const auto& [name, hops] : gHopRuns) {
    os << "\n" << name << " per hop, ms (median / p99 / max):\n";
    for (std::size_t h = 0; h < kHopCount; ++h) {
      os << "  " << std::left << std::setw(8) << kHops[h] << std::right << std::fixed
         << std::setprecision(3) << std::setw(8) << percentile(hops[h], 0.5) << " /" << std::setw(8)
         << percentile(hops[h], 0.99) << " /" << std::setw(8) << percentile(hops[h], 1.0) << "\n";
    }
  }
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv))
    return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  printHops(std::cout);
  return 0;
}
