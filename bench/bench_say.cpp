// The service end to end on the simulated robot, hosted as `mokuto say` hosts it (the
// module made in the process once the animation index is built), warm: a few texts are
// spoken before the measured ones.
//   BM_SayToSpeechPosted: a 200-word annotated text in random mode on the timing engine
//     (no waiting), timing checker on; the time from the checker's start of the text
//     ("ZUMokuto/StartOfMK" raised) to the speech engine taking the text (its "say"), the
//     hop to the engine's thread included (target: at most 1 ms).
//   BM_SayToFirstAudio/<pause>: the same text on espeak-ng; the time from the say call to
//     the first audio sample played (the engine's "started"), with the pause before
//     speech of the configuration (500 ms, the default: its silence is the first audio)
//     and without one (0: the first audio is the first word). The rest of the text plays
//     without waiting in real time.
// As in the service's host, the allocator keeps the memory it frees.
#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "ko/os.hpp"
#include "mokuto/zumokuto.h"
#include "robotsim/robot.h"
#include "zefoko/host.h"
#include "zu/zumoduleentry.h"
#include "zu/zuvalue.h"

namespace {

constexpr int kWarmTexts = 3;

// 20 sentences of 10 words, every other one with a gesture, and a memory key at the end.
std::string annotatedText() {
  const char* const gestures[] = {"Hey_1", "Explain_1", "Great_1", "Happy_1", "Big_1"};
  std::string text;
  for (int s = 0; s < 20; ++s) {
    text += "This is sentence number " + std::to_string(s + 1) + " of our long little story";
    if (s % 2 == 0)
      text += std::string(" ^start(animations/Stand/Gestures/") + gestures[(s / 2) % 5] + ")";
    text += ". ";
  }
  return text + "$storyDone=1";
}

struct Rig {
  explicit Rig(bool espeak) {
    zefoko::HostOptions options;
    options.robot.speech.recordAudio = false;
    options.robot.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
    if (!espeak)
      options.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
    host = std::make_unique<zefoko::Host>(std::move(options));
    ZU::createLibraryModule<ZU::ZUMokuto>(host->broker(), ZU::ZUMokuto::kModuleName);
    service = std::dynamic_pointer_cast<ZU::ZUMokuto>(
        host->broker()->getModuleByName(ZU::ZUMokuto::kModuleName));
    service->waitForIndex(std::chrono::milliseconds(60'000));
    service->setBodyLanguageModeFromStr("random");
    service->_setCheckExecutionTimes(true);
  }
  ~Rig() {
    service->exit();
    service.reset();
    host->shutdown();
  }

  // The time of the first entry of that service and operation whose first argument is
  // `first` (any when empty), or -1.
  std::int64_t timeOf(const std::string& serviceName, const std::string& operation,
                      const std::string& first = {}) const {
    for (const auto& entry : host->robot().timeline()->entries(serviceName, operation)) {
      if (first.empty() ||
          entry.arguments.asList().at(0).toString().find(first) != std::string::npos)
        return entry.us;
    }
    return -1;
  }

  std::unique_ptr<zefoko::Host> host;
  std::shared_ptr<ZU::ZUMokuto> service;
};

void BM_SayToSpeechPosted(benchmark::State& state) {
  Rig rig(false);
  const std::string text = annotatedText();
  for (int k = 0; k < kWarmTexts; ++k)
    rig.service->say(text);
  for (auto _ : state) {
    rig.host->robot().timeline()->clear();
    rig.service->say(text);
    const std::int64_t start = rig.timeOf("ZUMemory", "raiseEvent", "ZUMokuto/StartOfMK");
    const std::int64_t posted = rig.timeOf("ZUTextToSpeech", "say");
    if (start < 0 || posted < start) {
      state.SkipWithError("no start of the text or no speech on the timeline");
      break;
    }
    state.SetIterationTime(static_cast<double>(posted - start) / 1e6);
  }
}
BENCHMARK(BM_SayToSpeechPosted)->UseManualTime()->Unit(benchmark::kMicrosecond)->Iterations(200);

void BM_SayToFirstAudio(benchmark::State& state) {
  Rig rig(true);
  const std::string text = annotatedText();
  const ZU::ZUValue configuration = ZU::ZUValue::makeArray(
      {ZU::ZUValue::makeArray({"msPauseBeforeSpeech", static_cast<int>(state.range(0))})});
  for (int k = 0; k < kWarmTexts; ++k)
    rig.service->say(text, configuration);
  for (auto _ : state) {
    const auto& timeline = rig.host->robot().timeline();
    timeline->clear();
    const std::int64_t called = timeline->now();
    rig.service->say(text, configuration);
    const std::int64_t started = rig.timeOf("ZUTextToSpeech", "started");
    if (started < called) {
      state.SkipWithError("the speech did not start");
      break;
    }
    state.SetIterationTime(static_cast<double>(started - called) / 1e6);
  }
}
BENCHMARK(BM_SayToFirstAudio)
    ->ArgName("pause")
    ->Arg(500)
    ->Arg(0)
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond)
    ->Iterations(10);

}  // namespace

int main(int argc, char** argv) {
  ko::os::keepFreedMemory();
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv))
    return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
