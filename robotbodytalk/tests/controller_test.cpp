// The body talk controller and its workers: the process's instance, the modes, pause and
// resume, the start delays, and the loop of a worker.
#include <gtest/gtest.h>

#include <algorithm>
#include <condition_variable>
#include <cstdlib>
#include <functional>
#include <future>
#include <mutex>
#include <thread>
#include <vector>

#include "robotbodytalk/zurobotbodytalk.h"
#include "support/fake_robot.h"
#include "support/log_waiter.h"
#include "zu/zubroker.h"
#include "zurobotbodytalkbodypart.h"
#include "zurobotbodytalkhead.h"
#include "zurobotbodytalkthread.h"

namespace {

using bodytalktest::BodyTalkHandle;
using bodytalktest::FakeRobot;
using bodytalktest::kBound;
using bodytalktest::LogCapture;
using ZU::ZURobotBodyTalk;

// Rests of 1 to 5 ms, limits of 10 ms.
constexpr double kFast = 0.001;
// Rests of 1000 s and more: whatever comes, comes without a rest.
constexpr double kFrozen = 1000.0;

// The key times of the n-th move posted to the fake motion service.
std::vector<double> timesOfMove(const FakeRobot& robot, std::size_t n) {
  const auto moves = robot.motion->log.calls("angleInterpolationBezier");
  std::vector<double> times;
  const ZU::ZUValue& joint = moves.at(n).args.at(1)[0];
  for (int i = 0; i < joint.arraySize(); ++i)
    times.push_back(joint[i].asFloat());
  return times;
}

// Whether these are the key times of one of the listening moves (robot type 1).
bool isListeningMove(const std::vector<double>& times) {
  for (const auto& move : ZU::ZURobotBodyTalkHeadListening::makeMoves(1)) {
    std::vector<double> listening;
    for (int i = 0; i < move.times[0].arraySize(); ++i)
      listening.push_back(move.times[0][i].asFloat());
    if (listening == times)
      return true;
  }
  return false;
}

// ---- the process's instance ---------------------------------------------------------------

TEST(BodyTalkInstance, TheLastReleaseDestroysTheController) {
  FakeRobot robot;
  LogCapture log;
  ZURobotBodyTalk* first = ZURobotBodyTalk::getInstance(robot.broker, {kFast, nullptr});
  first->getPosture()->init();
  {
    ZU::ZURobotBodyTalkInstance handle(robot.broker, {0.5, nullptr});
    EXPECT_EQ(handle.bodyTalk, first);
    EXPECT_EQ(ZURobotBodyTalk::getInstanceCount(), 2);
    EXPECT_EQ(handle.bodyTalk->getTimeScale(), kFast);
  }
  EXPECT_EQ(ZURobotBodyTalk::getInstanceCount(), 1);
  first->start(ZURobotBodyTalk::kSpeaking, {}, true);
  EXPECT_TRUE(robot.motion->log.waitFor("setAngles", 1));

  ZURobotBodyTalk::releaseInstance();
  EXPECT_EQ(ZURobotBodyTalk::getInstanceCount(), 0);
  ZURobotBodyTalk::releaseInstance();
  EXPECT_EQ(ZURobotBodyTalk::getInstanceCount(), 0);
  EXPECT_TRUE(log->has("robotbodytalk", ko::log::Warning,
                       "The body talk was released more often than it was taken"));
  // A new controller, with the options of its own first user.
  BodyTalkHandle again(robot.broker, 0.25);
  EXPECT_EQ(again->getTimeScale(), 0.25);
  EXPECT_FALSE(again->isRunning());
}

TEST(BodyTalkInstance, WithoutTheRobotServicesTheControllerIsStillMadeAndHarmless) {
  ::setenv("KO_DEADLOCK_TIMEOUT", "20", 1);
  ZU::ZUBroker::resetDeadlockTimeoutForTesting();
  LogCapture log;
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  {
    BodyTalkHandle bodyTalk(broker, kFast);
    const auto errors = log->lines("robotbodytalk", ko::log::Error, "Can't find service");
    ASSERT_EQ(errors.size(), 1u);
    EXPECT_EQ(errors[0].record.function, "ZU::ZURobotBodyTalk::ZURobotBodyTalk");
    bodyTalk->start(ZURobotBodyTalk::kSpeaking, {}, true);
    bodyTalk->onBehaviorStopped("animations/Stand/BodyTalk/Speaking_1");
    bodyTalk->setSpeakingAnimations(ZU::Standing, {"animations/Stand/BodyTalk/Speaking_1"});
    bodyTalk->pause();
    bodyTalk->resume();
    bodyTalk->stop();
    bodyTalk->getPosture()->init();
    EXPECT_TRUE(bodyTalk->areWorkersStopped());
    EXPECT_EQ(bodyTalk->getPostureFamily(), ZU::Unknown);
  }
  ::unsetenv("KO_DEADLOCK_TIMEOUT");
  ZU::ZUBroker::resetDeadlockTimeoutForTesting();
}

// ---- modes and states -------------------------------------------------------------------

TEST(BodyTalkModes, AStartWithoutRestartChangesNothingARestartSwitchesToListening) {
  FakeRobot robot;
  LogCapture log;
  BodyTalkHandle bodyTalk(robot.broker, kFast);
  bodyTalk->getPosture()->init();
  bodyTalk->start(ZURobotBodyTalk::kSpeaking, {}, true);
  ASSERT_TRUE(robot.motion->log.waitFor("angleInterpolationBezier", 1));
  EXPECT_FALSE(isListeningMove(timesOfMove(robot, 0)));

  bodyTalk->start(ZURobotBodyTalk::kListening, {}, false);
  EXPECT_EQ(bodyTalk->getMode(), ZURobotBodyTalk::kSpeaking);
  EXPECT_TRUE(bodyTalk->isRunning());
  EXPECT_EQ(log->count("robotbodytalk", ko::log::Warning, "during the listening part"), 0u);

  bodyTalk->start(ZURobotBodyTalk::kListening, {}, true);
  EXPECT_EQ(bodyTalk->getMode(), ZURobotBodyTalk::kListening);
  const std::size_t before = robot.motion->log.count("angleInterpolationBezier");
  ASSERT_TRUE(robot.motion->log.waitFor("angleInterpolationBezier", before + 1));
  EXPECT_TRUE(isListeningMove(timesOfMove(robot, before)));
  EXPECT_TRUE(log->waitFor("robotbodytalk", ko::log::Warning,
                           "Standing posture and during the listening part."));
}

TEST(BodyTalkModes, PauseThenResumeRestartsTheSamePartsWithTheSameFlags) {
  FakeRobot robot;
  LogCapture log;
  BodyTalkHandle bodyTalk(robot.broker, kFast);
  bodyTalk->getPosture()->init();
  bodyTalk->start(ZURobotBodyTalk::kListening, {false, true}, true);
  ASSERT_TRUE(robot.motion->log.waitFor("setAngles", 1));

  bodyTalk->pause();
  EXPECT_FALSE(bodyTalk->isRunning());
  EXPECT_TRUE(bodyTalk->isPaused());
  EXPECT_TRUE(bodyTalk->areWorkersStopped());
  const std::size_t before = robot.motion->log.count("angleInterpolationBezier");

  bodyTalk->resume();
  EXPECT_TRUE(bodyTalk->isRunning());
  EXPECT_FALSE(bodyTalk->isPaused());
  EXPECT_EQ(bodyTalk->getMode(), ZURobotBodyTalk::kListening);
  ASSERT_TRUE(robot.motion->log.waitFor("angleInterpolationBezier", before + 1));
  EXPECT_TRUE(isListeningMove(timesOfMove(robot, before)));
  bodyTalk->stop();
  // The arms were never enabled.
  EXPECT_EQ(log->count("robotbodytalk", ko::log::Warning, "No bodytalk animations"), 0u);
  EXPECT_EQ(robot.behaviors->log.calls().size(), 0u);
}

struct StateCase {
  const char* name;
  std::function<void(ZURobotBodyTalk&)> before;
  std::function<void(ZURobotBodyTalk&)> operation;
  bool running;
  bool paused;
};

void startSpeaking(ZURobotBodyTalk& b) {
  b.start(ZURobotBodyTalk::kSpeaking, {}, true);
}
void prepareSpeaking(ZURobotBodyTalk& b) {
  b.prepare(ZURobotBodyTalk::kSpeaking, {}, true);
}
void nothing(ZURobotBodyTalk&) {}

class BodyTalkStates : public ::testing::TestWithParam<StateCase> {};

TEST_P(BodyTalkStates, EachOperationLeadsToItsState) {
  const StateCase& c = GetParam();
  FakeRobot robot;
  LogCapture log;
  BodyTalkHandle bodyTalk(robot.broker, kFast);
  bodyTalk->getPosture()->init();
  c.before(*bodyTalk);
  c.operation(*bodyTalk);
  EXPECT_EQ(bodyTalk->isRunning(), c.running);
  EXPECT_EQ(bodyTalk->isPaused(), c.paused);
  EXPECT_EQ(bodyTalk->areWorkersStopped(), !c.running);
  if (c.running) {
    EXPECT_TRUE(robot.motion->log.waitFor("angleInterpolationBezier", 1));
  }
}

INSTANTIATE_TEST_SUITE_P(
    Cases, BodyTalkStates,
    ::testing::Values(
        StateCase{"PauseWhenStopped", nothing, [](auto& b) { b.pause(); }, false, false},
        StateCase{"ResumeWhenStopped", nothing, [](auto& b) { b.resume(); }, false, false},
        StateCase{"ResumeWhenRunning", startSpeaking, [](auto& b) { b.resume(); }, true, false},
        StateCase{"PauseWhenRunning", startSpeaking, [](auto& b) { b.pause(); }, false, true},
        StateCase{"PauseWhenPaused", prepareSpeaking, [](auto& b) { b.pause(); }, false, true},
        StateCase{"ResumeWhenPrepared", prepareSpeaking, [](auto& b) { b.resume(); }, true, false},
        StateCase{"StopWhenPaused", prepareSpeaking, [](auto& b) { b.stop(); }, false, false},
        StateCase{"StopWhenRunning", startSpeaking, [](auto& b) { b.stop(); }, false, false},
        StateCase{"PrepareWithoutRestartWhenRunning", startSpeaking,
                  [](auto& b) { b.prepare(ZURobotBodyTalk::kListening, {}, false); }, true, false},
        StateCase{"PrepareWithRestartWhenRunning", startSpeaking, prepareSpeaking, false, true},
        StateCase{"StartWithoutRestartWhenPaused", prepareSpeaking,
                  [](auto& b) { b.start(ZURobotBodyTalk::kSpeaking, {}, false); }, true, false}),
    [](const auto& p) { return std::string(p.param.name); });

// ---- start delays -------------------------------------------------------------------------

TEST(BodyTalkStartDelay, TheSpeakingHeadMovesAtOnce) {
  FakeRobot robot;
  LogCapture log;
  BodyTalkHandle bodyTalk(robot.broker, kFrozen);
  bodyTalk->getPosture()->init();
  bodyTalk->start(ZURobotBodyTalk::kSpeaking, {false, true}, true);
  // Any rest would last 1000 s or more.
  EXPECT_TRUE(robot.motion->log.waitFor("setAngles", 1));
}

TEST(BodyTalkStartDelay, TheListeningHeadRestsOneToFiveSecondsFirst) {
  FakeRobot robot;
  LogCapture log;
  constexpr double kScale = 0.05;
  BodyTalkHandle bodyTalk(robot.broker, kScale);
  bodyTalk->getPosture()->init();
  const auto start = std::chrono::steady_clock::now();
  bodyTalk->start(ZURobotBodyTalk::kListening, {false, true}, true);
  ASSERT_TRUE(robot.motion->log.waitFor("areResourcesAvailable", 1));
  const auto first = robot.motion->log.calls("areResourcesAvailable").front().time;
  EXPECT_GE(first - start, std::chrono::milliseconds(static_cast<int>(1000 * kScale)));
}

// ---- the worker's loop ----------------------------------------------------------------------

// A part that follows a script of pauses and records what the worker does with it.
class ScriptedPart : public ZU::ZURobotBodyTalkBodyPart {
 public:
  ScriptedPart(std::vector<int> pauses, int startDelay)
      : ZU::ZURobotBodyTalkBodyPart(nullptr), fPauses(std::move(pauses)), fDelay(startDelay) {}

  void onBehaviorStopped(const std::string&) override {}
  std::string getName() const override { return "Scripted"; }
  void doOneIteration() override {
    std::unique_lock lock(fMutex);
    fEvents.push_back("iteration");
    fThreads.push_back(std::this_thread::get_id());
    fTimes.push_back(std::chrono::steady_clock::now());
    fChanged.notify_all();
    if (blockUntilStopped)
      fChanged.wait_for(lock, kBound, [this] { return fStopped; });
  }
  void afterIteration() override { record("after"); }
  int getStartDelay() override { return fDelay; }
  int getPause() override {
    std::lock_guard lock(fMutex);
    const int pause = fNext < fPauses.size() ? fPauses[fNext] : fPauses.back();
    ++fNext;
    return pause;
  }
  void stop() override {
    record("stop");
    std::lock_guard lock(fMutex);
    fStopped = true;
    fChanged.notify_all();
  }

  bool waitForIterations(std::size_t n) {
    std::unique_lock lock(fMutex);
    return fChanged.wait_for(lock, kBound, [&] { return fThreads.size() >= n; });
  }
  // Waits until `n` iterations have ended (their afterIteration done).
  bool waitForEndedIterations(std::size_t n) {
    std::unique_lock lock(fMutex);
    return fChanged.wait_for(lock, kBound, [&] {
      return static_cast<std::size_t>(std::count(fEvents.begin(), fEvents.end(), "after")) >= n;
    });
  }
  std::vector<std::string> events() const {
    std::lock_guard lock(fMutex);
    return fEvents;
  }
  std::vector<std::thread::id> threads() const {
    std::lock_guard lock(fMutex);
    return fThreads;
  }
  std::vector<std::chrono::steady_clock::time_point> times() const {
    std::lock_guard lock(fMutex);
    return fTimes;
  }

  bool blockUntilStopped = false;

 private:
  void record(const char* event) {
    std::lock_guard lock(fMutex);
    fEvents.push_back(event);
    fChanged.notify_all();
  }

  const std::vector<int> fPauses;
  const int fDelay;
  mutable std::mutex fMutex;
  std::condition_variable fChanged;
  std::vector<std::string> fEvents;
  std::vector<std::thread::id> fThreads;
  std::vector<std::chrono::steady_clock::time_point> fTimes;
  std::size_t fNext = 0;
  bool fStopped = false;
};

std::shared_ptr<ko::EventLoop> workerLoop() {
  return std::make_shared<ko::EventLoop>("BodyTalkTest", 2);
}

TEST(BodyTalkThread, APartWithoutPauseIteratesBackToBackInOneRun) {
  auto loop = workerLoop();
  ScriptedPart part({1, 0, 0, 0, 1}, 0);
  ZU::ZURobotBodyTalkThread worker(loop, ZU::ZURobotBodyTalkTime(kFrozen));
  EXPECT_EQ(worker.name(), "BodyTalk loop without body part set");
  worker.setBodyPart(&part);
  EXPECT_EQ(worker.name(), "BodyTalk loop of the Scripted");
  worker.start();
  ASSERT_TRUE(part.waitForEndedIterations(4));
  worker.requestStop();
  worker.stop();
  EXPECT_FALSE(worker.isRunning());
  EXPECT_FALSE(part.isRunning());

  const auto threads = part.threads();
  ASSERT_EQ(threads.size(), 4u);  // the fifth would come 1000 s later
  for (const auto& id : threads)
    EXPECT_EQ(id, threads.front());
  EXPECT_EQ(part.events(),
            (std::vector<std::string>{"iteration", "after", "iteration", "after", "iteration",
                                      "after", "iteration", "after", "stop"}));
}

TEST(BodyTalkThread, AStartDelayPutsTheFirstIterationThatLate) {
  constexpr double kScale = 0.05;
  auto loop = workerLoop();
  ScriptedPart part({1}, 2);
  ZU::ZURobotBodyTalkThread worker(loop, ZU::ZURobotBodyTalkTime(kScale));
  worker.setBodyPart(&part);
  const auto start = std::chrono::steady_clock::now();
  worker.start();
  ASSERT_TRUE(part.waitForIterations(2));
  const auto times = part.times();
  EXPECT_GE(times[0] - start, std::chrono::milliseconds(static_cast<int>(2000 * kScale)));
  EXPECT_GE(times[1] - times[0], std::chrono::milliseconds(static_cast<int>(1000 * kScale)));
}

TEST(BodyTalkThread, AStopRequestEndsTheIterationInProgressAndTheLoop) {
  auto loop = workerLoop();
  ScriptedPart part({0}, 0);
  part.blockUntilStopped = true;
  ZU::ZURobotBodyTalkThread worker(loop, ZU::ZURobotBodyTalkTime(1.0));
  worker.setBodyPart(&part);
  worker.start();
  ASSERT_TRUE(part.waitForIterations(1));
  auto stopped = std::async(std::launch::async, [&] {
    worker.requestStop();
    worker.stop();
  });
  ASSERT_EQ(stopped.wait_for(kBound), std::future_status::ready);
  EXPECT_FALSE(worker.isRunning());
  EXPECT_EQ(part.threads().size(), 1u);
}

TEST(BodyTalkThread, DestroyingAWorkerClearsItsPartWithoutStoppingIt) {
  auto loop = workerLoop();
  ScriptedPart part({1}, 0);
  {
    ZU::ZURobotBodyTalkThread worker(loop, ZU::ZURobotBodyTalkTime(kFrozen));
    worker.setBodyPart(&part);
    worker.start();
    ASSERT_TRUE(part.waitForIterations(1));
    EXPECT_TRUE(part.isRunning());
  }
  EXPECT_FALSE(part.isRunning());
  EXPECT_EQ(part.events(), (std::vector<std::string>{"iteration", "after"}));
}

}  // namespace
