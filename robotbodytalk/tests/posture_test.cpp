// The posture watcher: the subscription, the family read at start, the failures, and when
// the parts see a new family.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "robotbodytalk/zurobotbodytalk.h"
#include "robotbodytalk/zurobotbodytalkposture.h"
#include "support/fake_robot.h"
#include "support/log_waiter.h"

namespace {

using bodytalktest::BodyTalkHandle;
using bodytalktest::FakeRobot;
using bodytalktest::LogCapture;
using ZU::ZURobotBodyTalkPosture;

struct NameCase {
  const char* name;
  ZU::PostureFamily family;
};

class PostureNames : public ::testing::TestWithParam<NameCase> {};

TEST_P(PostureNames, InitSubscribesTheModuleAndTakesTheFamilyByExactName) {
  FakeRobot robot;
  robot.posture->setFamily(GetParam().name);
  ZURobotBodyTalkPosture posture(robot.broker);
  posture.init();
  EXPECT_EQ(posture.getPostureFamily(), GetParam().family);
  EXPECT_EQ(posture.getActivePostureFamily(), GetParam().family);
  const auto subscriptions = robot.memory->log.calls("subscribeToEvent");
  ASSERT_EQ(subscriptions.size(), 1u);
  EXPECT_EQ(subscriptions[0].args.at(0).asString(), "PostureFamilyChanged");
  EXPECT_EQ(subscriptions[0].args.at(1).asString(), "ZUMokuto");
  EXPECT_EQ(subscriptions[0].args.at(2).asString(), "_postureFamilyChangedCallback");

  posture.exit();
  const auto ends = robot.memory->log.calls("unsubscribeToEvent");
  ASSERT_EQ(ends.size(), 1u);
  EXPECT_EQ(ends[0].args.at(0).asString(), "PostureFamilyChanged");
  EXPECT_EQ(ends[0].args.at(1).asString(), "ZUMokuto");
}

INSTANTIATE_TEST_SUITE_P(Names, PostureNames,
                         ::testing::Values(NameCase{"Standing", ZU::Standing},
                                           NameCase{"Sitting", ZU::Sitting},
                                           NameCase{"SittingOnChair", ZU::SittingOnChair},
                                           NameCase{"standing", ZU::Unknown},
                                           NameCase{"Crouching", ZU::Unknown},
                                           NameCase{"", ZU::Unknown}));

TEST(PostureWatcher, FailuresAreLoggedAndTheFamiliesKeptOrReadStill) {
  FakeRobot robot;
  LogCapture log;
  ZURobotBodyTalkPosture posture(robot.broker);
  posture.setPostureFamily(ZU::Sitting);
  posture.updateActivePostureFamily();

  robot.posture->fail = true;
  posture.init();
  EXPECT_EQ(log->count("robotbodytalk.posture", ko::log::Error,
                       "ZURobotPosture.getPostureFamily() has thrown an exception: \t"),
            1u);
  EXPECT_EQ(posture.getPostureFamily(), ZU::Sitting);
  EXPECT_EQ(posture.getActivePostureFamily(), ZU::Sitting);

  robot.posture->fail = false;
  robot.memory->fail = true;
  posture.init();
  EXPECT_EQ(log->count("robotbodytalk.posture", ko::log::Error,
                       "Cannot subscribe to event PostureFamilyChanged: \t"),
            1u);
  EXPECT_EQ(posture.getPostureFamily(), ZU::Standing);
  posture.exit();
  EXPECT_EQ(log->count("robotbodytalk.posture", ko::log::Error,
                       "Cannot unsubscribe to event PostureFamilyChanged: \t"),
            1u);
}

TEST(PostureWatcher, InAnUnknownPostureNeitherHeadNorArmsMove) {
  FakeRobot robot;
  LogCapture log;
  robot.posture->setFamily("Kneeling");
  BodyTalkHandle bodyTalk(robot.broker, 0.001);
  bodyTalk->getPosture()->init();
  EXPECT_EQ(bodyTalk->getPostureFamily(), ZU::Unknown);
  bodyTalk->setSpeakingAnimations(ZU::Unknown, {"a"});
  bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);
  EXPECT_TRUE(
      log->waitFor("robotbodytalk", ko::log::Warning, "Cannot move the head in that posture"));
  EXPECT_TRUE(
      log->waitFor("robotbodytalk", ko::log::Warning, "Cannot move the arms in that posture"));
  bodyTalk->stop();
  EXPECT_EQ(robot.motion->log.count("angleInterpolationBezier"), 0u);
  EXPECT_EQ(robot.behaviors->log.count("startBehavior"), 0u);
}

TEST(PostureWatcher, AnEventReachesThePartsOnlyAtTheNextStartOrResume) {
  FakeRobot robot;
  BodyTalkHandle bodyTalk(robot.broker, 0.001);
  const auto& posture = bodyTalk->getPosture();
  posture->init();
  bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);

  posture->setPostureFamily(ZU::Sitting);
  EXPECT_EQ(bodyTalk->getPostureFamily(), ZU::Sitting);
  EXPECT_EQ(bodyTalk->getActivePostureFamily(), ZU::Standing);
  bodyTalk->pause();
  EXPECT_EQ(bodyTalk->getActivePostureFamily(), ZU::Standing);
  bodyTalk->resume();
  EXPECT_EQ(bodyTalk->getActivePostureFamily(), ZU::Sitting);

  posture->setPostureFamily(ZU::SittingOnChair);
  bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, false);
  EXPECT_EQ(bodyTalk->getActivePostureFamily(), ZU::Sitting);
  bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);
  EXPECT_EQ(bodyTalk->getActivePostureFamily(), ZU::SittingOnChair);
}

}  // namespace
