#include <gtest/gtest.h>

#include <string>

#include "robotsim/robot.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace {

robotsim::RobotOptions timingRobot() {
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  options.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  return options;
}

TEST(Robot, EveryServiceAnswersByItsName) {
  robotsim::Robot robot(timingRobot());
  const auto& broker = robot.broker();
  EXPECT_EQ(ZU::ZURobotPostureProxy(broker).getPostureFamily(), "Standing");
  EXPECT_NE(ZU::ZURobotModelProxy(broker)._getRobotType(), 0);
  EXPECT_EQ(ZU::ZUTextToSpeechProxy(broker).getLanguage(), "English");
  EXPECT_FALSE(ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors().empty());
  EXPECT_TRUE(ZU::ZUMotionProxy(broker).areResourcesAvailable({"Head"}));
  EXPECT_NO_THROW(ZU::ZUAudioPlayerProxy(broker).loadSoundSet("bells"));
  EXPECT_NO_THROW(ZU::ZUAutonomousMovesProxy(broker)._moveSides());
  EXPECT_NO_THROW(ZU::ZUMemoryProxy(broker).declareEvent("Robot/Test", ""));
}

TEST(Robot, ServicesAreWithdrawnWhenTheRobotGoes) {
  auto session = std::make_shared<ko::Session>();
  auto broker = ZU::ZUBroker::create(session);
  {
    robotsim::Robot robot(timingRobot(), broker);
    EXPECT_TRUE(broker->service("ZUTextToSpeech"));
  }
  EXPECT_TRUE(session->services().empty());
  // A second robot can take the names again.
  robotsim::Robot again(timingRobot(), broker);
  EXPECT_TRUE(broker->service("ZUMemory"));
}

TEST(Robot, AServiceThatCannotStartWithdrawsTheOthers) {
  auto session = std::make_shared<ko::Session>();
  auto broker = ZU::ZUBroker::create(session);
  robotsim::RobotOptions options = timingRobot();
  options.speech.language = "Klingon";
  EXPECT_THROW(robotsim::Robot(options, broker), ZU::ZUError);
  EXPECT_TRUE(session->services().empty());
}

}  // namespace

TEST(Timeline, KeepsItsLastEntriesWhenBounded) {
  robotsim::Timeline timeline;
  for (int k = 0; k < 5; ++k)
    timeline.record("S", std::to_string(k));
  timeline.setCapacity(3);
  timeline.record("S", "5");
  const auto entries = timeline.entries();
  ASSERT_EQ(entries.size(), 3u);
  EXPECT_EQ(entries.front().operation, "3");
  EXPECT_EQ(entries.back().operation, "5");
}
