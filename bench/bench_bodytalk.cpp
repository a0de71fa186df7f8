// The CPU cost of the speaking body talk on the simulated robot, in real time, measured
// with getrusage. The body talk's own cost is the CPU time of the threads that run it: the
// two threads of the workers' event loop (each head move and arm animation, with the calls
// into the robot's services made from them) and the process-wide event loop (the arms'
// preloads). The rest of the process is the simulated robot: the motion thread ticking the
// joints every 10 ms while they move, the behaviour manager's threads. A thread's CPU time
// is read by that thread itself (RUSAGE_THREAD), from a job that each idle loop thread runs
// before the start and after the stop.
#include <benchmark/benchmark.h>
#include <sys/resource.h>

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "ko/eventloop.hpp"
#include "robotbodytalk/zurobotbodytalk.h"
#include "robotsim/robot.h"
#include "zu/zuserviceproxies.h"

namespace {

double cpuSeconds(const rusage& usage) {
  const auto seconds = [](const timeval& t) {
    return static_cast<double>(t.tv_sec) + static_cast<double>(t.tv_usec) / 1e6;
  };
  return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

double processCpu() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return cpuSeconds(usage);
}

// The CPU time used so far by the threads of an idle loop: one job per thread, the jobs
// waiting for one another so that each thread runs one. -1 when they did not all run.
double loopCpu(ko::EventLoop& loop) {
  struct Shared {
    std::mutex mutex;
    std::condition_variable changed;
    std::size_t arrived = 0;
    std::size_t done = 0;
    double total = 0;
  };
  const auto shared = std::make_shared<Shared>();
  const std::size_t threads = loop.threadCount();
  for (std::size_t i = 0; i < threads; ++i) {
    loop.post([shared, threads] {
      std::unique_lock lock(shared->mutex);
      ++shared->arrived;
      shared->changed.notify_all();
      shared->changed.wait_for(lock, std::chrono::seconds(10),
                               [&] { return shared->arrived >= threads; });
      rusage usage{};
      getrusage(RUSAGE_THREAD, &usage);
      shared->total += cpuSeconds(usage);
      ++shared->done;
      shared->changed.notify_all();
    });
  }
  std::unique_lock lock(shared->mutex);
  if (!shared->changed.wait_for(lock, std::chrono::seconds(30),
                                [&] { return shared->done == threads; }))
    return -1;
  return shared->total;
}

void BM_SpeakingBodyTalkCpu(benchmark::State& state) {
  const auto runFor = std::chrono::seconds(state.range(0));
  const double seconds = static_cast<double>(state.range(0));
  for (auto _ : state) {
    robotsim::RobotOptions options;
    options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
    robotsim::Robot robot(options);
    const auto& broker = robot.broker();
    std::vector<std::string> speaking;
    for (const auto& path : ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors()) {
      if (path.rfind("animations/Stand/BodyTalk/Speaking_", 0) == 0)
        speaking.push_back(path);
    }
    auto workers = std::make_shared<ko::EventLoop>("BodyTalk", 2);
    ZU::ZURobotBodyTalkInstance handle(broker, {1.0, workers});
    ZU::ZURobotBodyTalk& bodyTalk = *handle.bodyTalk;
    const ko::AnyObject manager = broker->service("ZUBehaviorManager");
    const auto link = manager->connect(
        "behaviorStopped", [&bodyTalk](std::string path) { bodyTalk.onBehaviorStopped(path); });
    bodyTalk.getPosture()->init();
    bodyTalk.setSpeakingAnimations(ZU::Standing, speaking);
    robot.timeline()->clear();

    const double workers0 = loopCpu(*workers);
    const double preloads0 = loopCpu(*ko::getEventLoop());
    const double process0 = processCpu();
    bodyTalk.start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);
    std::this_thread::sleep_for(runFor);
    bodyTalk.stop();
    const double process1 = processCpu();
    const double workers1 = loopCpu(*workers);
    const double preloads1 = loopCpu(*ko::getEventLoop());
    manager->disconnect(link);

    const double bodyTalkCpu = (workers1 - workers0) + (preloads1 - preloads0);
    state.counters["bodytalk_cpu_pct"] = 100 * bodyTalkCpu / seconds;
    state.counters["workers_cpu_pct"] = 100 * (workers1 - workers0) / seconds;
    state.counters["preloads_cpu_pct"] = 100 * (preloads1 - preloads0) / seconds;
    state.counters["process_cpu_pct"] = 100 * (process1 - process0) / seconds;
    state.counters["robot_cpu_pct"] = 100 * (process1 - process0 - bodyTalkCpu) / seconds;
    state.counters["head_moves"] = static_cast<double>(
        robot.timeline()->entries("ZUMotion", "angleInterpolationBezier").size());
    state.counters["arm_animations"] =
        static_cast<double>(robot.timeline()->entries("ZUBehaviorManager", "startBehavior").size());
    if (workers0 < 0 || workers1 < 0 || preloads0 < 0 || preloads1 < 0)
      state.SkipWithError("a loop thread did not answer");
  }
}
// Seconds of body talk.
BENCHMARK(BM_SpeakingBodyTalkCpu)->Arg(30)->Iterations(1)->Unit(benchmark::kSecond)->UseRealTime();

}  // namespace
