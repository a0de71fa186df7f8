// The body talk controller and its workers: the process's instance, the modes, pause and
// resume, the start delays, and the loop of a worker.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <functional>
#include <future>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "support/fake_robot.h"
#include "zurobotbodytalkbodypart.h"
#include "zurobotbodytalkthread.h"

namespace {

using bodytalktest::BodyTalkHandle;
using bodytalktest::BodyTalkOnFakeRobot;
using bodytalktest::FakeRobot;
using bodytalktest::kBound;
using bodytalktest::linesOf;
using ko::log::Warning;
using ZU::ZURobotBodyTalk;

constexpr auto kSpeaking = ZURobotBodyTalk::kSpeaking;
constexpr auto kListening = ZURobotBodyTalk::kListening;
// Rests of 1 to 5 ms, limits of 10 ms.
constexpr double kFast = 0.001;
// Rests of 1000 s and more: whatever comes, comes without a rest.
constexpr double kFrozen = 1000.0;

// Whether the n-th move posted is a listening one: those have their first key before 0.4 s,
// the speaking ones after.
bool isListeningMove(const FakeRobot& robot, std::size_t n) {
  return robot.motion->log.calls("angleInterpolationBezier").at(n).args.at(1)[0][0].asFloat() < 0.4;
}

TEST(BodyTalkInstance, TheLastReleaseDestroysTheController) {
  FakeRobot robot;
  ko::log::ScopedCapture log;
  ZURobotBodyTalk* first = ZURobotBodyTalk::getInstance(robot.broker, {kFast, nullptr});
  {
    ZU::ZURobotBodyTalkInstance handle(robot.broker, {0.5, nullptr});
    EXPECT_EQ(handle.bodyTalk, first);
    EXPECT_EQ(ZURobotBodyTalk::getInstanceCount(), 2);
    EXPECT_EQ(handle.bodyTalk->getTimeScale(), kFast);
  }
  EXPECT_EQ(ZURobotBodyTalk::getInstanceCount(), 1);
  first->getPosture()->init();
  first->start(kSpeaking, {}, true);
  EXPECT_TRUE(robot.motion->log.waitFor("setAngles", 1));
  ZURobotBodyTalk::releaseInstance();  // while it runs
  ZURobotBodyTalk::releaseInstance();
  EXPECT_EQ(ZURobotBodyTalk::getInstanceCount(), 0);
  EXPECT_EQ(linesOf(log, "robotbodytalk", Warning,
                    "The body talk was released more often than it was taken")
                .size(),
            1u);
  // A new controller, with the options of its own first user.
  BodyTalkHandle again(robot.broker, 0.25);
  EXPECT_EQ(again->getTimeScale(), 0.25);
  EXPECT_FALSE(again->isRunning());
}

TEST(BodyTalkInstance, WithoutTheRobotServicesTheControllerIsStillMadeAndHarmless) {
  ::setenv("KO_DEADLOCK_TIMEOUT", "20", 1);
  ZU::ZUBroker::resetDeadlockTimeoutForTesting();
  ko::log::ScopedCapture log;
  {
    BodyTalkHandle bodyTalk(ZU::ZUBroker::create(std::make_shared<ko::Session>()), kFast);
    const auto errors = linesOf(log, "robotbodytalk", ko::log::Error, "Can't find service");
    ASSERT_EQ(errors.size(), 1u);
    EXPECT_EQ(errors[0].function, "ZU::ZURobotBodyTalk::ZURobotBodyTalk");
    bodyTalk->start(kSpeaking, {}, true);
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

TEST(BodyTalkModes, OnlyARestartSwitchesTheModeAndAResumeKeepsModeAndParts) {
  BodyTalkOnFakeRobot t(kFast);
  const auto& moves = t.robot.motion->log;
  t.bodyTalk->start(kSpeaking, {}, true);
  ASSERT_TRUE(moves.waitFor("angleInterpolationBezier", 1));
  EXPECT_FALSE(isListeningMove(t.robot, 0));
  t.bodyTalk->start(kListening, {}, false);
  EXPECT_EQ(t.bodyTalk->getMode(), kSpeaking);
  EXPECT_TRUE(t.bodyTalk->isRunning());

  // The listening head and the listening arms (which have no animations).
  t.bodyTalk->start(kListening, {}, true);
  EXPECT_EQ(t.bodyTalk->getMode(), kListening);
  std::size_t before = moves.count("angleInterpolationBezier");
  ASSERT_TRUE(moves.waitFor("angleInterpolationBezier", before + 1));
  EXPECT_TRUE(isListeningMove(t.robot, before));
  EXPECT_TRUE(bodytalktest::waitForLines(t.log, "robotbodytalk", Warning,
                                         "Standing posture and during the listening part."));

  // The head alone, paused and resumed.
  t.bodyTalk->start(kListening, {false, true}, true);
  const std::size_t armsLines = linesOf(t.log, "robotbodytalk", Warning, "No bodytalk").size();
  t.bodyTalk->pause();
  EXPECT_TRUE(t.bodyTalk->isPaused());
  before = moves.count("angleInterpolationBezier");
  t.bodyTalk->resume();
  EXPECT_EQ(t.bodyTalk->getMode(), kListening);
  ASSERT_TRUE(moves.waitFor("angleInterpolationBezier", before + 1));
  EXPECT_TRUE(isListeningMove(t.robot, before));
  t.bodyTalk->stop();
  EXPECT_EQ(linesOf(t.log, "robotbodytalk", Warning, "No bodytalk").size(), armsLines);
}

struct StateCase {
  const char* name;
  std::function<void(ZURobotBodyTalk&)> before;
  std::function<void(ZURobotBodyTalk&)> operation;
  bool running;
  bool paused;
};

void startSpeaking(ZURobotBodyTalk& b) {
  b.start(kSpeaking, {}, true);
}
void prepareSpeaking(ZURobotBodyTalk& b) {
  b.prepare(kSpeaking, {}, true);
}
void nothing(ZURobotBodyTalk&) {}

class BodyTalkStates : public ::testing::TestWithParam<StateCase> {};

TEST_P(BodyTalkStates, EachOperationLeadsToItsState) {
  const StateCase& c = GetParam();
  BodyTalkOnFakeRobot t(kFast);
  c.before(*t.bodyTalk);
  c.operation(*t.bodyTalk);
  EXPECT_EQ(t.bodyTalk->isRunning(), c.running);
  EXPECT_EQ(t.bodyTalk->isPaused(), c.paused);
  EXPECT_EQ(t.bodyTalk->areWorkersStopped(), !c.running);
  if (c.running) {
    EXPECT_TRUE(t.robot.motion->log.waitFor("angleInterpolationBezier", 1));
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
                  [](auto& b) { b.prepare(kListening, {}, false); }, true, false},
        StateCase{"PrepareWithRestartWhenRunning", startSpeaking, prepareSpeaking, false, true},
        StateCase{"StartWithoutRestartWhenPaused", prepareSpeaking,
                  [](auto& b) { b.start(kSpeaking, {}, false); }, true, false}),
    [](const auto& p) { return std::string(p.param.name); });

// The listening head's delay of 1 to 5 s is drawn by the head and kept by the worker: their
// own tests see to it.
TEST(BodyTalkStartDelay, TheSpeakingHeadMovesAtOnce) {
  BodyTalkOnFakeRobot t(kFrozen);  // any rest would last 1000 s or more
  t.bodyTalk->start(kSpeaking, {false, true}, true);
  EXPECT_TRUE(t.robot.motion->log.waitFor("setAngles", 1));
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
    events.push_back("iteration");
    threads.push_back(std::this_thread::get_id());
    times.push_back(std::chrono::steady_clock::now());
    fChanged.notify_all();
    if (blockUntilStopped)
      fChanged.wait_for(lock, kBound, [this] { return fStopped; });
  }
  void afterIteration() override { record("after"); }
  int getStartDelay() override { return fDelay; }
  int getPause() override {
    std::lock_guard lock(fMutex);
    return fPauses[std::min(fNext++, fPauses.size() - 1)];
  }
  void stop() override {
    record("stop");
    std::lock_guard lock(fMutex);
    fStopped = true;
    fChanged.notify_all();
  }
  // Waits until `n` events of that kind have come; then the records may be read.
  bool waitFor(const std::string& event, std::size_t n) {
    std::unique_lock lock(fMutex);
    return fChanged.wait_for(lock, kBound, [&] {
      return static_cast<std::size_t>(std::count(events.begin(), events.end(), event)) >= n;
    });
  }

  bool blockUntilStopped = false;
  std::vector<std::string> events;
  std::vector<std::thread::id> threads;
  std::vector<std::chrono::steady_clock::time_point> times;

 private:
  void record(const char* event) {
    std::lock_guard lock(fMutex);
    events.push_back(event);
    fChanged.notify_all();
  }

  const std::vector<int> fPauses;
  const int fDelay;
  std::mutex fMutex;
  std::condition_variable fChanged;
  std::size_t fNext = 0;
  bool fStopped = false;
};

struct Worker : ZU::ZURobotBodyTalkThread {
  Worker(ScriptedPart& part, double scale)
      : ZU::ZURobotBodyTalkThread(std::make_shared<ko::EventLoop>("BodyTalkTest", 2),
                                  ZU::ZURobotBodyTalkTime(scale)) {
    setBodyPart(&part);
  }
};

TEST(BodyTalkThread, APartWithoutPauseIteratesBackToBackInOneRun) {
  ScriptedPart part({1, 0, 0, 0, 1}, 0);
  Worker worker(part, kFrozen);
  EXPECT_EQ(worker.name(), "BodyTalk loop of the Scripted");
  worker.start();
  ASSERT_TRUE(part.waitFor("after", 4));
  worker.requestStop();
  worker.stop();
  EXPECT_FALSE(worker.isRunning());
  EXPECT_FALSE(part.isRunning());
  ASSERT_EQ(part.threads.size(), 4u);  // the fifth would come 1000 s later
  EXPECT_EQ(std::count(part.threads.begin(), part.threads.end(), part.threads[0]), 4);
  EXPECT_EQ(part.events,
            (std::vector<std::string>{"iteration", "after", "iteration", "after", "iteration",
                                      "after", "iteration", "after", "stop"}));
  worker.setBodyPart(nullptr);
  EXPECT_EQ(worker.name(), "BodyTalk loop without body part set");
}

TEST(BodyTalkThread, AStartDelayPutsTheFirstIterationThatLate) {
  constexpr double kScale = 0.05;
  ScriptedPart part({1}, 2);
  Worker worker(part, kScale);
  const auto start = std::chrono::steady_clock::now();
  worker.start();
  ASSERT_TRUE(part.waitFor("iteration", 2));
  worker.requestStop();
  worker.stop();
  EXPECT_GE(part.times[0] - start, std::chrono::milliseconds(static_cast<int>(2000 * kScale)));
  EXPECT_GE(part.times[1] - part.times[0],
            std::chrono::milliseconds(static_cast<int>(1000 * kScale)));
}

TEST(BodyTalkThread, AStopRequestEndsTheIterationInProgressAndTheLoop) {
  ScriptedPart part({0}, 0);
  part.blockUntilStopped = true;
  Worker worker(part, 1.0);
  worker.start();
  ASSERT_TRUE(part.waitFor("iteration", 1));
  auto stopped = std::async(std::launch::async, [&] {
    worker.requestStop();
    worker.stop();
  });
  ASSERT_EQ(stopped.wait_for(kBound), std::future_status::ready);
  EXPECT_FALSE(worker.isRunning());
  EXPECT_EQ(part.threads.size(), 1u);
}

TEST(BodyTalkThread, DestroyingAWorkerClearsItsPartWithoutStoppingIt) {
  ScriptedPart part({1}, 0);
  {
    Worker worker(part, kFrozen);
    worker.start();
    ASSERT_TRUE(part.waitFor("after", 1));
    EXPECT_TRUE(part.isRunning());
  }
  EXPECT_FALSE(part.isRunning());
  EXPECT_EQ(part.events, (std::vector<std::string>{"iteration", "after"}));
}

}  // namespace
