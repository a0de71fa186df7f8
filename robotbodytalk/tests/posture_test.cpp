// The posture watcher: the subscription, the family read at start, the failures, and when
// the parts see a new family.
#include <gtest/gtest.h>

#include <vector>

#include "robotbodytalk/zurobotbodytalkposture.h"
#include "support/fake_robot.h"

namespace {

using bodytalktest::FakeRobot;
using ko::log::Error;
using ZU::ZURobotBodyTalkPosture;

TEST(PostureWatcher, InitSubscribesTheModuleAndTakesTheFamilyByExactName) {
  const std::vector<std::pair<const char*, ZU::PostureFamily>> cases = {
      {"Standing", ZU::Standing},
      {"Sitting", ZU::Sitting},
      {"SittingOnChair", ZU::SittingOnChair},
      {"standing", ZU::Unknown},
      {"Crouching", ZU::Unknown},
      {"", ZU::Unknown}};
  for (const auto& [name, family] : cases) {
    SCOPED_TRACE(name);
    FakeRobot robot;
    robot.posture->setFamily(name);
    ZURobotBodyTalkPosture posture(robot.broker);
    posture.init();
    EXPECT_EQ(posture.getPostureFamily(), family);
    EXPECT_EQ(posture.getActivePostureFamily(), family);
    posture.exit();
    const auto calls = robot.memory->log.calls();
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[0].method, "subscribeToEvent");
    EXPECT_EQ(
        ZU::ZUValue::makeArray({calls[0].args[0], calls[0].args[1], calls[0].args[2]}).toString(),
        R"(["PostureFamilyChanged", "ZUMokuto", "_postureFamilyChangedCallback"])");
    EXPECT_EQ(calls[1].method, "unsubscribeToEvent");
    EXPECT_EQ(ZU::ZUValue::makeArray({calls[1].args[0], calls[1].args[1]}).toString(),
              R"(["PostureFamilyChanged", "ZUMokuto"])");
  }
}

TEST(PostureWatcher, FailuresAreLoggedAndTheFamiliesKeptOrReadStill) {
  FakeRobot robot;
  ko::log::ScopedCapture log;
  ZURobotBodyTalkPosture posture(robot.broker);
  posture.setPostureFamily(ZU::Sitting);
  posture.updateActivePostureFamily();

  robot.posture->fail = true;
  posture.init();
  EXPECT_TRUE(log->containsPart("robotbodytalk.posture", Error,
                                "ZURobotPosture.getPostureFamily() has thrown an exception: \t"));
  EXPECT_EQ(posture.getPostureFamily(), ZU::Sitting);
  EXPECT_EQ(posture.getActivePostureFamily(), ZU::Sitting);

  robot.posture->fail = false;
  robot.memory->fail = true;
  posture.init();
  EXPECT_TRUE(log->containsPart("robotbodytalk.posture", Error,
                                "Cannot subscribe to event PostureFamilyChanged: \t"));
  EXPECT_EQ(posture.getPostureFamily(), ZU::Standing);
  posture.exit();
  EXPECT_TRUE(log->containsPart("robotbodytalk.posture", Error,
                                "Cannot unsubscribe to event PostureFamilyChanged: \t"));
}

TEST(PostureWatcher, AnEventReachesThePartsOnlyAtTheNextStartOrResume) {
  bodytalktest::BodyTalkOnFakeRobot t(0.001);
  const auto& posture = t.bodyTalk->getPosture();
  t.bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);
  posture->setPostureFamily(ZU::Sitting);
  EXPECT_EQ(t.bodyTalk->getPostureFamily(), ZU::Sitting);
  EXPECT_EQ(t.bodyTalk->getActivePostureFamily(), ZU::Standing);
  t.bodyTalk->pause();
  EXPECT_EQ(t.bodyTalk->getActivePostureFamily(), ZU::Standing);
  t.bodyTalk->resume();
  EXPECT_EQ(t.bodyTalk->getActivePostureFamily(), ZU::Sitting);

  posture->setPostureFamily(ZU::SittingOnChair);
  t.bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, false);
  EXPECT_EQ(t.bodyTalk->getActivePostureFamily(), ZU::Sitting);
  t.bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);
  EXPECT_EQ(t.bodyTalk->getActivePostureFamily(), ZU::SittingOnChair);
}

}  // namespace
