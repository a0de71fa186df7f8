// The arms: their animation lists, the wait for the end of each animation, the lines they
// log, and the asynchronous preload.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <future>
#include <memory>
#include <string>
#include <vector>

#include "robotbodytalk/zurobotbodytalkposture.h"
#include "support/fake_robot.h"
#include "zu/zuserviceproxies.h"
#include "zurobotbodytalkarms.h"
#include "zurobotbodytalkthread.h"

namespace {

using bodytalktest::FakeRobot;
using bodytalktest::linesOf;
using bodytalktest::waitForLines;
using ko::log::Error;
using ko::log::Warning;
using ZU::ZURobotBodyTalkArms;

constexpr const char* kTooLong = "makes too much time to stop";

// Arms on a worker of their own; the posture's active family is `active`, its latest one
// `latest`.
struct Arms {
  Arms(double timeScale, const char* part = ZURobotBodyTalkArms::kSpeaking,
       ZU::PostureFamily latest = ZU::Standing, ZU::PostureFamily active = ZU::Standing)
      : posture(std::make_shared<ZU::ZURobotBodyTalkPosture>(robot.broker)),
        arms(robot.broker, posture, part, ZU::ZURobotBodyTalkTime(timeScale)),
        worker(std::make_shared<ko::EventLoop>("ArmsTest", 2), ZU::ZURobotBodyTalkTime(timeScale)) {
    posture->setPostureFamily(active);
    posture->updateActivePostureFamily();
    posture->setPostureFamily(latest);
    worker.setBodyPart(&arms);
  }
  ~Arms() { stop(); }
  void stop() {
    worker.requestStop();
    worker.stop();
  }
  // The time between the first two lines of that category and level that contain `part`.
  std::chrono::system_clock::duration gap(ko::log::Level level, const char* part) {
    EXPECT_TRUE(waitForLines(log, "robotbodytalk", level, part, 2));
    stop();
    const auto lines = linesOf(log, "robotbodytalk", level, part);
    return lines.at(1).time - lines.at(0).time;
  }
  FakeRobot robot;
  ko::log::ScopedCapture log;
  std::shared_ptr<ZU::ZURobotBodyTalkPosture> posture;
  ZURobotBodyTalkArms arms;
  ZU::ZURobotBodyTalkThread worker;
};

TEST(ArmsIteration, WithoutAnimationsTheyWarnOncePerSecondNamingThePostureAndThePart) {
  constexpr double kScale = 0.02;
  for (const auto& [part, family, message] :
       {std::tuple{ZURobotBodyTalkArms::kSpeaking, ZU::Standing,
                   "No bodytalk animations found for the Standing posture and during the speaking "
                   "part.\nPlease update your \"animations\" package."},
        std::tuple{ZURobotBodyTalkArms::kListening, ZU::SittingOnChair,
                   "No bodytalk animations found for the SittingOnChair posture and during the "
                   "listening part.\nPlease update your \"animations\" package."}}) {
    SCOPED_TRACE(part);
    Arms a(kScale, part, family, family);
    a.arms.setAnimations({"a"}, family == ZU::Standing ? ZU::Sitting : ZU::Standing);
    a.worker.start();
    EXPECT_GE(a.gap(Warning, "No bodytalk animations"),
              std::chrono::milliseconds(static_cast<int>(1000 * kScale)));
    EXPECT_TRUE(a.log->contains("robotbodytalk", Warning, message));
    EXPECT_EQ(a.robot.behaviors->log.count("startBehavior"), 0u);
  }
}

TEST(ArmsIteration, InAnUnknownPostureTheyTakeTheLatestOnceAndOtherwiseWarn) {
  for (const ZU::PostureFamily latest : {ZU::Sitting, ZU::Unknown}) {
    SCOPED_TRACE(latest);
    Arms a(0.01, ZURobotBodyTalkArms::kSpeaking, latest, ZU::Unknown);
    a.arms.setAnimations({"a"}, ZU::Sitting);
    a.arms.setAnimations({"u"}, ZU::Unknown);
    a.worker.start();
    if (latest == ZU::Sitting) {
      ASSERT_TRUE(a.robot.behaviors->log.waitFor("startBehavior", 1));
      EXPECT_EQ(a.robot.behaviors->started().at(0), "a");
    } else {
      ASSERT_TRUE(waitForLines(a.log, "robotbodytalk", Warning, "", 2));
      EXPECT_EQ(
          linesOf(a.log, "robotbodytalk", Warning).size(),
          linesOf(a.log, "robotbodytalk", Warning, "Cannot move the arms in that posture").size());
      EXPECT_EQ(a.robot.behaviors->log.count("startBehavior"), 0u);
    }
  }
}

TEST(ArmsIteration, TheListeningArmsStartAfterASecondTheSpeakingOnesAtOnce) {
  EXPECT_EQ(Arms(1.0).arms.getStartDelay(), 0);
  EXPECT_EQ(Arms(1.0, ZURobotBodyTalkArms::kListening).arms.getStartDelay(), 1);
}

// Iterations on the test's thread: a failed start rests a second, the next played one not.
TEST(ArmsIteration, AFailedStartIsLoggedAndOnlyTheNextComesAfterARest) {
  Arms a(0.01);  // a played animation ends by the 100 ms limit
  a.robot.behaviors->failOn("startBehavior", "a");
  a.arms.setRunning(true);
  for (const auto& [name, pause] : {std::pair{"a", 1}, std::pair{"b", 0}}) {
    SCOPED_TRACE(name);
    a.arms.setAnimations({name}, ZU::Standing);
    a.arms.doOneIteration();
    a.arms.afterIteration();
    EXPECT_EQ(a.arms.getPause(), pause);
  }
  EXPECT_TRUE(a.log->containsPart("robotbodytalk", Warning, "Behavior 0 raised an exception: "));
  EXPECT_TRUE(a.log->containsPart("robotbodytalk", Warning, "\"a\" is out of reach"));
}

// One iteration on the test's thread: it ends only by the time limit.
TEST(ArmsIteration, ANotificationForAnotherBehaviourDoesNotWakeThem) {
  Arms a(0.02);  // the 10 s limit is 200 ms
  a.arms.setAnimations({"a"}, ZU::Standing);
  a.arms.setRunning(true);
  auto iteration = std::async(std::launch::async, [&a] { a.arms.doOneIteration(); });
  ASSERT_TRUE(a.robot.behaviors->log.waitFor("startBehavior", 1));
  a.worker.notifyBehaviorStopped("b");
  a.worker.notifyBehaviorStopped("");
  ASSERT_EQ(iteration.wait_for(bodytalktest::kBound), std::future_status::ready);
  EXPECT_TRUE(a.log->contains("robotbodytalk", Error,
                              "Error: the bodytalk animation \"a\" makes too much time to stop"));
}

TEST(ArmsIteration, StoppingTheBodyTalkStopsTheAnimationAndEndsTheWaitAtOnce) {
  bodytalktest::BodyTalkOnFakeRobot t(1.0);
  t.bodyTalk->setSpeakingAnimations(ZU::Standing, {"a"});
  t.bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {true, false}, true);
  ASSERT_TRUE(t.robot.behaviors->log.waitFor("startBehavior", 1));
  t.bodyTalk->stop();
  EXPECT_TRUE(t.bodyTalk->areWorkersStopped());
  EXPECT_EQ(t.robot.behaviors->behaviorsOf("stopBehavior"), std::vector<std::string>{"a"});
  EXPECT_TRUE(linesOf(t.log, "robotbodytalk", Error, kTooLong).empty());
}

TEST(ArmsList, ThreeEntriesPlayTheFirstAndTheThirdThenTheListIsShuffled) {
  Arms a(1.0);
  const auto& behaviors = *a.robot.behaviors;
  a.arms.setAnimations({"a", "b", "c"}, ZU::Standing);
  ASSERT_TRUE(behaviors.log.waitFor("preloadBehavior", 3));
  const auto order = a.arms.getAnimations(ZU::Standing);
  EXPECT_EQ(a.arms.getShuffleCount(), 1u);

  a.worker.start();
  ASSERT_TRUE(behaviors.log.waitFor("startBehavior", 1));
  a.worker.notifyBehaviorStopped(order[0]);
  ASSERT_TRUE(behaviors.log.waitFor("startBehavior", 2));
  EXPECT_EQ(behaviors.started(), (std::vector<std::string>{order[0], order[2]}));
  EXPECT_EQ(a.arms.getShuffleCount(), 1u);
  // The played entry and the one skipped over are preloaded again.
  ASSERT_TRUE(behaviors.log.waitFor("preloadBehavior", 5));
  auto again = behaviors.behaviorsOf("preloadBehavior");
  again.erase(again.begin(), again.begin() + 3);
  std::sort(again.begin(), again.end());
  EXPECT_EQ(again,
            (std::vector<std::string>{std::min(order[0], order[1]), std::max(order[0], order[1])}));

  a.worker.notifyBehaviorStopped(order[2]);
  ASSERT_TRUE(behaviors.log.waitFor("startBehavior", 3));
  EXPECT_EQ(a.arms.getShuffleCount(), 2u);
  EXPECT_EQ(behaviors.started().at(2), a.arms.getAnimations(ZU::Standing).at(1));
  EXPECT_TRUE(linesOf(a.log, "robotbodytalk", Error, kTooLong).empty());
}

TEST(ArmsList, AnEntryThatCannotBePreloadedIsLoggedAndStillPlayedAFamilyOutsideIsRefused) {
  Arms a(1.0);
  a.robot.behaviors->failOn("preloadBehavior", "x");
  a.arms.setAnimations({"x"}, ZU::Standing);
  EXPECT_TRUE(waitForLines(a.log, "zucommon.zuproxy", Warning,
                           "ZUBehaviorManager can't preload the behavior \"x\" exception: "));
  a.worker.start();
  ASSERT_TRUE(a.robot.behaviors->log.waitFor("startBehavior", 1));
  EXPECT_EQ(a.robot.behaviors->started(), (std::vector<std::string>{"x"}));

  a.arms.setAnimations({"a"}, 7);
  EXPECT_TRUE(a.arms.getAnimations(7).empty());
  EXPECT_EQ(
      linesOf(a.log, "robotbodytalk", Error, "No animation set for the posture family 7").size(),
      1u);
  EXPECT_EQ(a.robot.behaviors->behaviorsOf("preloadBehavior"), std::vector<std::string>{"x"});
}

TEST(Preload, TheFutureHoldsWhetherThePreloadSucceeded) {
  FakeRobot robot;
  ko::log::ScopedCapture log;
  robot.behaviors->failOn("preloadBehavior", "missing");
  auto proxy = std::make_shared<ZU::ZUBehaviorManagerProxy>(robot.broker);
  EXPECT_TRUE(ZU::preloadABehaviorAsync(proxy, "here").value(10000));
  EXPECT_FALSE(ZU::preloadABehaviorAsync(proxy, "missing").value(10000));
  EXPECT_FALSE(ZU::preloadABehaviorAsync(nullptr, "here").value(10000));
  auto stopped = std::make_shared<ko::EventLoop>("Stopped", 1);
  stopped->stop();
  EXPECT_TRUE(ZU::preloadABehaviorAsync(proxy, "here", stopped).hasError(10000));
  EXPECT_EQ(robot.behaviors->log.count("preloadBehavior"), 2u);
}

}  // namespace
