// The arms: their animation lists, the wait for the end of each animation, the lines they
// log, and the asynchronous preload.
#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "robotbodytalk/zurobotbodytalk.h"
#include "robotbodytalk/zurobotbodytalkposture.h"
#include "support/fake_robot.h"
#include "support/log_waiter.h"
#include "zu/zuserviceproxies.h"
#include "zurobotbodytalkarms.h"
#include "zurobotbodytalkthread.h"

namespace {

using bodytalktest::BodyTalkHandle;
using bodytalktest::FakeRobot;
using bodytalktest::kBound;
using bodytalktest::LogCapture;
using ZU::ZURobotBodyTalkArms;

std::shared_ptr<ZU::ZURobotBodyTalkPosture> postureOf(const FakeRobot& robot,
                                                      ZU::PostureFamily latest,
                                                      ZU::PostureFamily active) {
  auto posture = std::make_shared<ZU::ZURobotBodyTalkPosture>(robot.broker);
  posture->setPostureFamily(active);
  posture->updateActivePostureFamily();
  posture->setPostureFamily(latest);
  return posture;
}

// Arms on a worker of their own.
struct Arms {
  Arms(const FakeRobot& robot, double timeScale, const char* part = ZURobotBodyTalkArms::kSpeaking,
       ZU::PostureFamily latest = ZU::Standing, ZU::PostureFamily active = ZU::Standing)
      : arms(robot.broker, postureOf(robot, latest, active), part,
             ZU::ZURobotBodyTalkTime(timeScale)),
        worker(std::make_shared<ko::EventLoop>("ArmsTest", 2), ZU::ZURobotBodyTalkTime(timeScale)) {
    worker.setBodyPart(&arms);
  }
  ~Arms() {
    worker.requestStop();
    worker.stop();
  }
  ZURobotBodyTalkArms arms;
  ZU::ZURobotBodyTalkThread worker;
};

constexpr const char* kTooLong = "makes too much time to stop";

// ---- what an iteration logs -----------------------------------------------------------------

struct EmptyCase {
  const char* name;
  const char* part;
  ZU::PostureFamily family;
  const char* message;
};

class ArmsWithoutAnimations : public ::testing::TestWithParam<EmptyCase> {};

TEST_P(ArmsWithoutAnimations, WarnOncePerSecondNamingThePostureAndThePart) {
  const EmptyCase& c = GetParam();
  constexpr double kScale = 0.02;
  FakeRobot robot;
  LogCapture log;
  Arms arms(robot, kScale, c.part, c.family, c.family);
  arms.arms.setAnimations({"animations/Stand/BodyTalk/Speaking_1"},
                          c.family == ZU::Standing ? ZU::Sitting : ZU::Standing);
  arms.worker.start();
  ASSERT_TRUE(log->waitFor("robotbodytalk", ko::log::Warning, "No bodytalk animations", 3));
  arms.worker.requestStop();
  arms.worker.stop();
  const auto lines = log->lines("robotbodytalk", ko::log::Warning, "No bodytalk animations");
  for (std::size_t i = 0; i < lines.size(); ++i) {
    EXPECT_EQ(lines[i].record.message, c.message);
    if (i > 0) {
      EXPECT_GE(lines[i].time - lines[i - 1].time,
                std::chrono::milliseconds(static_cast<int>(1000 * kScale)));
    }
  }
  EXPECT_EQ(robot.behaviors->log.count("startBehavior"), 0u);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, ArmsWithoutAnimations,
    ::testing::Values(
        EmptyCase{"SpeakingStanding", ZURobotBodyTalkArms::kSpeaking, ZU::Standing,
                  "No bodytalk animations found for the Standing posture and during the speaking "
                  "part.\nPlease update your \"animations\" package."},
        EmptyCase{"ListeningOnAChair", ZURobotBodyTalkArms::kListening, ZU::SittingOnChair,
                  "No bodytalk animations found for the SittingOnChair posture and during the "
                  "listening part.\nPlease update your \"animations\" package."}),
    [](const auto& p) { return std::string(p.param.name); });

struct PostureCase {
  const char* name;
  ZU::PostureFamily latest;
  bool plays;
};

class ArmsInAnUnknownPosture : public ::testing::TestWithParam<PostureCase> {};

TEST_P(ArmsInAnUnknownPosture, TakeTheLatestPostureOnceAndOtherwiseWarn) {
  const PostureCase& c = GetParam();
  FakeRobot robot;
  LogCapture log;
  Arms arms(robot, 0.01, ZURobotBodyTalkArms::kSpeaking, c.latest, ZU::Unknown);
  arms.arms.setAnimations({"a"}, ZU::Sitting);
  arms.arms.setAnimations({"u"}, ZU::Unknown);
  arms.worker.start();
  if (c.plays) {
    ASSERT_TRUE(robot.behaviors->log.waitFor("startBehavior", 1));
    EXPECT_EQ(robot.behaviors->started().at(0), "a");
  } else {
    ASSERT_TRUE(log->waitFor("robotbodytalk", ko::log::Warning, "", 2));
    EXPECT_EQ(
        log->count("robotbodytalk", ko::log::Warning, ""),
        log->count("robotbodytalk", ko::log::Warning, "Cannot move the arms in that posture"));
    EXPECT_EQ(robot.behaviors->log.count("startBehavior"), 0u);
  }
}

INSTANTIATE_TEST_SUITE_P(Cases, ArmsInAnUnknownPosture,
                         ::testing::Values(PostureCase{"LatestKnown", ZU::Sitting, true},
                                           PostureCase{"LatestUnknown", ZU::Unknown, false}),
                         [](const auto& p) { return std::string(p.param.name); });

TEST(ArmsIteration, AFailedStartIsLoggedAndTheNextComesAfterARest) {
  constexpr double kScale = 0.02;
  FakeRobot robot;
  LogCapture log;
  robot.behaviors->failStartOf("a");
  Arms arms(robot, kScale);
  arms.arms.setAnimations({"a"}, ZU::Standing);
  arms.worker.start();
  ASSERT_TRUE(
      log->waitFor("robotbodytalk", ko::log::Warning, "Behavior 0 raised an exception: ", 2));
  const auto lines =
      log->lines("robotbodytalk", ko::log::Warning, "Behavior 0 raised an exception: ");
  EXPECT_NE(lines[0].record.message.find("already running"), std::string::npos);
  EXPECT_GE(lines[1].time - lines[0].time,
            std::chrono::milliseconds(static_cast<int>(1000 * kScale)));
}

TEST(ArmsIteration, TheListeningArmsStartAfterASecondTheSpeakingOnesAtOnce) {
  FakeRobot robot;
  Arms speaking(robot, 1.0);
  Arms listening(robot, 1.0, ZURobotBodyTalkArms::kListening);
  EXPECT_EQ(speaking.arms.getStartDelay(), 0);
  EXPECT_EQ(listening.arms.getStartDelay(), 1);
}

// ---- the wait for the end of an animation ---------------------------------------------------

TEST(ArmsIteration, ANotificationForAnotherBehaviourDoesNotWakeThem) {
  FakeRobot robot;
  LogCapture log;
  Arms arms(robot, 0.02);  // the 10 s limit is 200 ms
  arms.arms.setAnimations({"a"}, ZU::Standing);
  arms.worker.start();
  ASSERT_TRUE(robot.behaviors->log.waitFor("startBehavior", 1));
  arms.worker.notifyBehaviorStopped("b");
  arms.worker.notifyBehaviorStopped("");
  ASSERT_TRUE(log->waitFor("robotbodytalk", ko::log::Error, kTooLong));
  EXPECT_TRUE(log->has("robotbodytalk", ko::log::Error,
                       "Error: the bodytalk animation \"a\" makes too much time to stop"));
}

TEST(ArmsIteration, StoppingTheBodyTalkStopsTheAnimationAndEndsTheWaitAtOnce) {
  FakeRobot robot;
  LogCapture log;
  BodyTalkHandle bodyTalk(robot.broker, 1.0);
  bodyTalk->getPosture()->init();
  bodyTalk->setSpeakingAnimations(ZU::Standing, {"a"});
  bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {true, false}, true);
  ASSERT_TRUE(robot.behaviors->log.waitFor("startBehavior", 1));
  bodyTalk->stop();
  EXPECT_TRUE(bodyTalk->areWorkersStopped());
  ASSERT_EQ(robot.behaviors->log.count("stopBehavior"), 1u);
  EXPECT_EQ(robot.behaviors->log.calls("stopBehavior")[0].args.at(0).asString(), "a");
  EXPECT_EQ(log->count("robotbodytalk", ko::log::Error, kTooLong), 0u);
}

// ---- the list -----------------------------------------------------------------------------

TEST(ArmsList, ThreeEntriesPlayTheFirstAndTheThirdThenTheListIsShuffled) {
  FakeRobot robot;
  LogCapture log;
  Arms arms(robot, 1.0);
  arms.arms.setAnimations({"a", "b", "c"}, ZU::Standing);
  ASSERT_TRUE(robot.behaviors->log.waitFor("preloadBehavior", 3));
  const auto order = arms.arms.getAnimations(ZU::Standing);
  const auto shuffles = arms.arms.getShuffleCount();
  EXPECT_EQ(shuffles, 1u);

  arms.worker.start();
  ASSERT_TRUE(robot.behaviors->log.waitFor("startBehavior", 1));
  EXPECT_EQ(robot.behaviors->started(), (std::vector<std::string>{order[0]}));
  arms.worker.notifyBehaviorStopped(order[0]);
  ASSERT_TRUE(robot.behaviors->log.waitFor("startBehavior", 2));
  EXPECT_EQ(robot.behaviors->started(), (std::vector<std::string>{order[0], order[2]}));
  EXPECT_EQ(arms.arms.getShuffleCount(), shuffles);
  // The played entry and the one skipped over are preloaded again.
  ASSERT_TRUE(robot.behaviors->log.waitFor("preloadBehavior", 5));
  std::vector<std::string> preloaded;
  for (const auto& call : robot.behaviors->log.calls("preloadBehavior"))
    preloaded.push_back(call.args.at(0).asString());
  std::vector<std::string> again(preloaded.begin() + 3, preloaded.end());
  std::sort(again.begin(), again.end());
  std::vector<std::string> expected{order[0], order[1]};
  std::sort(expected.begin(), expected.end());
  EXPECT_EQ(again, expected);

  arms.worker.notifyBehaviorStopped(order[2]);
  ASSERT_TRUE(robot.behaviors->log.waitFor("startBehavior", 3));
  EXPECT_EQ(arms.arms.getShuffleCount(), shuffles + 1);
  EXPECT_EQ(robot.behaviors->started().at(2), arms.arms.getAnimations(ZU::Standing).at(1));
  EXPECT_EQ(log->count("robotbodytalk", ko::log::Error, kTooLong), 0u);
}

TEST(ArmsList, AnEntryThatCannotBePreloadedIsLoggedAndStillPlayed) {
  FakeRobot robot;
  LogCapture log;
  robot.behaviors->failPreloadOf("x");
  Arms arms(robot, 1.0);
  arms.arms.setAnimations({"x"}, ZU::Standing);
  EXPECT_TRUE(log->waitFor("zucommon.zuproxy", ko::log::Warning,
                           "ZUBehaviorManager can't preload the behavior \"x\" exception: "));
  arms.worker.start();
  ASSERT_TRUE(robot.behaviors->log.waitFor("startBehavior", 1));
  EXPECT_EQ(robot.behaviors->started(), (std::vector<std::string>{"x"}));
}

TEST(ArmsList, ASetOutsideThePostureFamiliesIsRefused) {
  FakeRobot robot;
  LogCapture log;
  Arms arms(robot, 1.0);
  arms.arms.setAnimations({"a"}, 7);
  EXPECT_TRUE(arms.arms.getAnimations(7).empty());
  EXPECT_EQ(
      log->count("robotbodytalk", ko::log::Error, "No animation set for the posture family 7"), 1u);
  EXPECT_EQ(robot.behaviors->log.count("preloadBehavior"), 0u);
}

// ---- the preload --------------------------------------------------------------------------

TEST(Preload, TheFutureHoldsWhetherThePreloadSucceeded) {
  FakeRobot robot;
  LogCapture log;
  robot.behaviors->failPreloadOf("missing");
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
