// The animation index and the loader stage on the simulated robot, with a generated library
// of 10,000 behaviours of 3 tags each under "animations/" (the three posture folders in
// turn, 500 tags in all).
//   BM_IndexBuild: one rebuild of the package "animations/" (target: at most 200 ms).
//   BM_InstalledBehaviors, BM_BehaviorTags: the behaviour manager's two answers that a
//     rebuild asks for, alone (the list; the tags of every behaviour, one call each).
//   BM_LoaderStage: one job of 100 tag actions of the standing posture through the stage
//     (each of the about 100 animations drawn is preloaded once); per_action is the
//     wall time per action.
// As in the service's host, the allocator keeps the memory it frees.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

#include "ko/os.hpp"
#include "loadertask.h"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"
#include "robotbodytalk/zurobotbodytalk.h"
#include "robotsim/robot.h"
#include "zu/zuserviceproxies.h"

namespace {

namespace fs = std::filesystem;

constexpr int kBehaviors = 10000;
constexpr int kTagsPerBehavior = 3;
constexpr int kTags = 500;
constexpr int kActions = 100;
const char* const kFolders[] = {"Stand", "Sit", "SitOnPod"};

std::string tagName(int k) {
  return "tag" + std::to_string(k % kTags);
}

// Behaviour i lies in the posture folder i % 3 and carries the tags 7i, 7i + 1, 7i + 2.
void writeLibrary(const fs::path& root) {
  for (int i = 0; i < kBehaviors; ++i) {
    const fs::path folder =
        root / "animations" / kFolders[i % 3] / "Gestures" / ("Generated_" + std::to_string(i));
    fs::create_directories(folder);
    std::ostringstream text;
    text << "{\"tags\": [";
    for (int t = 0; t < kTagsPerBehavior; ++t)
      text << (t ? ", " : "") << '"' << tagName(7 * i + t) << '"';
    text << "], \"duration\": 0.3, \"joints\": {\"HeadYaw\": {\"times\": [0.3], \"keys\": "
            "[[0.1, [3, -0.1, 0.0], [3, 0.0, 0.0]]]}}}";
    std::ofstream(folder / "behavior.json") << text.str();
  }
}

struct Setup {
  fs::path root;
  std::optional<robotsim::Robot> robot;
  std::shared_ptr<ZU::ZURobotBodyTalkInstance> bodyTalk;
  std::shared_ptr<ZU::LoaderTask> loader;
  std::vector<std::string> standingTags;
};
Setup* gSetup = nullptr;

void BM_IndexBuild(benchmark::State& state) {
  for (auto _ : state)
    gSetup->loader->updateRepresentations("animations/");
  ZU::LoaderTask::TagMap merged;
  gSetup->loader->getMergedTags(merged);
  state.counters["tags"] = static_cast<double>(merged.size());
}

void BM_InstalledBehaviors(benchmark::State& state) {
  ZU::ZUBehaviorManagerProxy manager(gSetup->robot->broker());
  for (auto _ : state)
    benchmark::DoNotOptimize(manager.getInstalledBehaviors());
}

void BM_BehaviorTags(benchmark::State& state) {
  ZU::ZUBehaviorManagerProxy manager(gSetup->robot->broker());
  const auto paths = manager.getInstalledBehaviors();
  for (auto _ : state) {
    for (const auto& path : paths)
      benchmark::DoNotOptimize(manager.getBehaviorTags(path));
  }
}

void BM_LoaderStage(benchmark::State& state) {
  std::string text;
  for (int k = 0; k < kActions; ++k) {
    const auto& tags = gSetup->standingTags;
    text += "^startTag(" + tags[static_cast<std::size_t>(k * 37) % tags.size()] + ") word ";
  }
  const ZU::ZUMokutoParser parser;
  for (auto _ : state) {
    state.PauseTiming();
    auto job = std::make_shared<ZU::MKTaskInstruction>(1, text, ZU::MokutoConfig(), ZU::Standing);
    parser.parse(job, text, false);
    state.ResumeTiming();
    gSetup->loader->process(*job);
  }
  state.counters["per_action"] =
      benchmark::Counter(static_cast<double>(state.iterations() * kActions),
                         benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

}  // namespace

int main(int argc, char** argv) {
  ko::os::keepFreedMemory();
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv))
    return 1;

  char folder[] = "/tmp/bench-loader-XXXXXX";
  if (!mkdtemp(folder)) {
    std::perror("mkdtemp");
    return 1;
  }
  Setup setup;
  setup.root = folder;
  writeLibrary(setup.root);
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  options.behaviorsRoot = setup.root.string();
  setup.robot.emplace(options);
  setup.bodyTalk = std::make_shared<ZU::ZURobotBodyTalkInstance>(setup.robot->broker());
  setup.loader = std::make_shared<ZU::LoaderTask>(setup.robot->broker(), setup.bodyTalk);
  setup.loader->updateRepresentations("animations/");
  for (const auto& [tag, paths] : setup.loader->getInstalledTags(ZU::Standing))
    setup.standingTags.push_back(tag);
  gSetup = &setup;

  benchmark::RegisterBenchmark("BM_IndexBuild", BM_IndexBuild)->Unit(benchmark::kMillisecond);
  benchmark::RegisterBenchmark("BM_InstalledBehaviors", BM_InstalledBehaviors)
      ->Unit(benchmark::kMillisecond);
  benchmark::RegisterBenchmark("BM_BehaviorTags", BM_BehaviorTags)->Unit(benchmark::kMillisecond);
  benchmark::RegisterBenchmark("BM_LoaderStage", BM_LoaderStage)
      ->Unit(benchmark::kMicrosecond)
      ->UseRealTime();
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();

  gSetup = nullptr;
  setup.loader.reset();
  setup.bodyTalk.reset();
  setup.robot.reset();
  std::error_code ignored;
  fs::remove_all(setup.root, ignored);
  return 0;
}
