// The whole simulated robot: its services by name, their withdrawal, and the robot's
// state (posture family, model).
#include <gtest/gtest.h>

#include <string>

#include "ko/log.hpp"
#include "robotsim/robot.h"
#include "robotsim/zurobotstate.h"
#include "support/recording_module.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace {

robotsim::RobotOptions timingRobot() {
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  options.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  return options;
}

// Every service answers by its name; the starter library is read whole.
TEST(Robot, EveryServiceAnswersByItsName) {
  ko::log::ScopedCapture capture(ko::log::Warning);
  robotsim::Robot robot(timingRobot());
  const auto& broker = robot.broker();
  EXPECT_EQ(ZU::ZURobotModelProxy(broker)._getRobotType(),
            robotsim::ZURobotModel::kDefaultRobotType);
  EXPECT_EQ(ZU::ZUTextToSpeechProxy(broker).getLanguage(), "English");
  EXPECT_FALSE(ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors().empty());
  EXPECT_TRUE(ZU::ZUMotionProxy(broker).areResourcesAvailable({"Head"}));
  EXPECT_NO_THROW(ZU::ZUAudioPlayerProxy(broker).loadSoundSet("bells"));
  EXPECT_NO_THROW(ZU::ZUAutonomousMovesProxy(broker)._moveSides());
  EXPECT_NO_THROW(ZU::ZUMemoryProxy(broker).declareEvent("Robot/Test", ""));
  EXPECT_EQ(capture->count(), 0u);
}

TEST(Robot, ServicesAreWithdrawnWhenTheRobotGoesOrCannotStart) {
  auto session = std::make_shared<ko::Session>();
  auto broker = ZU::ZUBroker::create(session);
  {
    robotsim::Robot robot(timingRobot(), broker);
    EXPECT_TRUE(broker->service("ZUTextToSpeech"));
  }
  EXPECT_TRUE(session->services().empty());
  robotsim::RobotOptions klingon = timingRobot();
  klingon.speech.language = "Klingon";
  EXPECT_THROW(robotsim::Robot(klingon, broker), ZU::ZUError);
  EXPECT_TRUE(session->services().empty());
  // A robot can take the names again.
  robotsim::Robot again(timingRobot(), broker);
  EXPECT_TRUE(broker->service("ZUMemory"));
}

TEST(Robot, PostureFamilyChangesRaiseTheirEventOnce) {
  robotsim::Robot robot(timingRobot());
  const auto listener =
      ZU::ZUModule::createModule<robotsim::testing::RecordingModule>(robot.broker(), "Listener");
  ZU::ZURobotPostureProxy posture(robot.broker());
  EXPECT_EQ(posture.getPostureFamily(), "Standing");
  ZU::ZUMemoryProxy(robot.broker()).subscribeToEvent("PostureFamilyChanged", "Listener", "onEvent");
  ZU::ZUProxy raw("ZURobotPosture", robot.broker());
  raw.call<void>("setPostureFamily", "Sitting");
  raw.call<void>("setPostureFamily", "Sitting");  // no change, no event
  for (const char* family : {"Unknown", "standing", ""})
    EXPECT_THROW(raw.call<void>("setPostureFamily", family), ZU::ZUError) << family;
  EXPECT_EQ(posture.getPostureFamily(), "Sitting");
  raw.call<void>("setPostureFamily", "SittingOnChair");
  EXPECT_EQ(posture.getPostureFamily(), "SittingOnChair");
  ASSERT_TRUE(listener->waitForEvents("PostureFamilyChanged", 2));
  const auto events = listener->events("PostureFamilyChanged");
  ASSERT_EQ(events.size(), 2u);
  EXPECT_EQ(events[0].value.asString(), "Sitting");
  EXPECT_EQ(events[1].value.asString(), "SittingOnChair");
  EXPECT_EQ(robot.timeline()->entries("ZURobotPosture", "setPostureFamily").size(), 2u);
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
