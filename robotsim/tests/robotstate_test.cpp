#include <gtest/gtest.h>

#include "robotsim/timeline.h"
#include "robotsim/zumemory.h"
#include "robotsim/zurobotstate.h"
#include "support/recording_module.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace {

using namespace std::chrono_literals;

class RobotState : public ::testing::Test {
 protected:
  void SetUp() override {
    broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
    timeline = std::make_shared<robotsim::Timeline>();
    ZU::ZUModule::createModule<robotsim::ZUMemory>(broker, "ZUMemory");
    ZU::ZUModule::createModule<robotsim::ZURobotPosture>(broker, "ZURobotPosture", timeline);
    ZU::ZUModule::createModule<robotsim::ZURobotModel>(broker, "ZURobotModel");
    ZU::ZUModule::createModule<robotsim::ZUAutonomousMoves>(broker, "ZUAutonomousMoves", timeline);
    listener = ZU::ZUModule::createModule<robotsim::testing::RecordingModule>(broker, "Listener");
  }

  std::shared_ptr<ZU::ZUBroker> broker;
  std::shared_ptr<robotsim::Timeline> timeline;
  std::shared_ptr<robotsim::testing::RecordingModule> listener;
};

TEST_F(RobotState, PostureFamilyChangesRaiseTheirEventOnce) {
  ZU::ZURobotPostureProxy posture(broker);
  EXPECT_EQ(posture.getPostureFamily(), "Standing");
  ZU::ZUMemoryProxy(broker).subscribeToEvent("PostureFamilyChanged", "Listener", "onEvent");

  ZU::ZUProxy raw("ZURobotPosture", broker);
  raw.call<void>("setPostureFamily", "Sitting");
  raw.call<void>("setPostureFamily", "Sitting");  // no change, no event
  raw.call<void>("setPostureFamily", "SittingOnChair");
  EXPECT_EQ(posture.getPostureFamily(), "SittingOnChair");

  ASSERT_TRUE(listener->waitForEvents([](const auto& e) { return e.size() >= 2; }, 5s));
  const auto events = listener->events("PostureFamilyChanged");
  ASSERT_EQ(events.size(), 2u);
  EXPECT_EQ(events[0].value.asString(), "Sitting");
  EXPECT_EQ(events[1].value.asString(), "SittingOnChair");
  EXPECT_EQ(timeline->entries("ZURobotPosture", "setPostureFamily").size(), 2u);
}

TEST_F(RobotState, UnknownPostureFamilyIsRefused) {
  ZU::ZUProxy raw("ZURobotPosture", broker);
  for (const char* family : {"Unknown", "standing", ""}) {
    EXPECT_THROW(raw.call<void>("setPostureFamily", family), ZU::ZUError) << family;
  }
  EXPECT_EQ(ZU::ZURobotPostureProxy(broker).getPostureFamily(), "Standing");
}

TEST_F(RobotState, RobotTypeAndAutonomousMoves) {
  EXPECT_EQ(ZU::ZURobotModelProxy(broker)._getRobotType(),
            robotsim::ZURobotModel::kDefaultRobotType);
  ZU::ZUAutonomousMovesProxy moves(broker);
  moves._moveForward();
  moves._moveSides();
  moves._moveBackward();
  const auto entries = timeline->entries();
  ASSERT_EQ(entries.size(), 3u);
  EXPECT_EQ(entries[0].operation, "_moveForward");
  EXPECT_EQ(entries[1].operation, "_moveSides");
  EXPECT_EQ(entries[2].operation, "_moveBackward");
}

}  // namespace
